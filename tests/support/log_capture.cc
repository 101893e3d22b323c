#include "tests/support/log_capture.h"

#include <stdlib.h>
#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>

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

SandboxRoot::SandboxRoot(bool set_root) : set_root_(set_root) {
  std::string pattern = (std::filesystem::temp_directory_path() / "corvlumex-test-XXXXXX").string();
  if (mkdtemp(&pattern[0]) == nullptr) throw std::runtime_error("mkdtemp failed");
  path_ = pattern;
  if (set_root_) {
    if (const char* previous = getenv("CORVLUMEX_ROOT")) {
      had_previous_root_ = true;
      previous_root_ = previous;
    }
    setenv("CORVLUMEX_ROOT", path_.c_str(), 1);
  }
}

SandboxRoot::~SandboxRoot() {
  if (set_root_) {
    if (had_previous_root_) setenv("CORVLUMEX_ROOT", previous_root_.c_str(), 1);
    else unsetenv("CORVLUMEX_ROOT");
  }
  std::error_code ignored;
  std::filesystem::permissions(path_, std::filesystem::perms::owner_all, ignored);
  std::filesystem::remove_all(path_, ignored);
}

std::string SandboxRoot::MakeDir(const std::string& relative) const {
  const std::string full = path_ + "/" + relative;
  std::filesystem::create_directories(full);
  return full;
}

std::string SandboxRoot::WriteFile(const std::string& relative, const std::string& content) const {
  const std::string full = path_ + "/" + relative;
  std::filesystem::create_directories(std::filesystem::path(full).parent_path());
  std::ofstream(full, std::ios::binary) << content;
  return full;
}

}  // namespace testing_support
}  // namespace corvlumex
