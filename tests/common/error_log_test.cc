#include <gtest/gtest.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <ctime>
#include <string>

#include "common/error.h"
#include "common/log.h"
#include "tests/support/expect_error.h"

namespace corvlumex {
namespace {

using testing_support::ErrorOf;
using testing_support::LogCapture;

TEST(ErrorTest, ReasonIsCopiedUnchangedInsideBracketsAndOnlyWhenGiven) {
  EXPECT_STREQ(Error(kErrorSystem).what(), "CorvLumex error, code=502");
  EXPECT_TRUE(Error(kErrorSystem).reason.empty());
  EXPECT_STREQ(Error(kErrorUnexpected).what(), "CorvLumex error, code=9999");
  const Error error(kErrorMalformedEvent, "Malformed event_raw: a]b");
  EXPECT_STREQ(error.what(), "CorvLumex error, code=906, reason=[Malformed event_raw: a]b]");
  EXPECT_EQ(error.reason, "Malformed event_raw: a]b");
}

void FailWhen(bool condition) { CORV_CHECK_THROW(condition, kErrorNoSpace, "Share (s) space not enough"); }

// Logged once with file, function, condition and reason; errno, when set,
// is shown and cleared.
TEST(CheckThrowTest, LogsOnceThenThrowsWithTheErrnoPartOnlyWhenSet) {
  LogCapture log;
  errno = 0;
  FailWhen(false);
  EXPECT_TRUE(log.Lines().empty());
  EXPECT_EQ(ErrorOf([] { FailWhen(true); }).code, kErrorNoSpace);
  errno = ENOENT;
  EXPECT_THROW(FailWhen(true), Error);
  EXPECT_EQ(errno, 0);
  const auto lines = log.Lines();
  ASSERT_EQ(lines.size(), 2u);
  for (const std::string& line : lines) {
    EXPECT_NE(line.find("error_log_test.cc:"), std::string::npos) << line;
    EXPECT_NE(line.find(") (FailWhen) Failed [condition], reason: Share (s) space not enough"), std::string::npos);
  }
  EXPECT_EQ(lines[0].find("[err:"), std::string::npos) << lines[0];
  EXPECT_EQ(lines[1].rfind(" [err: No such file or directory]"), lines[1].size() - 33) << lines[1];
}

void FailWithText() { CORV_CHECK_THROW_TEXT(true, "0 > Something(x)", kErrorSystem); }

TEST(CheckThrowTest, ExplicitConditionTextAndCodeOnlyError) {
  LogCapture log;
  errno = 0;
  EXPECT_STREQ(ErrorOf(FailWithText).what(), "CorvLumex error, code=502");
  ASSERT_EQ(log.Lines().size(), 1u);
  EXPECT_NE(log.Lines()[0].find("(FailWithText) Failed [0 > Something(x)], reason: "), std::string::npos);
}

TEST(LogTest, PlainAndFunctionLinesFollowTheErrnoRule) {
  LogCapture log;
  errno = 0;
  CORV_LOG("Remove share %s from folder mgr", "music");
  errno = EACCES;
  CORV_LOG_FAILED("KLIBServiceStart(x)");
  EXPECT_EQ(errno, 0);
  const auto lines = log.Lines();
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_NE(lines[0].find("error_log_test.cc:"), std::string::npos);
  EXPECT_NE(lines[0].find(" Remove share music from folder mgr"), std::string::npos);
  EXPECT_NE(lines[1].find("Failed [KLIBServiceStart(x)] [err: Permission denied]"), std::string::npos) << lines[1];
}

// Time stamps of log lines written to files: ISO 8601, local time to the
// millisecond, with the offset from UTC (POSIX time-zone strings, so no
// time-zone data is needed).
TEST(LogTest, TimeStampsAreIso8601LocalTimeWithTheirOffset) {
  const char* saved = getenv("TZ");
  const std::string previous = saved ? saved : "";
  struct Case {
    const char* tz;
    long long millis;
    const char* stamp;
  };
  const Case cases[] = {
      {"UTC0", 1250, "1970-01-01T00:00:01.250+00:00"},
      {"IST-5:30", 1800000000007LL, "2027-01-15T13:30:00.007+05:30"},
      {"EST5", 1800000000999LL, "2027-01-15T03:00:00.999-05:00"},
  };
  for (const Case& c : cases) {
    setenv("TZ", c.tz, 1);
    tzset();
    EXPECT_EQ(IsoTimeStamp(std::chrono::system_clock::time_point(std::chrono::milliseconds(c.millis))), c.stamp)
        << c.tz;
  }
  if (saved) setenv("TZ", previous.c_str(), 1);
  else unsetenv("TZ");
  tzset();
}

TEST(LogTest, LogLevelStartsAtDebug) { EXPECT_EQ(fileindex::log_level, 7); }

}  // namespace
}  // namespace corvlumex
