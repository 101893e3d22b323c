// The monitor-queue configurations the library writes for the notifier: one
// JSON file per queue in the configuration folder, each naming the queue file
// and the folders whose changes go into it.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace corvlumex {
namespace notifyd {

// One watched folder of a queue.
struct WatchRootConfig {
  std::string path;                 // absolute, without a trailing "/"
  uint32_t mask = 0;                // queue event bits the folder asks for
  std::vector<std::string> ignore;  // entry names never reported nor entered
  bool operator==(const WatchRootConfig& other) const {
    return path == other.path && mask == other.mask && ignore == other.ignore;
  }
};

// One queue file and the folders feeding it.
struct MonitorQueueConfig {
  std::string queue;  // absolute path of the queue file
  std::vector<WatchRootConfig> roots;
  bool operator==(const MonitorQueueConfig& other) const {
    return queue == other.queue && roots == other.roots;
  }
};

// Every configuration file of the folder, by file name.
using MonitorConfig = std::map<std::string, MonitorQueueConfig>;

// Reads one configuration object: {"queue", "config": [{"path", "mask",
// "ignore"}] or null}. Returns false and sets `error` (naming what is wrong)
// when the object is not a valid configuration.
bool ParseMonitorQueue(const Json::Value& value, MonitorQueueConfig* out, std::string* error);

// Loads every configuration file of `dir`. A file that cannot be read or is
// invalid is logged with its name and the fault; when `previous` held a
// configuration from the same file, that one is kept, so a bad edit never
// silently stops watching folders.
MonitorConfig LoadMonitorConfig(const std::string& dir, const MonitorConfig& previous);

}  // namespace notifyd
}  // namespace corvlumex
