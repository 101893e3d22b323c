// The real corvnotifyd, watching a sandbox share: what lands in the queue
// for each kind of change a user makes, and what it logs and tells the
// administrators when events are lost.
#include <fcntl.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <memory>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "common/json_util.h"
#include "fileindex/queue/event.h"
#include "platform/linux/notifier_presence.h"
#include "tests/support/queue_line.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace testing_support {
namespace {

// The queue line bits: kEventCreate and the others.
using namespace fileindex;  // NOLINT
using queue_testing::Line;
namespace fs = std::filesystem;
constexpr size_t npos = std::string::npos;

std::vector<std::string> TextLines(const std::string& path) {
  std::vector<std::string> lines;
  std::istringstream in(ReadFileText(path));
  for (std::string line; std::getline(in, line);) lines.push_back(line);
  return lines;
}

size_t CountOccurrences(const std::string& text, const std::string& needle) {
  size_t count = 0;
  for (size_t at = text.find(needle); at != npos; at = text.find(needle, at + 1)) ++count;
  return count;
}

// The queue lines whose path or old path starts with `prefix`.
std::vector<std::string> About(const std::vector<std::string>& lines, const std::string& prefix) {
  std::vector<std::string> out;
  for (const std::string& line : lines) {
    if (line.find("path\":\"" + prefix) != npos) out.push_back(line);
  }
  return out;
}

size_t Count(const std::vector<std::string>& lines, uint32_t event) {
  const std::string start = "{\"event\":" + std::to_string(event) + ",";
  return std::count_if(lines.begin(), lines.end(), [&](const std::string& l) { return l.rfind(start, 0) == 0; });
}

bool WaitUntil(const std::function<bool()>& condition) {
  return PollUntil(condition, std::chrono::milliseconds(15000), std::chrono::milliseconds(2));
}

void Touch(const std::string& path) { close(open(path.c_str(), O_WRONLY | O_CREAT, 0644)); }

long KernelQueueLimit() { return std::atol(ReadFileText("/proc/sys/fs/inotify/max_queued_events").c_str()); }

// A sandbox with one share "share" holding the indexed folder "docs" (on
// tmpfs when there is one: file creation on a disk with discard can take
// milliseconds), its monitor-queue configuration and a stand-in notification
// tool.
class NotifydTest : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::create_directories(docs_);
    root_.registry().Add("share", share_);
    root_.InstallNoticeTool(root_.path() + "/notices.log");
    WriteConfig("fileindex@share.json", queue_, {docs_});
  }

  // Writes the configuration file `name` for `queue` with these folders.
  void WriteConfig(const std::string& name, const std::string& queue, const std::vector<std::string>& folders) {
    Json::Value config;
    config["queue"] = queue;
    config["application"] = "fileindex";
    config["type"] = 1;
    for (const std::string& folder : folders) {
      Json::Value entry;
      entry["path"] = folder;
      entry["mask"] = 65478;
      entry["ignore"].append("@eaDir");
      config["config"].append(entry);
    }
    root_.MakeDir(config_dir_);
    ASSERT_TRUE(JsonToFile(config, config_dir_ + "/" + name));
  }
  std::unique_ptr<ChildProcess> Run(const std::vector<std::string>& args = {"--foreground"},
                                    const std::map<std::string, std::string>& env = {}) const {
    return std::make_unique<ChildProcess>(ProgramPath("corvnotifyd"), args, log_, env);
  }
  // Starts the daemon and waits until its watches are in place (the log is
  // appended to: an earlier run's line does not count).
  std::unique_ptr<ChildProcess> Start(const std::map<std::string, std::string>& env = {}) const {
    const auto runs = [this] { return CountOccurrences(ReadFileText(log_), "watching as configured"); };
    const size_t before = runs();
    auto process = Run({"--foreground"}, env);
    EXPECT_TRUE(WaitUntil([&] { return runs() > before; })) << process->Log();
    return process;
  }
  bool WaitForLog(const std::string& needle) const {
    return WaitUntil([&] { return ReadFileText(log_).find(needle) != npos; });
  }
  std::vector<std::string> Queue(const std::string& queue = "") const {
    return TextLines(queue.empty() ? queue_ : queue);
  }
  // Makes the folder `path` and waits until its create line is in `queue`:
  // every event before it has then been written too (a folder's create is
  // the only line it makes, so nothing of it trails behind).
  bool Sync(const std::string& path, const std::string& queue = "") const {
    mkdir(path.c_str(), 0755);
    return WaitUntil([&] {
      const auto lines = Queue(queue);
      return std::find(lines.begin(), lines.end(), Line(kEventCreate, path, true)) != lines.end();
    });
  }
  // Stops the daemon's reader, makes more events than the kernel holds, lets
  // the reader go on.
  void Overflow(const std::string& pause_file, const std::string& dir) const {
    fs::create_directories(dir);
    ASSERT_TRUE(Sync(dir + "/watched"));
    Touch(pause_file);
    ASSERT_TRUE(WaitUntil([&] { return access((pause_file + ".paused").c_str(), F_OK) == 0; }));
    // Each new file is a create and a close-after-write.
    const long files = KernelQueueLimit() / 2 + 1000;
    for (long i = 0; i < files; ++i) Touch(dir + "/f" + std::to_string(i));
    unlink(pause_file.c_str());
  }
  // Lines the stand-in notification tool received, one per run.
  std::vector<std::string> Notices() const { return TextLines(root_.path() + "/notices.log"); }

  Sandbox root_;
  const std::string volume_ = root_.TmpfsVolume();
  const std::string share_ = volume_ + "/share";
  const std::string docs_ = share_ + "/docs";
  const std::string queue_ = share_ + "/@eaDir/fileindex.queue";
  const std::string config_dir_ = root_.path() + "/etc/corvlumex/monitor.d";
  const std::string log_ = root_.path() + "/corvnotifyd.log";
};

