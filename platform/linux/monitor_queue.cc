// The notifier's queue configuration on the Linux platform: one JSON file
// per (application, queue) under NotifierConfigDir() + "/",
// replaced atomically, which corvnotifyd reads.
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/file_util.h"
#include "common/json_util.h"
#include "common/sys.h"
#include "platform/linux/config_files.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/notifier_presence.h"

namespace corvlumex {
namespace platform {
namespace {

constexpr size_t kMaxEncodedName = 200;

// FNV-1a: a stable short name for queue paths too long to spell out.
std::string Fingerprint(const std::string& text) {
  uint64_t hash = 1469598103934665603ULL;
  for (unsigned char c : text) {
    hash ^= c;
    hash *= 1099511628211ULL;
  }
  return StringPrintf("%016llx", static_cast<unsigned long long>(hash));
}

// "<app>@<queue path, percent-encoded>.json": readable, one file per queue,
// and two queue paths never share a name.
std::string ConfigFileName(const std::string& app, const std::string& queue_path) {
  std::string encoded;
  for (unsigned char c : queue_path) {
    if (isalnum(c) || c == '.' || c == '_' || c == '-') encoded.push_back(static_cast<char>(c));
    else encoded += StringPrintf("%%%02X", c);
  }
  if (encoded.size() > kMaxEncodedName) encoded = encoded.substr(encoded.size() - 100) + "~" + Fingerprint(queue_path);
  return app + "@" + encoded + ".json";
}

bool BadConfig(const std::string& problem) {
  CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "monitor queue refused: " + problem);
  return false;
}

bool CheckApp(const std::string& app, int type) {
  if (app.empty() || app.find('/') != std::string::npos || app.find('@') != std::string::npos) {
    return BadConfig("application name \"" + app + "\"");
  }
  if (type != kMonitorQueueTypeApplication) return BadConfig("queue type " + std::to_string(type));
  return true;
}

bool CheckQueue(const Json::Value& queue) {
  if (!queue.isObject() || !queue["queue"].isString()) return BadConfig("no \"queue\" path");
  const std::string path = queue["queue"].asString();
  if (path.empty() || path[0] != '/') return BadConfig("\"queue\" is not an absolute path: " + path);
  const Json::Value& config = queue["config"];
  if (config.isNull()) return true;
  if (!config.isArray()) return BadConfig("\"config\" is neither null nor an array");
  for (const Json::Value& entry : config) {
    if (!entry.isObject() || !entry["path"].isString() || entry["path"].asString().empty() ||
        entry["path"].asString()[0] != '/') {
      return BadConfig("a \"config\" entry has no absolute \"path\"");
    }
    if (!entry["mask"].isUInt()) return BadConfig("\"mask\" of " + entry["path"].asString() + " is not an integer");
    if (!entry["ignore"].isArray()) return BadConfig("\"ignore\" of " + entry["path"].asString() + " is not an array");
    for (const Json::Value& name : entry["ignore"]) {
      if (!name.isString()) return BadConfig("\"ignore\" of " + entry["path"].asString() + " holds a non-string");
    }
  }
  return true;
}

}  // namespace

bool LinuxPlatform::MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) {
  if (!CheckApp(app, type) || !CheckQueue(queue)) return false;
  Json::Value record = queue;
  record["config"] = queue["config"];  // null stays null: the share has no folder
  record["application"] = app;
  record["type"] = type;
  const std::string path =
      NotifierConfigDir() + "/" + ConfigFileName(app, queue["queue"].asString());
  return WriteConfigFile(path, JsonToString(record) + "\n", 0644);
}

bool LinuxPlatform::MonitorQueueDelete(const std::string& queue_path, const std::string& app, int type) {
  if (!CheckApp(app, type)) return false;
  if (queue_path.empty() || queue_path[0] != '/') return BadConfig("not an absolute queue path: " + queue_path);
  const std::string path = NotifierConfigDir() + "/" + ConfigFileName(app, queue_path);
  if (!Unlink(path)) {
    CORV_PLATFORM_ERROR(kPlatformErrConfig, "cannot remove " + path + ": " + strerror(errno));
    return false;
  }
  errno = 0;
  return true;
}

}  // namespace platform
}  // namespace corvlumex
