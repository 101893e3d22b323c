// Test helpers: capture the library's log lines and its sleeps.
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

}  // namespace testing_support
}  // namespace corvlumex
