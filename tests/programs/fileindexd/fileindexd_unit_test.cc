// The parts of fileindexd on their own: the settle tracker, the indexing
// rules, the folder walk, the command answers and the progress board.
#include <gtest/gtest.h>
#include <grp.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <stdexcept>
#include <thread>

#include "common/error.h"
#include "common/file_util.h"
#include "common/frame_reader.h"
#include "common/json_util.h"
#include "fileindex/state/folder_mgr.h"
#include "programs/fileindexd/batch_mark.h"
#include "programs/fileindexd/command_server.h"
#include "programs/fileindexd/folder_walker.h"
#include "programs/fileindexd/index_rules.h"
#include "programs/fileindexd/progress.h"
#include "programs/fileindexd/settle_tracker.h"
#include "programs/fileindexd/suggestion_schedule.h"
#include "tests/support/child_process.h"
#include "tests/support/frame_client.h"
#include "tests/support/log_capture.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindexd {
namespace {
namespace fs = std::filesystem;
using testing_support::Sandbox;
using std::chrono::milliseconds;
using Clock = SettleTracker::Clock;

SettleOptions Options() {
  SettleOptions options;
  options.initial = milliseconds(1000);
  options.ceiling = milliseconds(3000);
  return options;
}

class SettleTrackerTest : public ::testing::Test {
 protected:
  Sandbox root_;
  const std::string state_ = root_.path() + "/q.settle";
  SettleTracker tracker{state_, Options()};
  const Clock::time_point t0 = Clock::now();
};

TEST_F(SettleTrackerTest, ThirdChangeWithinTheIntervalWaitsAndTheIntervalGrows) {
  EXPECT_TRUE(tracker.Admit("/v/s/log", t0));                    // the create
  EXPECT_TRUE(tracker.Admit("/v/s/log", t0 + milliseconds(10)));  // its first write
  EXPECT_FALSE(tracker.Admit("/v/s/log", t0 + milliseconds(20)));
  EXPECT_FALSE(tracker.Admit("/v/s/log", t0 + milliseconds(30)));  // already waiting
  EXPECT_EQ(tracker.DeferredCount(), 1u);
  EXPECT_TRUE(tracker.DueNow(t0 + milliseconds(500)).empty());
  // Due one interval after the last extraction.
  EXPECT_EQ(tracker.NextDue(), t0 + milliseconds(10) + milliseconds(1000));
  const auto due = tracker.DueNow(t0 + milliseconds(1010));
  ASSERT_EQ(due, std::vector<std::string>{"/v/s/log"});
  tracker.Confirm(due, t0 + milliseconds(1010));
  EXPECT_EQ(tracker.DeferredCount(), 0u);
  // Still noisy: the next change within the (now doubled) interval waits 2 s.
  EXPECT_FALSE(tracker.Admit("/v/s/log", t0 + milliseconds(1100)));
  EXPECT_EQ(tracker.NextDue(), t0 + milliseconds(1010) + milliseconds(2000));
}

TEST_F(SettleTrackerTest, QuietFilesStartOverAndForgottenFilesLeave) {
  tracker.Admit("/a", t0);
  tracker.Admit("/a", t0);
  EXPECT_FALSE(tracker.Admit("/a", t0));
  tracker.Forget("/a");
  EXPECT_EQ(tracker.DeferredCount(), 0u);
  EXPECT_EQ(tracker.NextDue(), Clock::time_point::max());
  EXPECT_TRUE(tracker.Admit("/b", t0));
  EXPECT_TRUE(tracker.Admit("/b", t0 + milliseconds(1)));
  // Quiet for twice its interval: admitted at once, twice again.
  EXPECT_TRUE(tracker.Admit("/b", t0 + milliseconds(2100)));
  EXPECT_TRUE(tracker.Admit("/b", t0 + milliseconds(2101)));
}

TEST_F(SettleTrackerTest, DeferredFilesSurviveARestart) {
  for (int i = 0; i < 3; ++i) tracker.Admit("/v/s/a b\"c", t0);
  ASSERT_TRUE(tracker.Save());
  SettleTracker restarted(state_, Options());
  restarted.Load();
  const auto due = restarted.DueNow(Clock::now());
  ASSERT_EQ(due, std::vector<std::string>{"/v/s/a b\"c"});
  restarted.Confirm(due, Clock::now());
  ASSERT_TRUE(restarted.Save());
  EXPECT_FALSE(IsFileExist(state_));  // nothing deferred: no file
}

TEST_F(SettleTrackerTest, AnUnreadableStateFileIsIgnoredWithALogLine) {
  testing_support::LogCapture log;
  root_.WriteFile("q.settle", "{not json");
  tracker.Load();
  EXPECT_EQ(tracker.DeferredCount(), 0u);
  EXPECT_EQ(log.Matching("unreadable list of deferred files").size(), 1u);
}

class IndexRulesTest : public ::testing::Test {
 protected:
  void SetUp() override {
    share_ = root_.MakeDir("volume1/share");
    root_.registry().Add("share", share_);
  }
  void Folders(const std::string& text) { root_.WriteFile("var/packages/CorvLumex/etc/fileindex.folders", text); }

