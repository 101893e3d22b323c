// Log lines of the library: one formatting path, one sink (syslog by
// default), and the check-and-throw convention built on them.
#pragma once

#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <functional>
#include <string>

#include "common/error.h"
#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

namespace fileindex {
// Syslog priority that switches the debug lines; 7 (debug) logs them.
extern int log_level;
}  // namespace fileindex

// Receives every log line, already formatted; an empty function restores syslog.
void SetLogSink(std::function<void(int priority, const std::string& line)> sink);

// Sends every log line to standard error as "<time> <program>: <line>", the
// time in ISO 8601 (IsoTimeStamp): a daemon run in the foreground, or with
// its standard error in a file, must say when each thing happened; syslog
// stamps its lines itself. Under systemd's journal, which stamps each line
// too, the time is left out.
void LogToStderr(const std::string& program);

// The local time `when` in ISO 8601 to the millisecond, with the offset
// from UTC: "2026-11-23T22:10:05.123+01:00".
std::string IsoTimeStamp(std::chrono::system_clock::time_point when);

// Writes one finished line to the sink (or syslog).
void WriteLogLine(int priority, const std::string& line);

// printf-style formatting into a std::string.
std::string StringPrintf(const char* format, ...) __attribute__((format(printf, 1, 2)));

// Formats a line at LOG_ERR; when errno is set, " [err: <system text>]" is
// appended and errno cleared, so a later line does not report a stale error.
void LogErrorLine(const char* format, ...) __attribute__((format(printf, 1, 2)));

namespace log_detail {

// "error.cc" for "/src/common/error.cc": log lines name the source unit only.
constexpr const char* BaseName(const char* path) {
  const char* base = path;
  for (const char* p = path; *p != '\0'; ++p) {
    if (*p == '/') base = p + 1;
  }
  return base;
}

[[noreturn]] void LogAndThrow(const char* file, int line, const char* function,
                              const char* condition, int saved_errno, const Error& error);

}  // namespace log_detail
}  // namespace corvlumex

CORVLUMEX_API_END

// "file:line ..." plain notice.
#define CORV_LOG(format, ...) \
  ::corvlumex::LogErrorLine("%s:%d " format, ::corvlumex::log_detail::BaseName(__FILE__), __LINE__, ##__VA_ARGS__)

// "file:line (pid, euid) (function) ..." line used for caught errors and platform failures.
#define CORV_LOG_FN(format, ...)                                                                     \
  ::corvlumex::LogErrorLine("%s:%d (%d, %u) (%s) " format, ::corvlumex::log_detail::BaseName(__FILE__), \
                            __LINE__, static_cast<int>(getpid()), static_cast<unsigned>(geteuid()),   \
                            __func__, ##__VA_ARGS__)

// Log-only failure: "... Failed [condition]".
#define CORV_LOG_FAILED(condition_text) CORV_LOG_FN("Failed [%s]", condition_text)

// Check-and-throw with the condition text given explicitly (when the source
// must differ from the text the log line has to show). Extra arguments are
// the reason; the reason is only evaluated when the condition holds.
#define CORV_CHECK_THROW_TEXT(condition, condition_text, code, ...)                                  \
  do {                                                                                             \
    if (condition) {                                                                               \
      const int corv_saved_errno_ = errno;                                                         \
      const ::corvlumex::Error corv_error_(code, ##__VA_ARGS__);                                   \
      ::corvlumex::log_detail::LogAndThrow(::corvlumex::log_detail::BaseName(__FILE__), __LINE__,   \
                                           __func__, condition_text, corv_saved_errno_, corv_error_); \
    }                                                                                              \
  } while (0)

// Check-and-throw whose log line shows the condition as written.
#define CORV_CHECK_THROW(condition, code, ...) CORV_CHECK_THROW_TEXT(condition, #condition, code, ##__VA_ARGS__)
