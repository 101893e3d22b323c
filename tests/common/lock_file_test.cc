#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <thread>

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

// Two processes: the second waits (really sleeping, the back-off scaled down
// tenfold) until the first lets go.
TEST(LockFileTest, SecondProcessGetsTheLockOnceTheFirstReleasesIt) {
  Sandbox root(false);
  const std::string path = root.path() + "/cfg.lock";
  const std::string marker = root.path() + "/marker";
  int ready[2];
  ASSERT_EQ(pipe(ready), 0);
  const pid_t holder = fork();
  ASSERT_GE(holder, 0);
  if (holder == 0) {
    LockFile lock(path, true);
    if (write(ready[1], "x", 1) != 1) _exit(2);
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    FILE* file = fopen(marker.c_str(), "w");
    if (file) fclose(file);
    _exit(0);
  }
  char byte;
  ASSERT_EQ(read(ready[0], &byte, 1), 1);
  SetSleepHook([](std::chrono::microseconds duration) { std::this_thread::sleep_for(duration / 10); });
  {
    LockFile lock(path, true);
    SetSleepHook(nullptr);
    // The holder wrote the marker before releasing: we cannot be earlier.
    EXPECT_EQ(access(marker.c_str(), F_OK), 0);
  }
  int status = 0;
  waitpid(holder, &status, 0);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
  close(ready[0]);
  close(ready[1]);
}

}  // namespace
}  // namespace corvlumex
