#include "platform/platform.h"

#include <cerrno>
#include <mutex>

#include "common/log.h"
#include "platform/default_platform.h"

namespace corvlumex {
namespace platform {
namespace {

std::mutex& InstalledMutex() {
  static std::mutex mutex;
  return mutex;
}

std::shared_ptr<Platform>& Installed() {
  static std::shared_ptr<Platform> installed;
  return installed;
}

// Like errno: each thread sees the error of its own last platform call.
thread_local ErrorRecord last_error;

}  // namespace

const ErrorRecord& LastError() { return last_error; }

void SetLastError(int code, const char* file, int line, const std::string& message) {
  last_error.code = code;
  last_error.file = file ? file : "";
  last_error.line = line;
  last_error.message = message;
}

void ClearLastError() { last_error = ErrorRecord(); }

void LogPlatformError(const char* file, int line, const char* function, const char* what) {
  // Like every failure line: the system text is added when errno is set
  // (the platform call may have failed on a system call), then cleared.
  const ErrorRecord& error = LastError();
  LogErrorLine("%s:%d (%d, %u) (%s) %s: err=[0x%04X %s:%d]", file, line, static_cast<int>(getpid()),
               static_cast<unsigned>(geteuid()), function, what, static_cast<unsigned>(error.code),
               error.file.c_str(), error.line);
}

std::shared_ptr<Platform> Current() {
  std::lock_guard<std::mutex> guard(InstalledMutex());
  if (!Installed()) Installed() = MakeDefaultPlatform();
  return Installed();
}

void Install(std::shared_ptr<Platform> platform) {
  std::lock_guard<std::mutex> guard(InstalledMutex());
  Installed() = std::move(platform);
}

}  // namespace platform
}  // namespace corvlumex
