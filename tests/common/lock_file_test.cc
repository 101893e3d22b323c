#include <gtest/gtest.h>
#include <sys/stat.h>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/sys.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace {

using testing_support::ErrorOf;
using testing_support::ExpectError;
using testing_support::LogCapture;
using testing_support::OpenDescriptors;
using testing_support::Sandbox;
using testing_support::SleepRecorder;

TEST(LockFileTest, MissingFileIsCreatedAndKept) {
  Sandbox root(false);
  const std::string path = root.path() + "/cfg.lock";
  // With no umask in the way the mode is exactly the one the lock asks for:
  // readable by every process that must share (take) the lock.
  const mode_t previous_umask = umask(0);
  { LockFile lock(path, true); }
  umask(previous_umask);
  struct stat st;
  ASSERT_EQ(stat(path.c_str(), &st), 0);
  EXPECT_TRUE(S_ISREG(st.st_mode));
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  { LockFile again(path, false); }  // an existing lock file is reused and kept
  EXPECT_EQ(stat(path.c_str(), &st), 0);
}

TEST(LockFileTest, SharedLocksCoexist) {
  Sandbox root(false);
  const std::string path = root.path() + "/cfg.lock";
  SleepRecorder sleeps;
  LockFile first(path, false);
  LockFile second(path, false);
  EXPECT_TRUE(sleeps.Sleeps().empty());
}

// Not reentrant: a second exclusive lock in the same process retries 64
// times, sleeping after every attempt (also the last), then gives up.
TEST(LockFileTest, GivesUpAfter64AttemptsWithoutLeakingDescriptors) {
  Sandbox root(false);
  const std::string path = root.path() + "/cfg.lock";
  SleepRecorder sleeps;
  LockFile held(path, true);
  const int before = OpenDescriptors();
  ExpectError([&] { LockFile again(path, true); }, kErrorLockFile, "Exceed max retry, path=" + path);
  EXPECT_EQ(OpenDescriptors(), before);
  const auto recorded = sleeps.Sleeps();
  ASSERT_EQ(recorded.size(), 64u);
  for (auto duration : recorded) {
    EXPECT_EQ(duration.count() % 100000, 0);
    EXPECT_LE(duration.count(), 900000);
  }
}

TEST(LockFileTest, OpenFailureIsLoggedAndThrown) {
  Sandbox root(false);
  LogCapture log;
  const std::string path = root.path() + "/no/such/dir/cfg.lock";
  const Error error = ErrorOf([&] { LockFile lock(path, true); });
  EXPECT_EQ(error.code, kErrorLockFile);
  EXPECT_EQ(error.reason, "open failed, path=" + path + ", reason=No such file or directory");
  const auto lines = log.Lines();
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_NE(lines[0].find("(LockFile) Failed [0 > (fd_ = open(path_.c_str(), O_RDONLY | O_CREAT, 0644))], "
                          "reason: open failed, path="),
            std::string::npos)
      << lines[0];
  EXPECT_NE(lines[0].find(" [err: No such file or directory]"), std::string::npos);
}

}  // namespace
}  // namespace corvlumex
