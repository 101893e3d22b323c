#include "tests/support/log_capture.h"

#include "common/log.h"
#include "common/sys.h"

namespace corvlumex {
namespace testing_support {

LogCapture::LogCapture() {
  SetLogSink([this](int, const std::string& line) {
    std::lock_guard<std::mutex> guard(mutex_);
    lines_.push_back(line);
  });
}

LogCapture::~LogCapture() { SetLogSink(nullptr); }

std::vector<std::string> LogCapture::Lines() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return lines_;
}

std::vector<std::string> LogCapture::Matching(const std::string& needle) const {
  std::vector<std::string> found;
  for (const std::string& line : Lines()) {
    if (line.find(needle) != std::string::npos) found.push_back(line);
  }
  return found;
}

void LogCapture::Clear() {
  std::lock_guard<std::mutex> guard(mutex_);
  lines_.clear();
}

SleepRecorder::SleepRecorder() {
  SetSleepHook([this](std::chrono::microseconds duration) {
    std::lock_guard<std::mutex> guard(mutex_);
    sleeps_.push_back(duration);
  });
}

SleepRecorder::~SleepRecorder() { SetSleepHook(nullptr); }

std::vector<std::chrono::microseconds> SleepRecorder::Sleeps() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return sleeps_;
}

}  // namespace testing_support
}  // namespace corvlumex
