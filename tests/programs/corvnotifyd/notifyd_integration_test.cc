// The real corvnotifyd, watching a sandbox share: what lands in the queue
// for each kind of change a user makes.
#include <fcntl.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "fileindex/queue/event.h"
#include "platform/linux/notifier_presence.h"
#include "tests/programs/corvnotifyd/notifyd_harness.h"

namespace corvlumex {
namespace testing_support {
namespace {

// The queue line bits: kEventCreate and the others.
using namespace fileindex;  // NOLINT
namespace fs = std::filesystem;

std::vector<QueueLine> About(const std::vector<QueueLine>& lines, const std::string& prefix) {
  std::vector<QueueLine> out;
  for (const QueueLine& line : lines) {
    if (line.path.compare(0, prefix.size(), prefix) == 0 || line.path_old.compare(0, prefix.size(), prefix) == 0) {
      out.push_back(line);
    }
  }
  return out;
}

size_t Count(const std::vector<QueueLine>& lines, uint32_t event) {
  return std::count_if(lines.begin(), lines.end(), [&](const QueueLine& l) { return l.event == event; });
}

void WriteFileInPieces(const std::string& path, size_t pieces, size_t piece_size) {
  const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  ASSERT_GE(fd, 0);
  const std::string piece(piece_size, 'x');
  for (size_t i = 0; i < pieces; ++i) ASSERT_EQ(write(fd, piece.data(), piece.size()), ssize_t(piece.size()));
  close(fd);
}

void Touch(const std::string& path) { close(open(path.c_str(), O_WRONLY | O_CREAT, 0644)); }

class NotifydTest : public ::testing::Test {
 protected:
  NotifydSandbox box_;
};

TEST_F(NotifydTest, FileChangesBecomeOneLineEachAndALargeCopyOneModify) {
  // Any local user can open the configuration folder and lock it: that must
  // not keep the notifier from starting.
  std::filesystem::create_directories(box_.config_dir());
  const int folder = open(box_.config_dir().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  ASSERT_EQ(0, flock(folder, LOCK_EX | LOCK_NB));
  auto daemon = box_.Start();
  close(folder);
  // A second notifier on the same configuration would write every line twice.
  auto second = box_.Run({"--foreground"});
  EXPECT_TRUE(box_.WaitForLog("another corvnotifyd already watches as configured in"));
  EXPECT_EQ(second->Wait(), 1) << "refused: it ends by itself";
  const std::string a = box_.docs() + "/a.txt";
  const std::string b = box_.docs() + "/b.txt";
  const std::string big = box_.docs() + "/big.bin";
  WriteFileInPieces(a, 3, 10);  // three writes, one close: one modify
  chmod(a.c_str(), 0600);
  rename(a.c_str(), b.c_str());
  unlink(b.c_str());
  WriteFileInPieces(big, 256, 64 * 1024);  // 16 MiB in 256 writes
  ASSERT_TRUE(box_.Sync(box_.docs() + "/sync"));
  // The start marker first: nobody saw what changed before the notifier ran.
  const std::vector<QueueLine> expected = {Line(kEventQueueCrash, box_.share(), true),
                                           Line(kEventCreate, a), Line(kEventModify, a), Line(kEventAttr, a),
                                           Line(kEventRename, b, false, a), Line(kEventDelete, b),
                                           Line(kEventCreate, big), Line(kEventModify, big),
                                           Line(kEventCreate, box_.docs() + "/sync", true)};
  EXPECT_EQ(box_.Queue(), expected);
  EXPECT_EQ(daemon->Stop(SIGTERM), 0);
}

TEST_F(NotifydTest, ConfigurationChangesArePickedUp) {
  const std::string music = box_.share() + "/music";
  const std::string other_share = box_.volume() + "/other";
  fs::create_directories(music);
  fs::create_directories(other_share + "/pics");
  const std::string other_queue = other_share + "/@eaDir/fileindex.queue";
  auto daemon = box_.Start();

  box_.WriteConfig("fileindex@share.json", box_.queue(), {box_.docs(), music});
  box_.WriteConfig("fileindex@other.json", other_queue, {other_share + "/pics"});
  ASSERT_TRUE(box_.WaitForLog("2 queues, 3 folders")) << daemon->Log();
  ASSERT_TRUE(box_.Sync(music + "/one"));
  ASSERT_TRUE(box_.Sync(other_share + "/pics/p1", other_queue));

  box_.WriteConfig("fileindex@share.json", box_.queue(), {box_.docs()});
  box_.RemoveConfig("fileindex@other.json");
  ASSERT_TRUE(WaitUntil([&] { return CountOccurrences(daemon->Log(), "1 queues, 1 folders") >= 2; }))
      << daemon->Log();
  Touch(music + "/two");
  Touch(other_share + "/pics/p2");
  ASSERT_TRUE(box_.Sync(box_.docs() + "/sync"));
  EXPECT_TRUE(About(box_.Queue(), music + "/two").empty());
  EXPECT_TRUE(About(ReadQueue(other_queue), other_share + "/pics/p2").empty());
  // A share without folders keeps its file with "config" null: nothing watched.
  std::ofstream(box_.config_dir() + "/fileindex@share.json")
      << "{\"queue\": \"" << box_.queue() << "\", \"config\": null}\n";
  ASSERT_TRUE(WaitUntil([&] { return daemon->Log().find("1 queues, 0 folders") != std::string::npos; }));
  EXPECT_EQ(daemon->Stop(SIGTERM), 0);
}

TEST_F(NotifydTest, StopWritesEverythingAlreadyHappened) {
  auto daemon = box_.Start();
  fs::create_directories(box_.docs() + "/many");
  ASSERT_TRUE(box_.Sync(box_.docs() + "/sync"));
  for (int i = 0; i < 3000; ++i) Touch(box_.docs() + "/many/f" + std::to_string(i));
  EXPECT_EQ(daemon->Stop(SIGTERM), 0);
  const auto lines = About(box_.Queue(), box_.docs() + "/many/");
  EXPECT_EQ(Count(lines, kEventCreate), 3000u);
  EXPECT_EQ(Count(lines, kEventModify), 3000u);
}

long KernelQueueLimit() { return std::atol(ReadFileText("/proc/sys/fs/inotify/max_queued_events").c_str()); }

// Stops the daemon's reader, makes more events than the kernel holds, lets
// the reader go on.
void Overflow(NotifydSandbox& box, const std::string& pause_file, const std::string& dir) {
  fs::create_directories(dir);
  ASSERT_TRUE(box.Sync(dir + "/watched"));
  Touch(pause_file);
  ASSERT_TRUE(WaitUntil([&] { return access((pause_file + ".paused").c_str(), F_OK) == 0; }));
  // Each new file is a create and a close-after-write.
  const long files = KernelQueueLimit() / 2 + 1000;
  for (long i = 0; i < files; ++i) Touch(dir + "/f" + std::to_string(i));
  unlink(pause_file.c_str());
}

TEST_F(NotifydTest, OverflowWritesOneCrashMarkerPerBackOffWindow) {
  if (KernelQueueLimit() <= 0 || KernelQueueLimit() > 200000) GTEST_SKIP() << "kernel queue limit too large";
  const std::string pause = box_.root() + "/pause";
  auto daemon = box_.Start({{"CORVNOTIFYD_TEST_PAUSE_FILE", pause}, {"CORVNOTIFYD_TEST_BACKOFF_MS", "600000"}});
  // One marker is there from the start (see EveryStartMarksEachWatchedShare).
  ASSERT_EQ(Count(box_.Queue(), kEventQueueCrash), 1u);
  ASSERT_NO_FATAL_FAILURE(Overflow(box_, pause, box_.docs() + "/burst1"));
  ASSERT_TRUE(WaitUntil([&] { return Count(box_.Queue(), kEventQueueCrash) >= 2; })) << daemon->Log();
  ASSERT_TRUE(box_.Sync(box_.docs() + "/sync1"));
  EXPECT_EQ(box_.Queue().back(), Line(kEventCreate, box_.docs() + "/sync1", true));
  EXPECT_NE(daemon->Log().find("sysctl -w fs.inotify.max_queued_events="), std::string::npos) << daemon->Log();

  // A second overflow inside the back-off window: no second marker yet.
  ASSERT_NO_FATAL_FAILURE(Overflow(box_, pause, box_.docs() + "/burst2"));
  ASSERT_TRUE(box_.WaitForLog("lost again inside its back-off window")) << daemon->Log();
  ASSERT_TRUE(box_.Sync(box_.docs() + "/sync2")) << daemon->Log();
  EXPECT_EQ(Count(box_.Queue(), kEventQueueCrash), 2u);
  ASSERT_TRUE(WaitUntil([&] { return !box_.Notices().empty(); }));
  // ...but it is owed, and written before the daemon stops.
  EXPECT_EQ(daemon->Stop(SIGTERM), 0);
  EXPECT_EQ(Count(box_.Queue(), kEventQueueCrash), 3u) << daemon->Log();
  const auto notices = box_.Notices();
  ASSERT_EQ(notices.size(), 1u);
  EXPECT_EQ(notices[0], "-c CORV.Lumex.Application @administrators app:displayname error:inotify_overflow");
}

TEST_F(NotifydTest, RunningOutOfWatchesMarksTheShareAndSaysHowToFixIt) {
  auto daemon = box_.Start({{"CORVNOTIFYD_TEST_WATCH_LIMIT", "3"}});
  fs::create_directories(box_.docs() + "/a/b/c/d");
  ASSERT_TRUE(WaitUntil([&] { return Count(box_.Queue(), kEventQueueCrash) == 2; })) << daemon->Log();
  EXPECT_NE(daemon->Log().find("sysctl -w fs.inotify.max_user_watches="), std::string::npos) << daemon->Log();
  ASSERT_TRUE(WaitUntil([&] { return !box_.Notices().empty(); }));
  EXPECT_EQ(box_.Notices()[0], "-c CORV.Lumex.Application @administrators app:displayname error:inotify_watch_limit");
  EXPECT_EQ(daemon->Stop(SIGTERM), 0);
}

TEST_F(NotifydTest, EveryStartMarksEachWatchedShareForACheckAgainstTheDisk) {
  const std::string other_share = box_.volume() + "/other";
  const std::string other_queue = other_share + "/@eaDir/fileindex.queue";
  const std::string bare_queue = box_.volume() + "/bare/@eaDir/fileindex.queue";
  fs::create_directories(other_share + "/pics");
  fs::create_directories(box_.volume() + "/bare");
  box_.WriteConfig("fileindex@other.json", other_queue, {other_share + "/pics"});
  std::ofstream(box_.config_dir() + "/fileindex@bare.json") << "{\"queue\": \"" << bare_queue << "\", \"config\": null}\n";
  const QueueLine share_marker = Line(kEventQueueCrash, box_.share(), true);
  // Not a registered share: its first folder stands for it.
  const QueueLine other_marker = Line(kEventQueueCrash, other_share + "/pics", true);
  EXPECT_EQ(platform::ProbeNotifier(box_.config_dir()), platform::NotifierState::kNotRunning);

  // A clean stop, a kill -9: whatever changed meanwhile went unseen, so each
  // start asks for a check of each watched share, ahead of every later line.
  for (const int stop_signal : {SIGTERM, SIGKILL}) {
    const size_t before = Count(box_.Queue(), kEventQueueCrash);
    auto daemon = box_.Start();
    EXPECT_EQ(platform::ProbeNotifier(box_.config_dir()), platform::NotifierState::kRunning);
    const std::string sync = box_.docs() + "/sync" + std::to_string(stop_signal);
    ASSERT_TRUE(box_.Sync(sync)) << ReadFileText(box_.log_path());
    const auto lines = box_.Queue();
    EXPECT_EQ(Count(lines, kEventQueueCrash), before + 1);
    ASSERT_GE(lines.size(), 2u);
    EXPECT_EQ(lines[lines.size() - 2], share_marker);
    EXPECT_EQ(lines.back(), Line(kEventCreate, sync, true));
    EXPECT_EQ(ReadQueue(other_queue).back(), other_marker);
    EXPECT_FALSE(fs::exists(bare_queue)) << "nothing is watched for a share without folders";
    daemon->Stop(stop_signal);
    EXPECT_EQ(platform::ProbeNotifier(box_.config_dir()), platform::NotifierState::kNotRunning);
  }
  EXPECT_EQ(Count(ReadQueue(other_queue), kEventQueueCrash), 2u);
}

// Sets fs.inotify.max_queued_events for the life of the object (root only).
class QueueLimitChange {
 public:
  explicit QueueLimitChange(long value) : old_(KernelQueueLimit()) { ok_ = Write(value); }
  ~QueueLimitChange() {
    if (ok_) Write(old_);
  }
  bool ok() const { return ok_; }

 private:
  static bool Write(long value) {
    std::ofstream out("/proc/sys/fs/inotify/max_queued_events");
    out << value << "\n";
    out.flush();
    return static_cast<bool>(out);
  }
  long old_;
  bool ok_ = false;
};

TEST_F(NotifydTest, OverflowAdviceQuotesTheQueueLengthInForceNotALaterSetting) {
  const long in_force = KernelQueueLimit();
  if (in_force <= 0 || in_force > 200000) GTEST_SKIP() << "kernel queue limit unusable: " << in_force;
  if (geteuid() != 0) GTEST_SKIP() << "changing fs.inotify.max_queued_events needs root";
  const std::string pause = box_.root() + "/pause";
  auto daemon = box_.Start({{"CORVNOTIFYD_TEST_PAUSE_FILE", pause}});
  // Raised after the notifier made its inotify instance: the kernel keeps
  // the old length for that instance, so that is what overflows.
  QueueLimitChange raised(in_force + 1);
  if (!raised.ok()) GTEST_SKIP() << "cannot write /proc/sys/fs/inotify/max_queued_events here";
  ASSERT_NO_FATAL_FAILURE(Overflow(box_, pause, box_.docs() + "/burst"));
  ASSERT_TRUE(box_.WaitForLog("telling the administrators")) << daemon->Log();
  const std::string log = daemon->Log();
  EXPECT_NE(log.find("overflowed at fs.inotify.max_queued_events=" + std::to_string(in_force) + ","),
            std::string::npos) << log;
  EXPECT_NE(log.find("raised to " + std::to_string(in_force + 1) + " since"), std::string::npos) << log;
  EXPECT_NE(log.find("restarted"), std::string::npos) << log;
  EXPECT_EQ(log.find("max_queued_events=" + std::to_string(in_force + 1)), std::string::npos) << log;
  EXPECT_EQ(daemon->Stop(SIGTERM), 0);
}

TEST_F(NotifydTest, LogLinesInAFileCarryTheirTimeUnlessTheJournalStampsThem) {
  const std::regex stamped(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{3}[+-]\d\d:\d\d corvnotifyd: \S.*)");
  EXPECT_EQ(box_.Start()->Stop(SIGTERM), 0);
  std::vector<std::string> lines = TextLines(box_.log_path());
  EXPECT_GE(lines.size(), 3u);
  for (const std::string& line : lines) EXPECT_TRUE(std::regex_match(line, stamped)) << line;

  // Standard error into systemd's journal, which stamps each line itself.
  ASSERT_EQ(unlink(box_.log_path().c_str()), 0);
  Touch(box_.log_path());
  struct stat st;
  ASSERT_EQ(stat(box_.log_path().c_str(), &st), 0);
  const std::string journal = std::to_string(st.st_dev) + ":" + std::to_string(st.st_ino);
  EXPECT_EQ(box_.Start({{"JOURNAL_STREAM", journal}})->Stop(SIGTERM), 0);
  lines = TextLines(box_.log_path());
  EXPECT_GE(lines.size(), 3u);
  for (const std::string& line : lines) EXPECT_EQ(line.rfind("corvnotifyd: ", 0), 0u) << line;
}

TEST_F(NotifydTest, BadCommandLineIsRefused) {
  EXPECT_EQ(box_.Run({"--bogus"})->Wait(), 2);
  EXPECT_NE(ReadFileText(box_.log_path()).find("unknown option: --bogus"), std::string::npos);
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
