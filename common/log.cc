#include "common/log.h"

#include <sys/stat.h>
#include <syslog.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
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

// systemd names the journal stream it connected to standard error as
// "<device>:<inode>" in JOURNAL_STREAM; the journal stamps lines itself.
bool StderrIsJournal() {
  const char* stream = getenv("JOURNAL_STREAM");
  if (stream == nullptr) return false;
  unsigned long long device = 0, inode = 0;
  struct stat st;
  if (sscanf(stream, "%llu:%llu", &device, &inode) != 2 || fstat(STDERR_FILENO, &st) != 0) return false;
  return st.st_dev == device && st.st_ino == inode;
}

}  // namespace

std::string IsoTimeStamp(std::chrono::system_clock::time_point when) {
  const auto since_epoch = when.time_since_epoch();
  const time_t seconds = static_cast<time_t>(std::chrono::duration_cast<std::chrono::seconds>(since_epoch).count());
  const int millis =
      static_cast<int>(std::chrono::duration_cast<std::chrono::milliseconds>(since_epoch).count() % 1000);
  struct tm local;
  localtime_r(&seconds, &local);
  char date[32];
  char offset[8];
  strftime(date, sizeof(date), "%Y-%m-%dT%H:%M:%S", &local);
  strftime(offset, sizeof(offset), "%z", &local);  // "+0100": ISO 8601 wants "+01:00"
  return StringPrintf("%s.%03d%.3s:%s", date, millis < 0 ? 0 : millis, offset, offset + 3);
}

void LogToStderr(const std::string& program) {
  const bool stamped = !StderrIsJournal();
  SetLogSink([program, stamped](int, const std::string& line) {
    const std::string text = (stamped ? IsoTimeStamp(std::chrono::system_clock::now()) + " " : std::string()) +
                             program + ": " + line + "\n";
    // One write per line, so lines of several threads never interleave.
    const int saved_errno = errno;
    if (write(STDERR_FILENO, text.data(), text.size()) < 0) {
      // Nowhere left to say that a log line could not be written.
    }
    errno = saved_errno;
  });
}

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
