// Runs the real corvnotifyd in a sandbox root for the integration tests:
// a share with an indexed folder, its monitor-queue configuration, a stand-in
// notification tool, and helpers that read back the share's queue.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "tests/support/child_process.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace testing_support {

struct QueueLine {
  uint32_t event = 0;
  bool is_dir = false;
  std::string path;
  std::string path_old;
  bool operator==(const QueueLine& other) const {
    return event == other.event && is_dir == other.is_dir && path == other.path && path_old == other.path_old;
  }
};
void PrintTo(const QueueLine& line, std::ostream* out);
inline QueueLine Line(uint32_t event, const std::string& path, bool is_dir = false,
                      const std::string& path_old = std::string()) {
  return QueueLine{event, is_dir, path, path_old};
}

// Every line of a queue file, parsed; a line that does not parse fails the test.
std::vector<QueueLine> ReadQueue(const std::string& path);
std::vector<QueueLine> ParseQueueText(const std::string& text);
// The lines of a text file, and how often `needle` occurs in a text.
std::vector<std::string> TextLines(const std::string& path);
size_t CountOccurrences(const std::string& text, const std::string& needle);
// Polls `condition` (every 2 ms) until it holds or `timeout` passes.
inline bool WaitUntil(const std::function<bool()>& condition,
                      std::chrono::milliseconds timeout = std::chrono::milliseconds(15000)) {
  return PollUntil(condition, timeout, std::chrono::milliseconds(2));
}

// A sandbox with one share "share" holding the indexed folder "docs". The
// share lives on /dev/shm when it exists (file creation on a disk with
// discard can take milliseconds), else in the sandbox root.
class NotifydSandbox {
 public:
  NotifydSandbox();
  const std::string& share() const { return share_; }
  const std::string& docs() const { return docs_; }
  const std::string& queue() const { return queue_; }
  std::string root() const { return root_.path(); }
  const std::string& volume() const { return volume_; }
  std::string config_dir() const { return root_.path() + "/etc/corvlumex/monitor.d"; }
  // Writes the configuration file `name` for `queue` with these folders.
  void WriteConfig(const std::string& name, const std::string& queue, const std::vector<std::string>& folders);
  void RemoveConfig(const std::string& name);
  // Lines the stand-in notification tool received, one per run.
  std::vector<std::string> Notices() const { return TextLines(root_.path() + "/notices.log"); }
  // Starts corvnotifyd --foreground (or with `args`), standard error into
  // log_path(), `env` added to the environment.
  std::unique_ptr<ChildProcess> Run(const std::vector<std::string>& args = {"--foreground"},
                                    const std::map<std::string, std::string>& env = {}) const;
  // Starts the daemon and waits until its watches are in place.
  std::unique_ptr<ChildProcess> Start(const std::map<std::string, std::string>& env = {}) const;
  bool WaitForLog(const std::string& needle) const;
  std::vector<QueueLine> Queue() const { return ReadQueue(queue_); }
  // Makes the folder `path` and waits until its create line is in `queue`:
  // every event before it has then been written too.
  bool Sync(const std::string& path, const std::string& queue = std::string());
  std::string log_path() const { return root_.path() + "/corvnotifyd.log"; }

 private:
  Sandbox root_;
  std::string volume_;  // on tmpfs when there is one: bursts of files are quick
  std::string share_;
  std::string docs_;
  std::string queue_;
};

}  // namespace testing_support
}  // namespace corvlumex