  Sandbox root_;
  std::string share_;
};

TEST_F(IndexRulesTest, CategoriesOfTheGoverningFolderDecide) {
  Folders(R"([{"path": "/share/docs", "name": "docs", "document": false, "audio": true, "video": true, "photo": true},
              {"path": "/share/docs/papers", "name": "papers", "document": true, "audio": false, "video": false, "photo": false}])");
  const fileindex::FolderMgr folders;
  const IndexRules rules(folders, share_);
  EXPECT_FALSE(rules.Judge(share_ + "/docs/a.txt", false).index);
  EXPECT_TRUE(rules.Judge(share_ + "/docs/papers/a.txt", false).index);  // the nearest folder governs
  EXPECT_FALSE(rules.Judge(share_ + "/docs/papers/song.mp3", false).index);
  const Verdict song = rules.Judge(share_ + "/docs/song.mp3", false);
  EXPECT_TRUE(song.index);
  EXPECT_TRUE(song.need_meta);
  const Verdict code = rules.Judge(share_ + "/docs/main.c", false);  // no category: always, without metadata
  EXPECT_TRUE(code.index);
  EXPECT_FALSE(code.need_meta);
  EXPECT_TRUE(rules.Judge(share_ + "/docs/sub.txt", true).index);  // a folder whatever its name
  EXPECT_FALSE(rules.Judge(share_ + "/other/main.c", false).index);
  EXPECT_FALSE(rules.Judge(share_ + "/docsx/main.c", false).index);
}

TEST_F(IndexRulesTest, PreservedNamesBinsAndSnapshotsAreNeverIndexed) {
  Folders(R"([{"path": "/share", "name": "share", "document": true, "audio": true, "video": true, "photo": true}])");
  fs::create_directories(share_ + "/#snapshot/daily");
  const fileindex::FolderMgr folders;
  const IndexRules rules(folders, share_);
  for (const char* path : {"/a/.DS_Store", "/.TemporaryItems/x.txt", "/@eaDir/fileindex.queue", "/a/@tmp",
                           "/#recycle/old.txt", "/#snapshot/daily/a.txt"}) {
    EXPECT_TRUE(rules.IsExcluded(share_ + path)) << path;
    EXPECT_FALSE(rules.Judge(share_ + path, false).index) << path;
  }
  for (const char* path : {"/a/.ds_store", "/a/#recycled.txt", "/a/eaDir/x", "/notes/#snapshot.txt"}) {
    EXPECT_FALSE(rules.IsExcluded(share_ + path)) << path;
  }
}

TEST(FolderWalkerTest, ListsTheTreeWithoutEnteringLinksOrExcludedFolders) {
  Sandbox root;
  const std::string top = root.MakeDir("top");
  root.MakeDir("top/a/b");
  root.MakeDir("top/@eaDir");
  root.MakeDir("top/skip/inner");
  root.WriteFile("top/a/b/f.txt", "x");
  root.WriteFile("top/@eaDir/q", "x");
  root.WriteFile("top/skip/inner/g", "x");
  ASSERT_EQ(symlink((top + "/a").c_str(), (top + "/link").c_str()), 0);
  std::vector<std::string> listed;
  for (const DiskEntry& entry : WalkFolder(top, [&](const std::string& dir) { return dir == top + "/skip"; })) {
    listed.push_back(entry.path + (entry.is_dir ? "/" : ""));
  }
  std::sort(listed.begin(), listed.end());
  EXPECT_EQ(listed, (std::vector<std::string>{top + "/", top + "/a/", top + "/a/b/", top + "/a/b/f.txt", top + "/link",
                                              top + "/skip/"}));
  EXPECT_TRUE(WalkFolder(top + "/missing").empty());
  ASSERT_EQ(WalkFolder(top + "/a/b/f.txt").size(), 1u);  // a file is its own walk
}

