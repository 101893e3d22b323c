// Test helpers: capture the library's log lines and its sleeps, and make a
// private sandbox root that is removed afterwards.
#pragma once

#include <chrono>
#include <mutex>
#include <string>
#include <vector>

namespace corvlumex {
namespace testing_support {

// Routes every log line into memory while alive; restores syslog after.
class LogCapture {
 public:
  LogCapture();
  ~LogCapture();
  std::vector<std::string> Lines() const;
  // Lines that contain `needle`.
  std::vector<std::string> Matching(const std::string& needle) const;
  void Clear();

 private:
  mutable std::mutex mutex_;
  std::vector<std::string> lines_;
};

// Records every SleepFor instead of sleeping while alive.
class SleepRecorder {
 public:
  SleepRecorder();
  ~SleepRecorder();
  std::vector<std::chrono::microseconds> Sleeps() const;

 private:
  mutable std::mutex mutex_;
  std::vector<std::chrono::microseconds> sleeps_;
};

// A fresh directory under the system temp dir, set as CORVLUMEX_ROOT while
// alive (unless `set_root` is false), removed recursively afterwards.
class SandboxRoot {
 public:
  explicit SandboxRoot(bool set_root = true);
  ~SandboxRoot();
  const std::string& path() const { return path_; }
  // Creates `relative` (and its parents) under the root; returns the full path.
  std::string MakeDir(const std::string& relative) const;
  std::string WriteFile(const std::string& relative, const std::string& content) const;

 private:
  std::string path_;
  bool set_root_;
  std::string previous_root_;
  bool had_previous_root_ = false;
};

}  // namespace testing_support
}  // namespace corvlumex
