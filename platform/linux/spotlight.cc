// The SMB Spotlight switch of the Linux platform: the Samba include file of
// spotlight_config.h, written atomically and only when its text changes.
#include <algorithm>
#include <fstream>
#include <sstream>

#include "common/file_util.h"
#include "common/log.h"
#include "common/sys.h"
#include "platform/linux/config_files.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/spotlight_config.h"

namespace corvlumex {
namespace platform {
namespace {

constexpr char kSpotlightInclude[] = "/etc/samba/corvlumex-spotlight.conf";

// The file's text; "" when there is none. False when it cannot be read.
bool ReadInclude(std::string* text) {
  const std::string path = SysPath(kSpotlightInclude);
  text->clear();
  if (!IsFileExist(path)) return true;
  std::ifstream file(path);
  if (!file) {
    CORV_PLATFORM_ERROR(kPlatformErrConfig, "cannot read " + path);
    return false;
  }
  std::ostringstream content;
  content << file.rdbuf();
  *text = content.str();
  return true;
}

// 1 written, 0 already so, -1 failed.
int WriteInclude(LinuxPlatform* platform, const SpotlightConfig& config) {
  std::string old_text;
  if (!ReadInclude(&old_text)) return -1;
  const std::string text = WriteSpotlightConfig(config, [platform](const std::string& share) {
    char name[kPathBufferSize] = {};
    return platform->GetIndexID(share.c_str(), name, sizeof(name)) < 0 ? std::string() : std::string(name);
  });
  if (text == old_text) return 0;
  return WriteConfigFile(SysPath(kSpotlightInclude), text, 0644) ? 1 : -1;
}

}  // namespace

int LinuxPlatform::SMBIsEnableSpotlight() {
  std::string text;
  if (!ReadInclude(&text)) return -1;
  return ReadSpotlightConfig(text).enabled ? 1 : 0;
}

int LinuxPlatform::SMBSetSpotlight(bool enable) {
  std::string text;
  if (!ReadInclude(&text)) return -1;
  SpotlightConfig config = ReadSpotlightConfig(text);
  config.enabled = enable;
  return WriteInclude(this, config) < 0 ? -1 : 0;
}

int LinuxPlatform::SMBSetSpotlightShares(const std::vector<std::string>& share_names) {
  std::string text;
  if (!ReadInclude(&text)) return -1;
  SpotlightConfig config = ReadSpotlightConfig(text);
  config.shares.clear();
  for (const std::string& share : share_names) {
    if (CanBeSectionName(share)) {
      config.shares.push_back(share);
    } else {
      CORV_LOG("share \"%s\" cannot be named in smb.conf: Spotlight stays off there", share.c_str());
    }
  }
  std::sort(config.shares.begin(), config.shares.end());
  config.shares.erase(std::unique(config.shares.begin(), config.shares.end()), config.shares.end());
  return WriteInclude(this, config);
}

}  // namespace platform
}  // namespace corvlumex