// The command socket served for real on a private socket, with limits a
// loaded test machine cannot reach by accident.
class CommandSocketTest : public ::testing::Test {
 protected:
  void SetUp() override {
    CommandLimits limits;
    limits.request_timeout_ms = 60000;
    limits.max_connections = 8;
    server_ = std::make_unique<CommandServer>(
        socket_, [this](const std::string& type, const Json::Value& data) {
          seen_.push_back(type);
          if (type == "boom") throw std::logic_error("not a library error");
          if (type == "noshare") throw Error(kErrorShareNotFound, "no share");
          if (type != "status" && type != "pause") throw Error(kErrorBadArgument, "Unknown command: " + type);
          Json::Value out(Json::objectValue);
          out["echo"] = data;
          return out;
        },
        [](const std::string& type) { return type == "status"; }, limits);
    server_->Listen();
    thread_ = std::thread([this] { server_->Run(); });
  }
  void TearDown() override {
    server_->Stop();
    thread_.join();
  }
  // The answer's error code; 0 for success, -1 for no answer.
  int CodeOf(const std::string& bytes) {
    Json::Value answer;
    if (!JsonFromString(answer, testing_support::SendRaw(socket_, bytes))) return -1;
    return answer["success"].asBool() ? 0 : answer["error"]["code"].asInt();
  }

  Sandbox root_;
  std::string socket_ = root_.path() + "/fileindexd.sock";
  std::unique_ptr<CommandServer> server_;
  std::thread thread_;
  std::vector<std::string> seen_;  // the types that reached the handler
};

TEST_F(CommandSocketTest, HostileFramesAreAnsweredAndNoClientHoldsUpAnother) {
  using testing_support::Frame;
  const std::string status = Frame(R"({"type": "status"})");
  const uint32_t huge = 0xFFFFFFF0u;
  const struct {
    const char* what;
    std::string bytes;
    int code;
  } cases[] = {
      {"arrays nested past the JSON reader's limit", Frame(std::string(1001, '[') + std::string(1001, ']')), 120},
      {"a length of 4 GiB", std::string(reinterpret_cast<const char*>(&huge), 4), 120},
      {"an empty frame", std::string(4, '\0'), 120},
      {"a type that is an array", Frame(R"({"type": ["status"]})"), 120},
      {"not UTF-8", Frame("{\"type\": \"\xff\xfe\"}"), 120},
      {"a handler that throws something else than an Error", Frame(R"({"type": "boom"})"), 9999},
      // More than a socket buffer holds: it never arrives whole before it is read.
      {"a request of 600 KB", Frame(R"({"type": "status", "data": ")" + std::string(600000, 'x') + R"("})"), 0},
      {"a frame cut short", status.substr(0, 7), -1},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(CodeOf(c.bytes), c.code) << c.what;
    EXPECT_EQ(CodeOf(status), 0) << "after " << c.what;
  }
  // Clients that send nothing or half a request hold only their own connection:
  // the others are answered meanwhile, and so are they once they finish.
  std::vector<int> slow;
  for (int i = 0; i < 4; ++i) {
    slow.push_back(testing_support::ConnectTo(socket_));
    ASSERT_GE(slow.back(), 0);
  }
  ASSERT_EQ(write(slow[0], status.data(), 6), 6);
  EXPECT_EQ(CodeOf(status), 0);
  ASSERT_EQ(write(slow[0], status.data() + 6, status.size() - 6), static_cast<ssize_t>(status.size() - 6));
  std::string answer;
  EXPECT_EQ(ReadFrameBounded(slow[0], 1u << 20, 20000, 20000, &answer), FrameStatus::kOk);
  EXPECT_NE(answer.find("\"success\":true"), std::string::npos) << answer;
  for (const int fd : slow) close(fd);
}

