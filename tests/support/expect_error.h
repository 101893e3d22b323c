// Checks shared by the test directories: the Error an action throws and the
// log line that went with it, and the descriptors this process holds.
#pragma once

#include <dirent.h>
#include <gtest/gtest.h>

#include <string>

#include "common/error.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace testing_support {

// The Error that `fn` throws; a test failure (and a 9999 stand-in) when none.
template <typename Fn>
Error ErrorOf(Fn fn) {
  try {
    fn();
  } catch (const Error& error) {
    return error;
  }
  ADD_FAILURE() << "no throw";
  return Error(kErrorUnexpected, "no throw");
}

// `fn` throws `code` with exactly `reason`; unless `condition` is empty, one
// log line shows "(<function>) Failed [<condition>], reason: <reason>" (the
// function part only when given). Captures the log itself: do not call it
// while another LogCapture is alive.
template <typename Fn>
void ExpectError(Fn fn, ErrorCode code, const std::string& reason, const std::string& condition = "",
                 const std::string& function = "") {
  LogCapture log;
  const Error error = ErrorOf(fn);
  EXPECT_EQ(error.code, code) << error.what();
  EXPECT_EQ(error.reason, reason);
  if (!condition.empty()) {
    const std::string needle =
        (function.empty() ? "" : "(" + function + ") ") + "Failed [" + condition + "], reason: " + reason;
    EXPECT_EQ(log.Matching(needle).size(), 1u) << needle << " in " << ::testing::PrintToString(log.Lines());
  }
}

inline int OpenDescriptors() {
  int count = 0;
  DIR* dir = opendir("/proc/self/fd");
  while (readdir(dir) != nullptr) ++count;
  closedir(dir);
  return count;
}

}  // namespace testing_support
}  // namespace corvlumex
