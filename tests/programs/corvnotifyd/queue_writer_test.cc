// Appending batches of lines to a share queue under its lock file.
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <gtest/gtest.h>

#include <chrono>
#include <filesystem>
#include <string>
#include <vector>

#include "common/lock_file.h"
#include "programs/corvnotifyd/queue_writer.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace notifyd {
namespace {

using testing_support::LogCapture;
using testing_support::ReadFileText;
using testing_support::Sandbox;
using testing_support::SleepRecorder;

class QueueWriterTest : public ::testing::Test {
 protected:
  Sandbox root_{false};
  std::string share_ = root_.MakeDir("share");
  std::string queue_ = share_ + "/@eaDir/fileindex.queue";
};

// The queue's folder is made in an existing share, never a vanished share.
TEST_F(QueueWriterTest, MakesTheQueueFolderOfAnExistingShareOnlyAndAppends) {
  std::string error;
  ASSERT_TRUE(AppendQueueLines(queue_, "one\n", &error)) << error;
  ASSERT_TRUE(AppendQueueLines(queue_, "two\nthree\n", &error)) << error;
  EXPECT_EQ(ReadFileText(queue_), "one\ntwo\nthree\n");
  EXPECT_FALSE(AppendQueueLines(root_.path() + "/gone/@eaDir/fileindex.queue", "x\n", &error));
  EXPECT_NE(error.find("the folder " + root_.path() + "/gone of the queue does not exist"), std::string::npos)
      << error;
  EXPECT_FALSE(std::filesystem::exists(root_.path() + "/gone"));
}

TEST_F(QueueWriterTest, AFailedWriteLeavesNoHalfLine) {
  std::string error;
  ASSERT_TRUE(AppendQueueLines(queue_, std::string(100, 'a') + "\n", &error));
  // The file-size limit stops the write part way, as a full disk would.
  struct rlimit old_limit;
  getrlimit(RLIMIT_FSIZE, &old_limit);
  struct rlimit small = old_limit;
  small.rlim_cur = 150;
  const auto old_handler = signal(SIGXFSZ, SIG_IGN);
  setrlimit(RLIMIT_FSIZE, &small);
  const bool ok = AppendQueueLines(queue_, std::string(200, 'b') + "\n", &error);
  setrlimit(RLIMIT_FSIZE, &old_limit);
  signal(SIGXFSZ, old_handler);
  EXPECT_FALSE(ok);
  EXPECT_NE(error.find("write failed"), std::string::npos) << error;
  EXPECT_EQ(ReadFileText(queue_), std::string(100, 'a') + "\n");
}

TEST_F(QueueWriterTest, LinesWaitWhileTheQueueIsLockedAndKeepTheirOrder) {
  SleepRecorder no_real_sleep;
  LogCapture log;
  std::vector<std::string> lost;
  QueueWriter writer(1 << 20, [&](const std::string& queue) { lost.push_back(queue); });
  const auto t0 = QueueWriter::Clock::now();
  {
    std::string error;
    ASSERT_TRUE(AppendQueueLines(queue_, "", &error)) << error;
    LockFile held(queue_, true);  // the indexer taking the queue over
    writer.Buffer(queue_) += "first\n";
    writer.Flush(t0, false);
    EXPECT_TRUE(writer.HasPending());
    EXPECT_EQ(writer.NextRetry(), t0 + std::chrono::seconds(1));
    writer.Buffer(queue_) += "second\n";
    writer.Flush(t0 + std::chrono::milliseconds(500), false);  // not yet time to retry
    EXPECT_FALSE(no_real_sleep.Sleeps().empty());
  }
  EXPECT_EQ(log.Matching("cannot append to queue " + queue_).size(), 1u) << "said once";
  writer.Flush(t0 + std::chrono::seconds(1), false);
  EXPECT_FALSE(writer.HasPending());
  EXPECT_EQ(ReadFileText(queue_), "first\nsecond\n");
  EXPECT_EQ(log.Matching("is writable again").size(), 1u);
  EXPECT_TRUE(lost.empty());
}

TEST_F(QueueWriterTest, LinesPilingUpForAnUnwritableQueueAreDroppedAndReported) {
  const std::string gone = root_.path() + "/gone/@eaDir/fileindex.queue";
  std::vector<std::string> lost;
  QueueWriter writer(16, [&](const std::string& queue) { lost.push_back(queue); });
  writer.Buffer(gone) += "0123456789\n";
  writer.Flush(QueueWriter::Clock::now(), false);
  EXPECT_TRUE(lost.empty());
  writer.Buffer(gone) += "0123456789\n";
  writer.Flush(QueueWriter::Clock::now(), true);
  EXPECT_EQ(lost, std::vector<std::string>{gone});
  EXPECT_FALSE(writer.HasPending());
}

}  // namespace
}  // namespace notifyd
}  // namespace corvlumex
