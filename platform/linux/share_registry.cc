#include "platform/linux/share_registry.h"

#include <sys/stat.h>

#include <fstream>
#include <memory>
#include <set>
#include <sstream>

#include "common/file_util.h"
#include "common/log.h"
#include "common/path_below.h"
#include "common/sys.h"

namespace corvlumex {
namespace platform {
namespace {

// An absolute path without empty, "." or ".." components and without a trailing "/".
bool IsCanonicalAbsolute(const std::string& path) {
  if (path.size() < 2 || path[0] != '/' || path.back() == '/') return false;
  size_t start = 1;
  while (start <= path.size()) {
    size_t end = path.find('/', start);
    if (end == std::string::npos) end = path.size();
    const std::string component = path.substr(start, end - start);
    if (component.empty() || component == "." || component == "..") return false;
    start = end + 1;
  }
  return true;
}

bool ReadFlag(const Json::Value& entry, const char* key, bool* flag, std::string* problem) {
  if (!entry.isMember(key)) return true;
  if (!entry[key].isBool()) {
    *problem = std::string("\"") + key + "\" must be true or false";
    return false;
  }
  *flag = entry[key].asBool();
  return true;
}

bool ReadPrivileges(const Json::Value& entry, ShareInfo* share, std::string* problem) {
  if (!entry.isMember("privileges")) return true;
  const Json::Value& privileges = entry["privileges"];
  if (!privileges.isObject()) {
    *problem = "\"privileges\" must be an object of user name to \"rw\", \"ro\" or \"none\"";
    return false;
  }
  for (const std::string& user : privileges.getMemberNames()) {
    const Json::Value& word = privileges[user];
    const std::string text = word.isString() ? word.asString() : "";
    if (text == "rw") share->privileges[user] = kSharePrivReadWrite;
    else if (text == "ro") share->privileges[user] = kSharePrivReadOnly;
    else if (text == "none") share->privileges[user] = kSharePrivNone;
    else {
      *problem = "privilege of user \"" + user + "\" must be \"rw\", \"ro\" or \"none\"";
      return false;
    }
  }
  return true;
}

bool ReadEntry(const Json::Value& entry, ShareInfo* share, std::string* problem) {
  if (!entry.isObject()) {
    *problem = "not an object";
    return false;
  }
  if (!entry["name"].isString() || entry["name"].asString().empty()) {
    *problem = "no \"name\" (a non-empty string)";
    return false;
  }
  share->name = entry["name"].asString();
  if (share->name.find('/') != std::string::npos || share->name == "." || share->name == "..") {
    *problem = "name \"" + share->name + "\" is not a single path component";
    return false;
  }
  if (!entry["path"].isString() || entry["path"].asString().empty()) {
    *problem = "share \"" + share->name + "\" has no \"path\" (a non-empty string)";
    return false;
  }
  share->path = entry["path"].asString();
  if (!IsCanonicalAbsolute(share->path)) {
    *problem = "path \"" + share->path + "\" of share \"" + share->name +
               "\" is not an absolute path without \".\", \"..\", \"//\" or a trailing \"/\"";
    return false;
  }
  if (Basename(share->path) != share->name) {
    *problem = "path \"" + share->path + "\" does not end in the share's name \"" + share->name + "\"";
    return false;
  }
  if (!ReadFlag(entry, "readonly", &share->readonly, problem) ||
      !ReadFlag(entry, "encrypted", &share->encrypted, problem) ||
      !ReadFlag(entry, "recycle_bin", &share->recycle_bin, problem) ||
      !ReadFlag(entry, "hide_unreadable", &share->hide_unreadable, problem)) {
    *problem = "share \"" + share->name + "\": " + *problem;
    return false;
  }
  if (entry.isMember("ftp_privilege")) {
    const Json::Value& word = entry["ftp_privilege"];
    if (!word.isUInt() || (word.asUInt() & ~static_cast<unsigned>(kFtpPrivAll)) != 0) {
      *problem = "share \"" + share->name + "\": \"ftp_privilege\" must be an integer from 0 to 7";
      return false;
    }
    share->ftp_privilege = word.asUInt();
  }
  if (!ReadPrivileges(entry, share, problem)) {
    *problem = "share \"" + share->name + "\": " + *problem;
    return false;
  }
  return true;
}

}  // namespace

std::string ShareRegistryPath() { return SysPath("/etc/corvlumex/shares.json"); }

bool ParseShareRegistry(const std::string& text, const std::string& source, std::vector<ShareInfo>* shares,
                        std::string* problem) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value root;
  std::string errors;
  if (!reader->parse(text.data(), text.data() + text.size(), &root, &errors)) {
    *problem = source + " is not valid JSON: " + errors;
    while (!problem->empty() && problem->back() == '\n') problem->pop_back();
    return false;
  }
  if (!root.isArray()) {
    *problem = source + " must hold a JSON array of shares";
    return false;
  }
  std::vector<ShareInfo> loaded;
  std::set<std::string> names, paths;
  for (Json::ArrayIndex i = 0; i < root.size(); ++i) {
    ShareInfo share;
    std::string entry_problem;
    if (!ReadEntry(root[i], &share, &entry_problem)) {
      *problem = source + ": entry " + std::to_string(i + 1) + ": " + entry_problem;
      return false;
    }
    if (!names.insert(share.name).second) {
      *problem = source + ": entry " + std::to_string(i + 1) + ": share \"" + share.name + "\" is listed twice";
      return false;
    }
    if (!paths.insert(share.path).second) {
      *problem = source + ": entry " + std::to_string(i + 1) + ": path \"" + share.path + "\" is listed twice";
      return false;
    }
    loaded.push_back(std::move(share));
  }
  shares->swap(loaded);
  return true;
}

bool LoadShareRegistry(std::vector<ShareInfo>* shares) {
  const std::string path = ShareRegistryPath();
  std::ifstream input(path, std::ios::binary);
  if (!input) {
    struct stat st;
    if (stat(path.c_str(), &st) != 0 && errno == ENOENT) {
      errno = 0;
      shares->clear();
      return true;
    }
    CORV_PLATFORM_ERROR(kPlatformErrRegistry, "cannot read the share registry " + path);
    CORV_LOG("%s", LastError().message.c_str());
    return false;
  }
  std::ostringstream content;
  content << input.rdbuf();
  std::string problem;
  if (!ParseShareRegistry(content.str(), path, shares, &problem)) {
    CORV_PLATFORM_ERROR(kPlatformErrRegistry, "share registry refused: " + problem);
    CORV_LOG("%s", LastError().message.c_str());
    return false;
  }
  return true;
}

const ShareInfo* FindShareByFullPath(const std::vector<ShareInfo>& shares, const std::string& full_path) {
  const ShareInfo* found = nullptr;
  for (const ShareInfo& share : shares) {
    const bool inside = IsPathAtOrBelow(full_path, share.path);
    if (inside && (found == nullptr || share.path.size() > found->path.size())) found = &share;
  }
  return found;
}

}  // namespace platform
}  // namespace corvlumex
