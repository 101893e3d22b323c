#include "tests/platform/share_sandbox.h"

#include <filesystem>
#include <fstream>

#include "common/file_util.h"
#include "common/json_util.h"
#include "common/sys.h"

namespace corvlumex {
namespace testing_support {

ShareSandbox::ShareSandbox() { volume_ = RealPath(sandbox_.MakeDir("volume1")); }

std::string ShareSandbox::AddShare(const std::string& name, const Json::Value& extra) {
  Json::Value entry = extra;
  entry["name"] = name;
  entry["path"] = volume_ + "/" + name;
  entries_.append(entry);
  std::filesystem::create_directories(volume_ + "/" + name);
  WriteRegistryText(JsonToString(entries_));
  return volume_ + "/" + name;
}

void ShareSandbox::WriteRegistryText(const std::string& text) const {
  sandbox_.WriteFile("etc/corvlumex/shares.json", text);
}

std::string ShareSandbox::MakeDir(const std::string& full_path) const {
  std::filesystem::create_directories(full_path);
  return full_path;
}

ScopedPlatform::ScopedPlatform(std::shared_ptr<platform::Platform> installed) {
  platform::Install(std::move(installed));
}

ScopedPlatform::~ScopedPlatform() { platform::Install(nullptr); }

}  // namespace testing_support
}  // namespace corvlumex
