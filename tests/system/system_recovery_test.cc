// End to end: names that are never indexed, a crash of fileindexd in the
// middle of a batch, and lost notifications.
#include <gtest/gtest.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "common/json_util.h"
#include "tests/system/cli_runner.h"
#include "tests/system/system_harness.h"

namespace corvlumex {
namespace testing_support {
namespace {
namespace fs = std::filesystem;

bool IsHiddenName(const std::string& path) {
  const std::string name = fs::path(path).filename().string();
  return name == ".DS_Store" || name == ".TemporaryItems" || name == "@tmp";
}

TEST(SystemRecoveryTest, PreservedNamesAndTheRecycleBinAreNeverIndexed) {
  SystemSandbox box;
  fs::create_directories(box.Path("photos/.TemporaryItems"));
  fs::create_directories(box.Path("#recycle"));
  WriteText(box.Path("photos/.DS_Store"), "finder data");
  WriteText(box.Path("photos/.TemporaryItems/partial.txt"), "partial upload");
  WriteText(box.Path("photos/keep.txt"), "holiday pictures");
  WriteText(box.Path("#recycle/old.txt"), "thrown away");
  box.StartAll();
  box.AddFolder("");  // the whole share
  ASSERT_EQ(box.Converge(box.DiskPaths("", IsHiddenName)), "");

  // Deleted into the bin: gone from search. Restored: back.
  ASSERT_EQ(rename(box.Path("photos/keep.txt").c_str(), box.Path("#recycle/keep.txt").c_str()), 0);
  ASSERT_EQ(box.Converge(box.DiskPaths("", IsHiddenName)), "");
  EXPECT_TRUE(box.Search("holiday").empty());
  ASSERT_EQ(rename(box.Path("#recycle/keep.txt").c_str(), box.Path("photos/keep.txt").c_str()), 0);
  ASSERT_EQ(box.Converge(box.DiskPaths("", IsHiddenName)), "");
  EXPECT_EQ(box.Search("holiday").size(), 1u);
}

// Waits until fileindexd reports a batch under way with some files done.
bool MidBatch(SystemSandbox& box) {
  return PollUntil(
      [&] {
        Json::Value status;
        if (!JsonFromString(status, box.IndexerStatus())) return false;
        const Json::Value& share = status["shares"]["share"];
        return share["state"].asString() == "indexing" && share["done"].asUInt64() > 0;
      },
      std::chrono::seconds(30));
}

TEST(SystemRecoveryTest, KillDuringALargeBatchThenRestartConverges) {
  SystemSandbox box;
  fs::create_directories(box.Path("bulk"));
  box.StartAll();
  box.AddFolder("bulk");
  ASSERT_EQ(box.Converge(box.DiskPaths("bulk")), "");

  for (int dir = 0; dir < 10; ++dir) {
    fs::create_directories(box.Path("bulk/d" + std::to_string(dir)));
    for (int i = 0; i < 150; ++i) {
      WriteText(box.Path("bulk/d" + std::to_string(dir) + "/f" + std::to_string(i) + ".txt"),
                "bulk file " + std::to_string(dir * 1000 + i));
    }
  }
  ASSERT_TRUE(MidBatch(box)) << box.Logs();
  box.StopIndexer(SIGKILL);
  // Changes while the indexer is down wait in the queue.
  ASSERT_EQ(unlink(box.Path("bulk/d0/f0.txt").c_str()), 0);
  ASSERT_EQ(rename(box.Path("bulk/d1").c_str(), box.Path("bulk/moved").c_str()), 0);
  box.StartIndexer();
  ASSERT_EQ(box.Converge(box.DiskPaths("bulk"), std::chrono::seconds(120)), "");
}

long KernelQueueLimit() {
  std::ifstream in("/proc/sys/fs/inotify/max_queued_events");
  long value = 0;
  in >> value;
  return value;
}

TEST(SystemRecoveryTest, LostNotificationsLeadToAFullReindexThatConverges) {
  const long limit = KernelQueueLimit();
  if (limit <= 0 || limit > 1000000) GTEST_SKIP() << "kernel queue limit unusable: " << limit;
  SystemSandbox box;
  fs::create_directories(box.Path("docs/sub"));
  WriteText(box.Path("docs/sub/stays.txt"), "stays");
  WriteText(box.Path("docs/goes.txt"), "goes");
  const std::string pause = box.root() + "/notifier-pause";
  box.StartAll({}, {{"CORVNOTIFYD_TEST_PAUSE_FILE", pause}});
  box.AddFolder("docs");
  ASSERT_EQ(box.Converge(box.DiskPaths("docs")), "");

  // The notifier stops reading; the kernel's queue overflows while files change.
  WriteText(pause, "");
  ASSERT_TRUE(PollUntil([&] { return access((pause + ".paused").c_str(), F_OK) == 0; }, std::chrono::seconds(10)));
  // Alternating attribute changes of two files are not folded by the kernel:
  // they fill its queue, so the changes after them are lost.
  const std::string a = box.Path("docs/sub/stays.txt"), b = box.Path("docs/goes.txt");
  for (long i = 0; i < limit + 100; ++i) utimensat(AT_FDCWD, (i % 2 ? a : b).c_str(), nullptr, 0);
  ASSERT_EQ(unlink(box.Path("docs/goes.txt").c_str()), 0);
  WriteText(box.Path("docs/sub/came.txt"), "came while nobody listened");
  ASSERT_EQ(rename(box.Path("docs/sub").c_str(), box.Path("docs/renamed").c_str()), 0);
  unlink(pause.c_str());
  ASSERT_EQ(box.Converge(box.DiskPaths("docs"), std::chrono::seconds(60)), "");
  EXPECT_EQ(box.Search("nobody listened").size(), 1u);
  // It was the queue's crash marker, not the events, that brought the index back.
  EXPECT_NE(box.indexer().Log().find("Queue crashed"), std::string::npos) << box.Logs();
}

TEST(SystemRecoveryTest, CommandLineStatusFoldersAndSearch) {
  SystemSandbox box;
  fs::create_directories(box.Path("docs"));
  WriteText(box.Path("docs/menu.txt"), "saffron paella");
  box.StartAll();
  CliResult added = RunCli({"folder", "add", "/share/docs", "--wait", "--timeout", "60"});
  ASSERT_EQ(added.status, 0) << added.err;
  CliResult found = RunCli({"search", "saffron"});
  EXPECT_EQ(found.status, 0) << found.err;
  EXPECT_NE(found.out.find(box.Path("docs/menu.txt")), std::string::npos) << found.out;
  CliResult listed = RunCli({"--json", "folder", "list"});
  EXPECT_NE(listed.out.find("\"finished\""), std::string::npos) << listed.out;
  // Errors carry their code and reason, with a non-zero exit.
  CliResult missing = RunCli({"folder", "get", "/share/nothing"});
  EXPECT_NE(missing.status, 0);
  EXPECT_NE(missing.err.find("error 902"), std::string::npos) << missing.err;
  CliResult twice = RunCli({"folder", "add", "/share/docs"});
  EXPECT_NE(twice.err.find("error 901"), std::string::npos) << twice.err;
  // Pause stops the indexing of new changes until resume.
  ASSERT_EQ(RunCli({"pause"}).status, 0);
  WriteText(box.Path("docs/later.txt"), "written while paused");
  EXPECT_FALSE(PollUntil([&] { return !box.Search("paused").empty(); }, std::chrono::milliseconds(1500)));
  ASSERT_EQ(RunCli({"resume"}).status, 0);
  ASSERT_EQ(box.Converge(box.DiskPaths("docs")), "");
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