TEST_F(CommandSocketTest, AnotherUserCannotTakeEveryConnection) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to connect as another user";
  chmod(root_.path().c_str(), 0755);
  const std::string status = testing_support::Frame(R"({"type": "status"})");
  int told[2], done[2];
  ASSERT_EQ(0, pipe(told));
  ASSERT_EQ(0, pipe(done));
  const pid_t child = fork();
  if (child == 0) {
    // As nobody: its own share of connections held open, and one more.
    close(told[0]);
    close(done[1]);
    if (setgroups(0, nullptr) != 0 || setgid(65534) != 0 || setuid(65534) != 0) _exit(3);
    std::vector<int> held;
    for (int i = 0; i < 8; ++i) held.push_back(testing_support::ConnectTo(socket_));
    std::string refused;
    try {
      refused = testing_support::SendRaw(socket_, status);
    } catch (const std::exception& error) {
      refused = error.what();
    }
    if (write(told[1], refused.data(), refused.size()) < 0) _exit(4);
    close(told[1]);
    char byte;
    if (read(done[0], &byte, 1) < 0) _exit(5);
    _exit(0);
  }
  close(told[1]);
  close(done[0]);
  std::string refused;
  char buffer[4096];
  for (ssize_t n; (n = read(told[0], buffer, sizeof(buffer))) > 0;) refused.append(buffer, static_cast<size_t>(n));
  EXPECT_NE(refused.find("try again later"), std::string::npos) << refused;
  // Root is served meanwhile.
  EXPECT_EQ(CodeOf(status), 0);
  close(done[1]);
  close(told[0]);
  waitpid(child, nullptr, 0);
}

// Answers carry the code and the reason; a command that changes something
// is refused to other users and never reaches the handler.
TEST_F(CommandSocketTest, AnswersCarryTheCodeAndRefuseChangesFromOtherUsers) {
  const struct {
    const char* request;
    uid_t uid;
    const char* answer;
  } cases[] = {
      {R"({"type": "pause", "data": {"resume_time": 0}})", 0,
       R"({"success": true, "data": {"echo": {"resume_time": 0}}})"},
      {R"({"type": "noshare"})", 0, R"({"success": false, "error": {"code": 800, "msg": "no share"}})"},
      {"not json", 0,
       R"({"success": false, "error": {"code": 120,
           "msg": "The request must be a JSON object with a string \"type\""}})"},
      {R"({"type": "resume"})", 4242,
       R"({"success": false, "error": {"code": 120,
           "msg": "\"resume\" is allowed to root and the daemon's user only"}})"},
      {R"({"type": "status"})", 4242, R"({"success": true, "data": {"echo": null}})"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(testing_support::JsonOf(server_->Answer(c.request, c.uid)), testing_support::JsonOf(c.answer))
        << c.request;
  }
  EXPECT_EQ(std::count(seen_.begin(), seen_.end(), "resume"), 0);
}

// How far a batch got is trusted only for the very file it was saved for.
TEST(BatchMarkTest, ACountHoldsForItsOwnBatchFileOnly) {
  Sandbox root;
  const std::string batch = root.WriteFile("queue.tmp", "line 1\nline 2\n");
  const BatchMark mark(batch);
  EXPECT_EQ(mark.Load(), 0u);  // none saved
  ASSERT_TRUE(mark.Save(5));
  EXPECT_EQ(mark.Load(), 5u);
  const struct {
    const char* name;
    std::function<void()> change;
  } cases[] = {
      {"grown", [&] { std::ofstream(batch, std::ios::app) << "line 3\n"; }},
      {"replaced", [&] { root.WriteFile("queue.tmp", "another batch\n"); }},
      {"gone", [&] { unlink(batch.c_str()); }},
  };
  for (const auto& c : cases) {
    root.WriteFile("queue.tmp", "line 1\nline 2\n");
    ASSERT_TRUE(mark.Save(5));
    c.change();
    EXPECT_EQ(mark.Load(), 0u) << c.name;
  }
  root.WriteFile("queue.tmp", "line 1\nline 2\n");
  ASSERT_TRUE(mark.Save(2));
  mark.Clear();
  EXPECT_EQ(mark.Load(), 0u);
  EXPECT_FALSE(IsFileExist(batch + ".applied"));
}

