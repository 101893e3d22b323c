#include "common/log.h"

#include <syslog.h>

#include <cstdarg>
#include <cstring>
#include <mutex>

namespace corvlumex {

namespace fileindex {
int log_level = 7;
}  // namespace fileindex

namespace {

std::mutex& SinkMutex() {
  static std::mutex mutex;
  return mutex;
}

std::function<void(int, const std::string&)>& Sink() {
  static std::function<void(int, const std::string&)> sink;
  return sink;
}

std::string VStringPrintf(const char* format, va_list args) {
  va_list copy;
  va_copy(copy, args);
  char small[512];
  const int needed = vsnprintf(small, sizeof(small), format, copy);
  va_end(copy);
  if (needed < 0) return std::string();
  if (static_cast<size_t>(needed) < sizeof(small)) return std::string(small, needed);
  std::string text(static_cast<size_t>(needed) + 1, '\0');
  vsnprintf(&text[0], text.size(), format, args);
  text.resize(needed);
  return text;
}

// Applies the errno rule to a finished line and clears errno.
void WriteWithErrno(std::string line, int saved_errno) {
  if (saved_errno != 0) {
    line += " [err: ";
    line += strerror(saved_errno);
    line += "]";
  }
  WriteLogLine(LOG_ERR, line);
  errno = 0;
}

}  // namespace

void SetLogSink(std::function<void(int, const std::string&)> sink) {
  std::lock_guard<std::mutex> guard(SinkMutex());
  Sink() = std::move(sink);
}

void WriteLogLine(int priority, const std::string& line) {
  std::function<void(int, const std::string&)> sink;
  {
    std::lock_guard<std::mutex> guard(SinkMutex());
    sink = Sink();
  }
  if (sink) {
    sink(priority, line);
    return;
  }
  const int saved_errno = errno;
  syslog(priority, "%s", line.c_str());
  errno = saved_errno;
}

std::string StringPrintf(const char* format, ...) {
  va_list args;
  va_start(args, format);
  std::string text = VStringPrintf(format, args);
  va_end(args);
  return text;
}

void LogErrorLine(const char* format, ...) {
  const int saved_errno = errno;
  va_list args;
  va_start(args, format);
  std::string line = VStringPrintf(format, args);
  va_end(args);
  WriteWithErrno(std::move(line), saved_errno);
}

namespace log_detail {

void LogAndThrow(const char* file, int line, const char* function, const char* condition,
                 int saved_errno, const Error& error) {
  std::string text = StringPrintf("%s:%d (%d, %u) (%s) Failed [%s], reason: %s", file, line,
                                  static_cast<int>(getpid()), static_cast<unsigned>(geteuid()),
                                  function, condition, error.reason.c_str());
  WriteWithErrno(std::move(text), saved_errno);
  throw Error(error.code, error.reason);
}

}  // namespace log_detail
}  // namespace corvlumex
