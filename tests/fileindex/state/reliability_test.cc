// Several processes sharing the queue and the folder file at once: nothing
// appended or saved may be lost, and readers never see a torn file (the
// check of the atomic rewrite every JSON state file shares: a writer that
// rewrites in place is caught here in every run).
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <chrono>
#include <cstdlib>
#include <map>
#include <set>
#include <stdexcept>
#include <thread>

#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/sys.h"
#include "fileindex/queue/custom_event.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/optree.h"
#include "fileindex/queue/queue_mgr.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/folder_mgr.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

// Lock back-off stays randomised but is scaled down fourfold: real
// contention, short waits, and still some seconds of patience for a writer
// that keeps losing the lock on a loaded machine under the sanitizers
// (tenfold left under 3 s, and a writer gave up there once).
void UseShortSleeps() {
  SetSleepHook([](std::chrono::microseconds duration) { std::this_thread::sleep_for(duration / 4); });
}

// Runs `work` in `count` child processes; returns their pids.
template <typename Work>
std::vector<pid_t> Spawn(int count, Work work) {
  std::vector<pid_t> children;
  for (int index = 0; index < count; ++index) {
    const pid_t pid = fork();
    if (pid == 0) {
      srand(static_cast<unsigned>(getpid()));  // else every child backs off alike
      int status = 0;
      try {
        work(index);
      } catch (const std::exception& error) {
        fprintf(stderr, "child %d: %s\n", index, error.what());
        status = 1;
      }
      _exit(status);
    }
    children.push_back(pid);
  }
  return children;
}

bool AllExited(std::vector<pid_t>& running, int* failures) {
  for (auto it = running.begin(); it != running.end();) {
    int status = 0;
    if (waitpid(*it, &status, WNOHANG) == *it) {
      if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) ++*failures;
      it = running.erase(it);
    } else {
      ++it;
    }
  }
  return running.empty();
}

class Reliability : public ::testing::Test {
 protected:
  Reliability() { UseShortSleeps(); }
  ~Reliability() override { SetSleepHook(nullptr); }
  Sandbox sandbox_{true, Sandbox::kInstalled};
};

TEST_F(Reliability, EveryAppendedLineIsProcessedExactlyOnceAcrossTakeOvers) {
  constexpr int kWriters = 3;
  constexpr int kLinesEach = 120;
  const std::string share = sandbox_.AddShare("docs");
  const std::string queue = share + "/@eaDir/fileindex.queue";

  // Every writer stops half-way until one take-over has run, so that at
  // least one surely falls between appends, however loaded the machine.
  int halfway[2], go_on[2];
  ASSERT_EQ(pipe(halfway), 0);
  ASSERT_EQ(pipe(go_on), 0);
  std::vector<pid_t> writers = Spawn(kWriters, [&](int writer) {
    close(go_on[1]);
    char byte;
    for (int i = 0; i < kLinesEach; ++i) {
      if (i == kLinesEach / 2 && (write(halfway[1], "h", 1) != 1 || read(go_on[0], &byte, 1) != 0)) {
        throw std::runtime_error("not told to go on");
      }
      AddCustomEvent(kEventCreate, share + "/w" + std::to_string(writer) + "/f" + std::to_string(i), "",
                     Json::Value());
    }
  });

  std::map<std::string, int> seen;
  const auto take_over = [&] {
    QueueMgr mgr(queue);
    mgr.ProcessOP([&seen](std::shared_ptr<OP> op) { ++seen[op->node_->GetPath()]; }, true);
    mgr.DeleteTmp();
  };
  char byte;
  for (int writer = 0; writer < kWriters; ++writer) EXPECT_EQ(read(halfway[0], &byte, 1), 1);
  take_over();
  close(go_on[1]);  // read() returns 0 in every writer: go on
  int failures = 0;
  while (!AllExited(writers, &failures)) take_over();
  take_over();  // what was appended after the last round
  EXPECT_EQ(failures, 0);
  for (int fd : {halfway[0], halfway[1], go_on[0]}) close(fd);

  std::map<std::string, int> once;
  for (int writer = 0; writer < kWriters; ++writer) {
    for (int i = 0; i < kLinesEach; ++i) once[share + "/w" + std::to_string(writer) + "/f" + std::to_string(i)] = 1;
  }
  EXPECT_EQ(seen, once);
}

TEST_F(Reliability, LockedFolderSavesLoseNothingAndNeverTearTheFile) {
  constexpr int kWriters = 4;
  constexpr int kFoldersEach = 12;
  sandbox_.AddShare("s");
  FolderMgr().Save();
  const std::string file = SysPath(kFileIndexFoldersCfgPath);

  std::vector<pid_t> writers = Spawn(kWriters, [&](int writer) {
    for (int i = 0; i < kFoldersEach; ++i) {
      const LockFile lock(SysPath(kFileIndexFoldersLockPath), true);
      FolderMgr mgr;
      std::shared_ptr<Folder> reindex;
      mgr.Upsert(reindex, std::make_shared<Folder>("/s/w" + std::to_string(writer) + "_" + std::to_string(i), "n",
                                                   true, true, true, true, false, false));
      mgr.Save();
    }
  });

  int failures = 0;
  int reads = 0;
  int torn = 0;
  while (!AllExited(writers, &failures)) {
    Json::Value folders;
    if (!JsonFromFile(folders, file) || !folders.isArray()) ++torn;
    ++reads;
  }
  EXPECT_EQ(failures, 0);
  EXPECT_EQ(torn, 0) << "of " << reads << " reads";
  std::multiset<std::string> saved, expected;  // every folder once
  const FolderMgr final_state;
  for (const auto& folder : final_state.Folders()) saved.insert(folder->GetPath());
  for (int writer = 0; writer < kWriters; ++writer) {
    for (int i = 0; i < kFoldersEach; ++i) expected.insert("/s/w" + std::to_string(writer) + "_" + std::to_string(i));
  }
  EXPECT_EQ(saved, expected);
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
