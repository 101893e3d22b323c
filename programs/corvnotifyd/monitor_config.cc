#include "programs/corvnotifyd/monitor_config.h"

#include <dirent.h>

#include <cerrno>
#include <cstring>
#include <memory>

#include "common/json_util.h"
#include "common/log.h"

namespace corvlumex {
namespace notifyd {
namespace {

// "/a/b/" and "/a/b" are the same folder; "/" stays "/".
std::string WithoutTrailingSlash(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

bool IsAbsolutePath(const Json::Value& value) {
  return value.isString() && !value.asString().empty() && value.asString()[0] == '/';
}

bool IsConfigFileName(const std::string& name) {
  static const std::string kSuffix = ".json";
  return name.size() > kSuffix.size() && name[0] != '.' &&
         name.compare(name.size() - kSuffix.size(), kSuffix.size(), kSuffix) == 0;
}

bool ParseRoot(const Json::Value& entry, size_t index, WatchRootConfig* root, std::string* error) {
  const std::string where = "\"config\"[" + std::to_string(index) + "]";
  if (!entry.isObject()) {
    *error = where + " is not an object";
    return false;
  }
  if (!IsAbsolutePath(entry["path"])) {
    *error = where + ".\"path\" is not an absolute path";
    return false;
  }
  root->path = WithoutTrailingSlash(entry["path"].asString());
  if (!entry["mask"].isUInt()) {
    *error = where + ".\"mask\" is not an unsigned integer";
    return false;
  }
  root->mask = entry["mask"].asUInt();
  const Json::Value& ignore = entry["ignore"];
  if (!ignore.isNull() && !ignore.isArray()) {
    *error = where + ".\"ignore\" is not an array";
    return false;
  }
  for (const Json::Value& name : ignore) {
    if (!name.isString() || name.asString().empty() || name.asString().find('/') != std::string::npos) {
      *error = where + ".\"ignore\" holds something that is not an entry name";
      return false;
    }
    root->ignore.push_back(name.asString());
  }
  return true;
}

}  // namespace

bool ParseMonitorQueue(const Json::Value& value, MonitorQueueConfig* out, std::string* error) {
  *out = MonitorQueueConfig();
  if (!value.isObject()) {
    *error = "not a JSON object";
    return false;
  }
  if (!IsAbsolutePath(value["queue"])) {
    *error = "\"queue\" is not an absolute path";
    return false;
  }
  out->queue = value["queue"].asString();
  const Json::Value& config = value["config"];
  // A share without indexed folders keeps its file with "config" null.
  if (config.isNull()) return true;
  if (!config.isArray()) {
    *error = "\"config\" is neither null nor an array";
    return false;
  }
  for (Json::ArrayIndex i = 0; i < config.size(); ++i) {
    WatchRootConfig root;
    if (!ParseRoot(config[i], i, &root, error)) return false;
    out->roots.push_back(std::move(root));
  }
  return true;
}

MonitorConfig LoadMonitorConfig(const std::string& dir, const MonitorConfig& previous) {
  MonitorConfig loaded;
  std::unique_ptr<DIR, int (*)(DIR*)> handle(opendir(dir.c_str()), closedir);
  if (!handle) {
    CORV_LOG("cannot read the configuration folder %s: %s", dir.c_str(), strerror(errno));
    errno = 0;
    return previous;
  }
  while (const struct dirent* entry = readdir(handle.get())) {
    const std::string name = entry->d_name;
    if (!IsConfigFileName(name)) continue;
    const std::string path = dir + "/" + name;
    Json::Value value;
    MonitorQueueConfig queue;
    std::string error;
    if (!JsonFromFile(value, path)) {
      error = "missing or not valid JSON";
    } else if (ParseMonitorQueue(value, &queue, &error)) {
      loaded[name] = std::move(queue);
      continue;
    }
    const auto kept = previous.find(name);
    CORV_LOG("ignoring monitor configuration %s: %s%s", path.c_str(), error.c_str(),
             kept != previous.end() ? " (keeping its previous contents)" : "");
    errno = 0;
    if (kept != previous.end()) loaded[name] = kept->second;
  }
  errno = 0;
  return loaded;
}

}  // namespace notifyd
}  // namespace corvlumex