void WriteFileInPieces(const std::string& path, size_t pieces, size_t piece_size) {
  const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  ASSERT_GE(fd, 0);
  const std::string piece(piece_size, 'x');
  for (size_t i = 0; i < pieces; ++i) ASSERT_EQ(write(fd, piece.data(), piece.size()), ssize_t(piece.size()));
  close(fd);
}

TEST_F(NotifydTest, ChangesOfFilesAndOfTheConfigurationAreWrittenEvenAtAStop) {
  EXPECT_EQ(Run({"--bogus"})->Wait(), 2);
  EXPECT_NE(ReadFileText(log_).find("unknown option: --bogus"), npos);
  // Any local user can open the configuration folder and lock it: that must
  // not keep the notifier from starting.
  const int folder = open(config_dir_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  ASSERT_EQ(0, flock(folder, LOCK_EX | LOCK_NB));
  auto daemon = Start();
  close(folder);
  // A second notifier on the same configuration would write every line twice.
  auto second = Run();
  EXPECT_TRUE(WaitForLog("another corvnotifyd already watches as configured in"));
  EXPECT_EQ(second->Wait(), 1) << "refused: it ends by itself";

  const std::string a = docs_ + "/a.txt", b = docs_ + "/b.txt", big = docs_ + "/big.bin";
  WriteFileInPieces(a, 3, 10);  // three writes, one close: one modify
  chmod(a.c_str(), 0600);
  rename(a.c_str(), b.c_str());
  unlink(b.c_str());
  WriteFileInPieces(big, 256, 64 * 1024);  // 16 MiB in 256 writes
  ASSERT_TRUE(Sync(docs_ + "/sync"));
  // The start marker first: nobody saw what changed before the notifier ran.
  const std::vector<std::string> expected = {
      Line(kEventQueueCrash, share_, true), Line(kEventCreate, a), Line(kEventModify, a), Line(kEventAttr, a),
      Line(kEventRename, b, false, a),      Line(kEventDelete, b), Line(kEventCreate, big),
      Line(kEventModify, big),              Line(kEventCreate, docs_ + "/sync", true)};
  EXPECT_EQ(Queue(), expected);

  // Folders and queues added to the configuration are watched; removed, not.
  const std::string music = share_ + "/music", other = volume_ + "/other";
  const std::string other_queue = other + "/@eaDir/fileindex.queue";
  fs::create_directories(music);
  fs::create_directories(other + "/pics");
  WriteConfig("fileindex@share.json", queue_, {docs_, music});
  WriteConfig("fileindex@other.json", other_queue, {other + "/pics"});
  ASSERT_TRUE(WaitForLog("2 queues, 3 folders")) << daemon->Log();
  ASSERT_TRUE(Sync(music + "/one"));
  ASSERT_TRUE(Sync(other + "/pics/p1", other_queue));
  WriteConfig("fileindex@share.json", queue_, {docs_});
  unlink((config_dir_ + "/fileindex@other.json").c_str());
  ASSERT_TRUE(WaitUntil([&] { return CountOccurrences(daemon->Log(), "1 queues, 1 folders") >= 2; })) << daemon->Log();
  Touch(music + "/two");
  Touch(other + "/pics/p2");
  ASSERT_TRUE(Sync(docs_ + "/sync2"));
  EXPECT_TRUE(About(Queue(), music + "/two").empty());
  EXPECT_TRUE(About(Queue(other_queue), other + "/pics/p2").empty());
  // A share without folders keeps its file with "config" null: nothing watched.
  std::ofstream(config_dir_ + "/fileindex@share.json") << "{\"queue\": \"" << queue_ << "\", \"config\": null}\n";
  ASSERT_TRUE(WaitForLog("1 queues, 0 folders"));
  WriteConfig("fileindex@share.json", queue_, {docs_});
  ASSERT_TRUE(WaitUntil([&] { return CountOccurrences(daemon->Log(), "1 queues, 1 folders") >= 3; }));

  // A stop writes everything that already happened.
  fs::create_directories(docs_ + "/many");
  ASSERT_TRUE(Sync(docs_ + "/sync3"));
  for (int i = 0; i < 3000; ++i) Touch(docs_ + "/many/f" + std::to_string(i));
  EXPECT_EQ(daemon->Stop(SIGTERM), 0);
  const auto lines = About(Queue(), docs_ + "/many/");
  EXPECT_EQ(Count(lines, kEventCreate), 3000u);
  EXPECT_EQ(Count(lines, kEventModify), 3000u);
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

TEST_F(NotifydTest, OverflowWritesOneCrashMarkerPerBackOffWindowAndQuotesTheLimitInForce) {
  const long in_force = KernelQueueLimit();
  if (in_force <= 0 || in_force > 200000) GTEST_SKIP() << "kernel queue limit unusable: " << in_force;
  const std::string pause = root_.path() + "/pause";
  auto daemon = Start({{"CORVNOTIFYD_TEST_PAUSE_FILE", pause}, {"CORVNOTIFYD_TEST_BACKOFF_MS", "600000"}});
  // Raised (as root) after the notifier made its inotify instance: the kernel
  // keeps the old length for that instance, so that is what overflows.
  QueueLimitChange raised(in_force + 1);
  // One marker is there from the start (see EveryStartMarksEachWatchedShare...).
  ASSERT_EQ(Count(Queue(), kEventQueueCrash), 1u);
  ASSERT_NO_FATAL_FAILURE(Overflow(pause, docs_ + "/burst1"));
  ASSERT_TRUE(WaitUntil([&] { return Count(Queue(), kEventQueueCrash) >= 2; })) << daemon->Log();
  ASSERT_TRUE(Sync(docs_ + "/sync1"));
  EXPECT_EQ(Queue().back(), Line(kEventCreate, docs_ + "/sync1", true));
  ASSERT_TRUE(WaitForLog("telling the administrators")) << daemon->Log();
  const std::string log = daemon->Log();
  EXPECT_NE(log.find("overflowed at fs.inotify.max_queued_events=" + std::to_string(in_force) + ","), npos) << log;
  if (raised.ok()) {
    EXPECT_NE(log.find("raised to " + std::to_string(in_force + 1) + " since"), npos) << log;
    EXPECT_NE(log.find("restarted"), npos) << log;
    EXPECT_EQ(log.find("max_queued_events=" + std::to_string(in_force + 1)), npos) << log;
  } else {
    EXPECT_NE(log.find("sysctl -w fs.inotify.max_queued_events="), npos) << log;
  }

  // A second overflow inside the back-off window: no second marker yet.
  ASSERT_NO_FATAL_FAILURE(Overflow(pause, docs_ + "/burst2"));
  ASSERT_TRUE(WaitForLog("lost again inside its back-off window")) << daemon->Log();
  ASSERT_TRUE(Sync(docs_ + "/sync2")) << daemon->Log();
  EXPECT_EQ(Count(Queue(), kEventQueueCrash), 2u);
  ASSERT_TRUE(WaitUntil([&] { return !Notices().empty(); }));
  // ...but it is owed, and written before the daemon stops.
  EXPECT_EQ(daemon->Stop(SIGTERM), 0);
  EXPECT_EQ(Count(Queue(), kEventQueueCrash), 3u) << daemon->Log();
  EXPECT_EQ(Notices(), std::vector<std::string>{
                           "-c CORV.Lumex.Application @administrators app:displayname error:inotify_overflow"});
}

TEST_F(NotifydTest, RunningOutOfWatchesMarksTheShareAndSaysHowToFixIt) {
  auto daemon = Start({{"CORVNOTIFYD_TEST_WATCH_LIMIT", "3"}});
  fs::create_directories(docs_ + "/a/b/c/d");
  ASSERT_TRUE(WaitUntil([&] { return Count(Queue(), kEventQueueCrash) == 2; })) << daemon->Log();
  EXPECT_NE(daemon->Log().find("sysctl -w fs.inotify.max_user_watches="), npos) << daemon->Log();
  ASSERT_TRUE(WaitUntil([&] { return !Notices().empty(); }));
  EXPECT_EQ(Notices()[0], "-c CORV.Lumex.Application @administrators app:displayname error:inotify_watch_limit");
  EXPECT_EQ(daemon->Stop(SIGTERM), 0);
}

// A clean stop, a kill -9: whatever changed meanwhile went unseen, so each
// start asks for a check of each watched share, ahead of every later line.
// Log lines in a file carry their time, unless the journal stamps them.
TEST_F(NotifydTest, EveryStartMarksEachWatchedShareForACheckAgainstTheDisk) {
  const std::string other = volume_ + "/other";
  const std::string other_queue = other + "/@eaDir/fileindex.queue";
  const std::string bare_queue = volume_ + "/bare/@eaDir/fileindex.queue";
  fs::create_directories(other + "/pics");
  fs::create_directories(volume_ + "/bare");
  WriteConfig("fileindex@other.json", other_queue, {other + "/pics"});
  std::ofstream(config_dir_ + "/fileindex@bare.json") << "{\"queue\": \"" << bare_queue << "\", \"config\": null}\n";
  EXPECT_EQ(platform::ProbeNotifier(config_dir_), platform::NotifierState::kNotRunning);
  const std::regex stamped(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{3}[+-]\d\d:\d\d corvnotifyd: \S.*)");

  for (const bool journal : {true, false}) {
    // Standard error into systemd's journal, which stamps each line itself.
    unlink(log_.c_str());
    Touch(log_);
    struct stat st;
    ASSERT_EQ(stat(log_.c_str(), &st), 0);
    std::map<std::string, std::string> env;
    if (journal) env["JOURNAL_STREAM"] = std::to_string(st.st_dev) + ":" + std::to_string(st.st_ino);
    const size_t before = Count(Queue(), kEventQueueCrash);
    auto daemon = Start(env);
    EXPECT_EQ(platform::ProbeNotifier(config_dir_), platform::NotifierState::kRunning);
    const std::string sync = docs_ + "/sync" + std::to_string(journal);
    ASSERT_TRUE(Sync(sync)) << ReadFileText(log_);
    const auto lines = Queue();
    EXPECT_EQ(Count(lines, kEventQueueCrash), before + 1);
    ASSERT_GE(lines.size(), 2u);
    EXPECT_EQ(lines[lines.size() - 2], Line(kEventQueueCrash, share_, true));
    EXPECT_EQ(lines.back(), Line(kEventCreate, sync, true));
    // Not a registered share: its first folder stands for it.
    EXPECT_EQ(Queue(other_queue).back(), Line(kEventQueueCrash, other + "/pics", true));
    EXPECT_FALSE(fs::exists(bare_queue)) << "nothing is watched for a share without folders";
    daemon->Stop(journal ? SIGTERM : SIGKILL);
    EXPECT_EQ(platform::ProbeNotifier(config_dir_), platform::NotifierState::kNotRunning);
    const std::vector<std::string> logged = TextLines(log_);
    EXPECT_GE(logged.size(), 3u);
    for (const std::string& line : logged) {
      EXPECT_TRUE(journal ? line.rfind("corvnotifyd: ", 0) == 0 : std::regex_match(line, stamped)) << line;
    }
  }
  EXPECT_EQ(Count(Queue(other_queue), kEventQueueCrash), 2u);
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
