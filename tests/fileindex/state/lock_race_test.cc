// The queue's lock is taken on the queue file itself, which a take-over
// renames. A lock that lands on the renamed file must be taken again.
#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <cstdio>
#include <fstream>

#include "common/lock_file.h"
#include "tests/fileindex/state/syscall_script.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace {

using testing_support::Sandbox;
using testing_support::ScopedSyscallScript;
using testing_support::SleepRecorder;
using testing_support::SyscallScript;

bool LockedElsewhere(const std::string& path) {
  const int fd = open(path.c_str(), O_RDONLY);
  if (fd < 0) return false;
  const bool locked = flock(fd, LOCK_EX | LOCK_NB) != 0;
  close(fd);
  return locked;
}

TEST(QueueLockRace, LockOnAFileRenamedBeforeTheFlockIsTakenAgain) {
  Sandbox root(false);
  SleepRecorder sleeps;
  const std::string queue = root.path() + "/fileindex.queue";
  std::ofstream(queue) << "line\n";
  SyscallScript script;
  int flocks = 0;
  script.before_flock = [&] {
    // The take-over wins the race between our open and our flock.
    if (++flocks == 1) {
      ASSERT_EQ(rename(queue.c_str(), (queue + ".tmp").c_str()), 0);
    }
  };
  {
    ScopedSyscallScript scope(&script);
    const LockFile lock(queue, true);
    script.before_flock = nullptr;
    EXPECT_TRUE(LockedElsewhere(queue)) << "the lock is on the file the path names now";
    EXPECT_FALSE(LockedElsewhere(queue + ".tmp"));
  }
  EXPECT_EQ(flocks, 2);
  EXPECT_TRUE(sleeps.Sleeps().empty()) << "taken again at once";
}

}  // namespace
}  // namespace corvlumex