// The administrators' list of files that could not be indexed keeps the
// latest ones only, so a share full of broken files cannot grow the daemon.
TEST(ProgressBoardTest, KeepsTheLatestFailedFilesWithTheirReasons) {
  ProgressBoard board;
  for (size_t i = 0; i < ProgressBoard::kKeptFailures + 5; ++i) {
    board.Failed("music", "/volume1/music/" + std::to_string(i) + ".mp3", "upsert: damaged");
  }
  const Json::Value snapshot = board.Snapshot()["music"];
  EXPECT_EQ(snapshot["total_failed"].asUInt64(), ProgressBoard::kKeptFailures + 5);
  ASSERT_EQ(snapshot["failed_files"].size(), ProgressBoard::kKeptFailures);
  EXPECT_EQ(snapshot["failed_files"][0]["path"].asString(), "/volume1/music/5.mp3");
  EXPECT_EQ(snapshot["failed_files"][static_cast<int>(ProgressBoard::kKeptFailures) - 1]["reason"].asString(), "upsert: damaged");
}

TEST(ProgressBoardTest, CountsPerShareAndResetsAtTheEndOfABatch) {
  ProgressBoard board;
  board.StartBatch("music", 10);
  board.Done("music", 4);
  board.AddTodo("music", 5);
  board.Failed("music", "/v/music/a.mp3");
  board.Failed("music", "/v/music/a.mp3");  // a retry of the same file
  board.Extracted("music");
  Json::Value snapshot = board.Snapshot();
  EXPECT_EQ(snapshot["music"]["state"].asString(), "indexing");
  EXPECT_EQ(snapshot["music"]["done"].asUInt64(), 4u);
  EXPECT_EQ(snapshot["music"]["todo"].asUInt64(), 15u);
  EXPECT_EQ(snapshot["music"]["total_failed"].asUInt64(), 1u);
  board.Done("music", 20);  // a walk that found more than announced
  EXPECT_EQ(board.Snapshot()["music"]["todo"].asUInt64(), 24u);
  board.EndBatch("music");
  snapshot = board.Snapshot();
  EXPECT_EQ(snapshot["music"]["state"].asString(), "idle");
  EXPECT_EQ(snapshot["music"]["done"].asUInt64(), 0u);
  EXPECT_EQ(snapshot["music"]["total_done"].asUInt64(), 24u);
  EXPECT_EQ(snapshot["music"]["eta_seconds"].asDouble(), -1.0);
  board.Remove("music");
  EXPECT_FALSE(board.Snapshot().isMember("music"));
}


TEST(SuggestionScheduleTest, AtMostOncePerIntervalWhileWorkingAndOnceAtRest) {
  using Clock = SuggestionSchedule::Clock;
  using std::chrono::minutes;
  SuggestionSchedule schedule(minutes(5));
  const Clock::time_point t0 = Clock::now();
  EXPECT_FALSE(schedule.DueAtRest());  // nothing indexed yet
  // A long round: commits every minute; a rebuild after 5 minutes, not before.
  const struct {
    int minute;
    bool due;
  } commits[] = {{0, false}, {1, false}, {4, false}, {5, true}, {6, false}, {9, false}, {10, true}};
  for (const auto& commit : commits) {
    const bool due = schedule.DueAfterWork(t0 + minutes(commit.minute));
    EXPECT_EQ(due, commit.due) << "minute " << commit.minute;
    if (due) schedule.Rebuilt(t0 + minutes(commit.minute));
  }
  EXPECT_FALSE(schedule.DueAtRest());  // the last commit's rebuild covers it
  EXPECT_FALSE(schedule.DueAfterWork(t0 + minutes(11)));
  EXPECT_TRUE(schedule.DueAtRest());  // the end of the round brings the last files in
  schedule.Rebuilt(t0 + minutes(11));
  EXPECT_FALSE(schedule.DueAtRest());  // and only once
}

}  // namespace
}  // namespace fileindexd
}  // namespace corvlumex
