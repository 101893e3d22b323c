// End to end, the long ones: kill -9 of fileindexd in the middle of a large
// batch, and notifications lost in an inotify overflow.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <sstream>
#include <thread>

#include "common/file_util.h"
#include "common/json_util.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/state/communication.h"
#include "fileindex/state/status_mgr.h"
#include "tests/system/system_harness.h"

namespace corvlumex {
namespace testing_support {
namespace {
namespace fs = std::filesystem;

Json::Value ShareData() {
  Json::Value data(Json::objectValue);
  data["share_name"] = "share";
  return data;
}

// Creates /share/<folder> (if need be), starts the daemons (fileindexd with
// `indexer_args`, corvnotifyd with `notifier_env`), adds the folder and
// waits until it is indexed.
void StartWithFolder(SystemSandbox& box, const std::string& folder,
                     const std::vector<std::string>& indexer_args = {},
                     const std::map<std::string, std::string>& notifier_env = {}) {
  fs::create_directories(box.Path(folder));
  box.StartAll(indexer_args, notifier_env);
  ASSERT_EQ(RunCli({"folder", "add", "/share/" + folder}).status, 0);
  ASSERT_EQ(box.Converge(box.DiskPaths(folder), std::chrono::seconds(60)), "");
}

// Polls until the share's live queue holds `text` (the notifier wrote it);
// with `or_taken_over`, a queue the indexer has taken over counts too (a
// round begun just before a pause may have taken the lines, still queued).
bool QueueHolds(SystemSandbox& box, const std::string& text, bool or_taken_over = false) {
  const std::string queue = box.Path("@eaDir/fileindex.queue");
  return PollUntil(
      [&] {
        return ReadFileText(queue).find(text) != std::string::npos ||
               (or_taken_over && ReadFileText(queue + ".tmp").find(text) != std::string::npos);
      },
      std::chrono::seconds(30));
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

// Files written by `write` (which answers the name of the last one) while
// indexing is paused, so that they make one batch when it resumes; returns
// once the batch is under way. Written with indexing running, a loaded
// machine can index them in many small rounds as they arrive.
void StartABulkBatch(SystemSandbox& box, const std::function<std::string()>& write) {
  fileindex::StatusMgr().Pause(0);
  const std::string last = write();
  ASSERT_TRUE(QueueHolds(box, last, true)) << box.IndexerStatus() << box.Logs();
  fileindex::StatusMgr().Resume();
  ASSERT_TRUE(MidBatch(box)) << box.Logs();
}

void StartABulkBatch(SystemSandbox& box, const std::string& relative, int files) {
  StartABulkBatch(box, [&] {
    for (int i = 0; i < files; ++i) WriteText(box.Path(relative + "/f" + std::to_string(i) + ".txt"), "bulk " + std::to_string(i));
    return "f" + std::to_string(files - 1) + ".txt";
  });
}

// Moves the documents at `from` to `to` the way a rename does, one request
// per document, as far as `count` of the folder's files (the folder's own
// first): the state a killed indexer leaves in the middle of a rename.
void MoveDocuments(const std::string& from, const std::string& to, int count) {
  for (int i = -1; i < count; ++i) {
    const std::string name = i < 0 ? "" : "/f" + std::to_string(i) + ".txt";
    Json::Value req(Json::objectValue);
    req["command"] = "document_set_by_id";
    req["data"]["id"] = fileindex::elastic::GetFileIndexID("share");
    req["data"]["doc_id"] = from + name;
    req["data"]["data"]["CORVMDPath"] = to + name;
    req["data"]["data"]["CORVMDParent"] = i < 0 ? Dirname(to) : to;
    fileindex::elastic::SendRequestNoResult(req);
  }
  Json::Value commit(Json::objectValue);
  commit["command"] = "commit";
  commit["data"]["id"] = fileindex::elastic::GetFileIndexID("share");
  fileindex::elastic::SendRequestNoResult(commit);
}

TEST(SystemCrashTest, KillsDuringALargeBatchAndDuringAFolderRenameThenRestartConverge) {
  SystemSandbox box;
  ASSERT_NO_FATAL_FAILURE(StartWithFolder(box, "bulk"));
  ASSERT_NO_FATAL_FAILURE(StartABulkBatch(box, [&] {
    for (int dir = 0; dir < 10; ++dir) {
      fs::create_directories(box.Path("bulk/d" + std::to_string(dir)));
      for (int i = 0; i < 150; ++i) {
        WriteText(box.Path("bulk/d" + std::to_string(dir) + "/f" + std::to_string(i) + ".txt"),
                  "bulk file " + std::to_string(dir * 1000 + i));
      }
    }
    return std::string("/bulk/d9/f149.txt");
  }));
  box.StopIndexer(SIGKILL);
  // Changes while the indexer is down wait in the queue.
  ASSERT_EQ(unlink(box.Path("bulk/d0/f0.txt").c_str()), 0);
  ASSERT_EQ(rename(box.Path("bulk/d1").c_str(), box.Path("bulk/moved").c_str()), 0);
  box.StartIndexer();
  ASSERT_EQ(box.Converge(box.DiskPaths("bulk"), std::chrono::seconds(120)), "");

  // Then it dies while it moves the documents of a folder of 150 files, and
  // the folder moves on again before it is back: the taken-over queue holds
  // the first rename, the live one the second. Nothing may stay under a name
  // the disk no longer has.
  box.StopIndexer(SIGKILL);
  const std::string queue = box.Path("@eaDir/fileindex.queue");
  ASSERT_EQ(rename(box.Path("bulk/moved").c_str(), box.Path("bulk/B").c_str()), 0);
  ASSERT_TRUE(QueueHolds(box, "/bulk/B"));
  // What the dead indexer had done: taken the queue over, moved half.
  ASSERT_EQ(rename(queue.c_str(), (queue + ".tmp").c_str()), 0);
  MoveDocuments(box.Path("bulk/moved"), box.Path("bulk/B"), 75);
  ASSERT_EQ(rename(box.Path("bulk/B").c_str(), box.Path("bulk/C").c_str()), 0);
  ASSERT_TRUE(QueueHolds(box, "/bulk/C"));
  box.StartIndexer();
  ASSERT_EQ(box.Converge(box.DiskPaths("bulk"), std::chrono::seconds(60)), "");
}

size_t CountBelow(const std::set<std::string>& paths, const std::string& folder) {
  return std::count_if(paths.begin(), paths.end(), [&](const std::string& path) { return path.rfind(folder + "/", 0) == 0; });
}

TEST(SystemCrashTest, AFileWrittenDuringABulkBatchIsSearchableBeforeTheBatchEnds) {
  SystemSandbox box;
  fs::create_directories(box.Path("top/bulk"));
  ASSERT_NO_FATAL_FAILURE(StartWithFolder(box, "top"));
  fs::create_directories(box.Path("top/inbox"));

  constexpr int kBulk = 3000;
  StartABulkBatch(box, "top/bulk", kBulk);
  WriteText(box.Path("top/inbox/fresh.txt"), "a zebrafinch arrived");
  ASSERT_TRUE(PollUntil([&] { return box.Search("zebrafinch").size() == 1; }, std::chrono::seconds(120))) << box.Logs();
  // It did not wait for the bulk batch to end.
  EXPECT_LT(CountBelow(box.IndexedPaths(), box.Path("top/bulk")), static_cast<size_t>(kBulk));
  ASSERT_EQ(box.Converge(box.DiskPaths("top"), std::chrono::seconds(120)), "");
}

// The search daemon dies in the middle of a large batch: what was committed
// before is not done again; and the indexer follows a restarted daemon at
// once instead of after its grown back-off.
TEST(SystemCrashTest, ASearchDaemonRestartCostsOnlyTheUncommittedSlice) {
  SystemSandbox box;
  // Short slices, so that some are committed long before the batch ends
  // however fast the machine is.
  ASSERT_NO_FATAL_FAILURE(StartWithFolder(box, "bulk", {"--slice-ms", "100"}));
  constexpr int kBulk = 3000;
  StartABulkBatch(box, "bulk", kBulk);
  // The indexer saves how many operations it committed after each slice.
  const std::string mark = box.Path("@eaDir/fileindex.queue.tmp.applied");
  const auto committed = [&] {
    std::istringstream in(ReadFileText(mark));
    std::string identity;
    uint64_t applied = 0;
    return std::getline(in, identity) && in >> applied ? applied : 0;
  };
  ASSERT_TRUE(PollUntil([&] { return committed() > 0; }, std::chrono::seconds(120))) << box.Logs();
  box.StopSearchDaemon(SIGKILL);
  const uint64_t extracted_at_kill = box.Extracted();
  const uint64_t committed_at_kill = committed();
  box.StartSearchDaemon();
  ASSERT_EQ(box.Converge(box.DiskPaths("bulk"), std::chrono::seconds(120)), "");
  // The committed operations were not done again: at most the rest of the
  // batch followed (doing the whole batch again would be kBulk more). A few
  // files may be extracted between the kill and the failed send that follows.
  constexpr uint64_t kInFlight = 16;
  EXPECT_LE(box.Extracted(), extracted_at_kill + kBulk - committed_at_kill + kInFlight)
      << "committed before the kill: " << committed_at_kill << "\n" << box.Logs();

  // Down for long: the indexer's attempts fail and its back-off grows (1, 2,
  // 4, 8, then 16 s), yet it follows the restarted daemon at once.
  box.StopSearchDaemon(SIGKILL);
  WriteText(box.Path("bulk/late.txt"), "written while searching was down");
  std::this_thread::sleep_for(std::chrono::seconds(17));
  box.StartSearchDaemon();
  // The next attempt of the back-off alone would come some 14 s from here.
  ASSERT_EQ(box.Converge(box.DiskPaths("bulk"), std::chrono::seconds(10)), "") << box.Logs();
}

TEST(SystemCrashTest, LostNotificationsLeadToAFullReindexThatConverges) {
  const long limit = std::atol(ReadFileText("/proc/sys/fs/inotify/max_queued_events").c_str());
  if (limit <= 0 || limit > 1000000) GTEST_SKIP() << "kernel queue limit unusable: " << limit;
  SystemSandbox box;
  fs::create_directories(box.Path("docs/sub"));
  WriteText(box.Path("docs/sub/stays.txt"), "stays");
  WriteText(box.Path("docs/goes.txt"), "goes");
  const std::string pause = box.root() + "/notifier-pause";
  ASSERT_NO_FATAL_FAILURE(
      StartWithFolder(box, "docs", {}, {{"CORVNOTIFYD_TEST_PAUSE_FILE", pause}}));

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

bool StatusSays(const std::string& text) { return RunCli({"status"}).out.find(text) != std::string::npos; }

// While the notifier is down nobody sees a change: status says so, and its
// next start has each share checked against the disk, which brings back
// everything made, changed and deleted meanwhile.
TEST(SystemCrashTest, ChangesWhileTheNotifierIsDownAreFoundWhenItStartsAgain) {
  SystemSandbox box;
  fs::create_directories(box.Path("docs/keep"));
  WriteText(box.Path("docs/keep/old.txt"), "an old file");
  fs::create_directories(box.Path("docs/stable"));
  for (int i = 0; i < 30; ++i) WriteText(box.Path("docs/stable/s" + std::to_string(i) + ".txt"), "unchanged");
  ASSERT_NO_FATAL_FAILURE(StartWithFolder(box, "docs"));
  const std::string missed = "against the disk: changes may have been missed";
  EXPECT_TRUE(StatusSays("corvnotifyd: running\n")) << RunCli({"status"}).out;

  int round = 0;
  for (const int stop_signal : {SIGKILL, SIGTERM}) {
    const std::string tag = std::to_string(++round);
    const uint64_t extracted_before = box.Extracted();
    box.StopNotifier(stop_signal);
    EXPECT_TRUE(StatusSays("corvnotifyd: NOT RUNNING (start it with systemctl start corvnotifyd): changes on disk "
                           "are not seen now"))
        << RunCli({"status"}).out;
    fs::create_directories(box.Path("docs/new" + tag));
    for (int i = 0; i < 20; ++i) {
      WriteText(box.Path("docs/new" + tag + "/f" + std::to_string(i) + ".txt"), "unseen" + tag + " marmalade");
    }
    fs::remove_all(box.Path(round == 1 ? "docs/keep" : "docs/new1"));
    // Held back, so the pending check can be seen in status before it runs.
    fileindex::StatusMgr().Pause(0);
    box.StartNotifier();
    EXPECT_TRUE(PollUntil([&] { return StatusSays("share: waiting to be checked " + missed); },
                          std::chrono::seconds(30)))
        << RunCli({"status"}).out << box.Logs();
    fileindex::StatusMgr().Resume();
    ASSERT_EQ(box.Converge(box.DiskPaths("docs"), std::chrono::seconds(60)), "") << box.Logs();
    EXPECT_EQ(box.Search("unseen" + tag).size(), 20u);
    EXPECT_TRUE(PollUntil([&] { return !StatusSays(missed); }, std::chrono::seconds(30)))
        << RunCli({"status"}).out;
    EXPECT_TRUE(StatusSays("corvnotifyd: running\n"));
    // The check is cheap: the 20 new files and their folders are extracted,
    // the 30 unchanged files are not extracted again.
    EXPECT_GE(box.Extracted() - extracted_before, 20u);
    EXPECT_LE(box.Extracted() - extracted_before, 25u);
  }
}

// Fills the volume holding `path` with one file until it is full.
void FillVolume(const std::string& path) {
  const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  ASSERT_GE(fd, 0);
  const std::string block(1 << 16, 'x');
  while (write(fd, block.data(), block.size()) > 0) {
  }
  close(fd);
}

TEST(SystemCrashTest, AFullVolumeStopsTheShareUntilThereIsRoomAgain) {
  SystemSandbox box;
  // The share on a volume of its own, just above the 100 MiB the indexer wants free.
  if (geteuid() != 0 || mount("tmpfs", box.share_dir().c_str(), "tmpfs", 0, "size=110m") != 0) {
    GTEST_SKIP() << "cannot mount a small volume here";
  }
  struct Unmount {
    std::string path;
    ~Unmount() { umount2(path.c_str(), MNT_DETACH); }
  } unmount{box.share_dir()};
  const std::string notices = box.root() + "/notices";
  box.InstallNoticeTool(notices);
  fs::create_directories(box.Path("docs"));
  WriteText(box.Path("docs/first.txt"), "written with room to spare");
  ASSERT_NO_FATAL_FAILURE(StartWithFolder(box, "docs"));

  // New files are queued while indexing is paused; then the volume fills
  // up, and indexing them fails for want of room.
  fileindex::StatusMgr().Pause(0);
  for (int i = 0; i < 50; ++i) WriteText(box.Path("docs/late" + std::to_string(i) + ".txt"), std::string(4096, 'y'));
  ASSERT_TRUE(QueueHolds(box, "late49", true)) << box.IndexerStatus() << box.Logs();
  FillVolume(box.Path("filler"));
  fileindex::StatusMgr().Resume();
  ASSERT_TRUE(PollUntil([&] { return box.IndexerStatus().find("\"no_space\"") != std::string::npos; },
                        std::chrono::seconds(60)))
      << box.IndexerStatus() << box.Logs();
  EXPECT_TRUE(PollUntil([&] { return ReadFileText(notices).find("error:index_no_space") != std::string::npos; },
                        std::chrono::seconds(10)));
  const std::string status_file = box.root() + "/var/packages/CorvLumex/etc/fileindex.status";
  EXPECT_NE(ReadFileText(status_file).find("\"share\":1"), std::string::npos);

  // Room again, and the share's worker asked for: the share is rebuilt whole.
  ASSERT_EQ(unlink(box.Path("filler").c_str()), 0);
  fileindex::SendCommandToDaemon("worker_create", ShareData());
  ASSERT_EQ(box.Converge(box.DiskPaths("docs"), std::chrono::seconds(60)), "");
  EXPECT_TRUE(PollUntil([&] { return ReadFileText(status_file).find("\"share\":1") == std::string::npos; }, std::chrono::seconds(10)))
      << ReadFileText(status_file) << box.IndexerStatus() << box.Logs();
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
