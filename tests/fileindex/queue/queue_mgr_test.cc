#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <fstream>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json_util.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/optree.h"
#include "fileindex/queue/queue_mgr.h"
#include "tests/support/queue_line.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

// A queue line with its newline.
std::string Line(unsigned event, const std::string& path, const std::string& path_old = "", bool is_dir = false) {
  return queue_testing::Line(event, path, is_dir, path_old) + "\n";
}

class QueueMgrTest : public ::testing::Test {
 protected:
  QueueMgrTest() : queue_(sandbox_.root() + "/volume1/fileindex.queue"), tmp_(queue_ + ".tmp") {}
  void Write(const std::string& path, const std::string& text) { std::ofstream(path, std::ios::binary) << text; }
  void Append(const std::string& path, const std::string& text) {
    std::ofstream(path, std::ios::binary | std::ios::app) << text;
  }
  // Paths of the OPs handed out, and the count returned.
  std::pair<std::vector<std::string>, unsigned> Process(QueueMgr& mgr, bool use_tmp) {
    std::vector<std::string> paths;
    const unsigned count = mgr.ProcessOP([&paths](std::shared_ptr<OP> op) { paths.push_back(op->node_->GetPath()); },
                                         use_tmp);
    return {paths, count};
  }

  Sandbox sandbox_{true, Sandbox::kInstalled};
  SleepRecorder sleeps_;
  const std::string queue_;
  const std::string tmp_;
};

TEST_F(QueueMgrTest, NothingToProcessCreatesNothing) {
  QueueMgr mgr(queue_);
  EXPECT_EQ(Process(mgr, true).second, 0u);
  EXPECT_EQ(Process(mgr, false).second, 0u);
  EXPECT_FALSE(IsFileExist(queue_));
  EXPECT_FALSE(IsFileExist(tmp_));
  EXPECT_EQ(mgr.DeleteTmp(), -1);
}

TEST_F(QueueMgrTest, TakeOverRenamesAndTheCopyIsProcessedAndDeleted) {
  Write(queue_, Line(kEventCreate, "/v/s/a") + Line(kEventModify, "/v/s/a") + Line(kEventCreate, "/v/s/b"));
  QueueMgr mgr(queue_);
  const auto [paths, count] = Process(mgr, true);
  EXPECT_EQ(paths, (std::vector<std::string>{"/v/s/a", "/v/s/b"}));
  EXPECT_EQ(count, 2u);
  EXPECT_FALSE(IsFileExist(queue_));
  EXPECT_TRUE(IsFileExist(tmp_));
  EXPECT_EQ(mgr.DeleteTmp(), 0);
  EXPECT_FALSE(IsFileExist(tmp_));
}

TEST_F(QueueMgrTest, AnUnfinishedTakeOverIsProcessedFirstAndNeverJoined) {
  Write(tmp_, Line(kEventCreate, "/v/s/old"));
  Write(queue_, Line(kEventCreate, "/v/s/new"));
  QueueMgr mgr(queue_);
  EXPECT_EQ(Process(mgr, true).first, std::vector<std::string>{"/v/s/old"});
  std::ifstream live(queue_);
  std::string line;
  ASSERT_TRUE(std::getline(live, line));
  EXPECT_EQ(line + "\n", Line(kEventCreate, "/v/s/new"));
  EXPECT_FALSE(std::getline(live, line));
  EXPECT_EQ(Process(mgr, false).first, std::vector<std::string>{"/v/s/new"});
}

TEST_F(QueueMgrTest, TreesAreBuiltOnce) {
  Write(queue_, Line(kEventCreate, "/v/s/a"));
  QueueMgr mgr(queue_);
  const std::shared_ptr<OPTree> tree = mgr.GetOPTree();
  Append(queue_, Line(kEventCreate, "/v/s/b"));
  EXPECT_EQ(mgr.GetOPTree(), tree);
  EXPECT_EQ(Process(mgr, false).first, std::vector<std::string>{"/v/s/a"});
}

TEST_F(QueueMgrTest, MissingFileTreeIsAnErrorAndNothingIsKept) {
  QueueMgr mgr(queue_);
  EXPECT_THROW(mgr.GetOPTreeTmp(), Error);
  Write(tmp_, Line(kEventCreate, "/v/s/a"));
  EXPECT_EQ(mgr.GetOPTreeTmp()->ProcessOP([](std::shared_ptr<OP>) {}), 1u);
}

TEST_F(QueueMgrTest, FailedRenameIs502) {
  Write(queue_, Line(kEventCreate, "/v/s/a"));
  ASSERT_EQ(mkdir(tmp_.c_str(), 0755), 0);  // not a file: the rename onto it fails
  ASSERT_EQ(mkdir((tmp_ + "/x").c_str(), 0755), 0);
  QueueMgr mgr(queue_);
  LogCapture log;
  const Error error = ErrorOf([&] { mgr.PrepareTmpQueue(); });
  EXPECT_EQ(error.code, kErrorSystem);
  EXPECT_EQ(error.reason.rfind("rename failed, reason=", 0), 0u) << error.reason;
  EXPECT_EQ(log.Matching("(PrepareTmpQueue) Failed [0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str())]").size(),
            1u);
  EXPECT_TRUE(IsFileExist(queue_)) << "the queue stays where it was";
}

// Processing: an event on the path or below it (a rename's old name too);
// reindex: a pure reindex of the path or a folder above it. Both look in the
// live queue and in the taken-over one; a last line still being appended is
// not there yet.
TEST_F(QueueMgrTest, ProcessingAndReindexPredicates) {
  const std::string reindex = Line(kEventReindex, "/v/s/dir");
  const struct {
    std::string live, taken_over, path;
    bool processing, reindexed;
  } rows[] = {
      {Line(kEventCreate, "/v/s/dir/f"), "", "/v/s/dir", true, false},
      {Line(kEventCreate, "/v/s/dir/f"), "", "/v/s/dir/f", true, false},
      {Line(kEventCreate, "/v/s/dir/f"), "", "/v/s/dir/f/g", false, false},
      {Line(kEventCreate, "/v/s/dirx"), "", "/v/s/dir", false, false},
      {Line(kEventCreate, "/v/s/dirx"), Line(kEventRename, "/v/s/elsewhere", "/v/s/dir/moved", true), "/v/s/dir",
       true, false},
      {"", Line(kEventRename, "/v/s/elsewhere", "/v/s/dir/moved", true), "/v/s/dir", true, false},
      {reindex, "", "/v/s/dir/f", false, true},
      {reindex, "", "/v/s/dir", true, true},
      {reindex, "", "/v/s/dirx/f", false, false},
      {reindex, "", "/v/s", true, false},
      {Line(kEventReindex, "/v/s/dir/f/g"), "", "/v/s/dir/f", true, false},
      // A directory create is not a reindex, nor is a reindex with another bit.
      {Line(kEventCreate, "/v/s/dir", "", true) + Line(kEventReindex | kEventCreate, "/v/s/dir"), "", "/v/s/dir/f",
       false, false},
      {"", Line(kEventReindex, "/v/s"), "/v/s/dir/f", false, true},
      {Line(kEventCreate, "/v/s/a") + reindex.substr(0, reindex.size() / 2), "", "/v/s/dir/f", false, false},
      {Line(kEventCreate, "/v/s/a") + reindex.substr(0, reindex.size() / 2), "", "/v/s/a", true, false},
      // Complete but without its newline yet: it counts.
      {reindex.substr(0, reindex.size() - 1), "", "/v/s/dir/f", false, true},
  };
  QueueMgr mgr(queue_);
  for (const auto& row : rows) {
    SCOPED_TRACE(row.live + " | " + row.taken_over + " | " + row.path);
    unlink(queue_.c_str());
    unlink(tmp_.c_str());
    if (!row.live.empty()) Write(queue_, row.live);
    if (!row.taken_over.empty()) Write(tmp_, row.taken_over);
    EXPECT_EQ(mgr.IsFullPathProcessing(row.path), row.processing);
    EXPECT_EQ(mgr.IsFullPathHasReindex(row.path), row.reindexed);
  }
  // The folder file is loaded for the processing check; a malformed queue
  // line fails the scan unless a hit before it ends the scan first.
  Write(queue_, Line(kEventCreate, "/v/s/a") + "\n" + Line(kEventCreate, "/v/s/dir/f"));
  EXPECT_EQ(ErrorOf([&] { mgr.IsFullPathProcessing("/v/s/dir"); }).code, kErrorMalformedEvent);
  EXPECT_TRUE(mgr.IsFullPathProcessing("/v/s/a"));
  sandbox_.Write("var/packages/CorvLumex/etc/fileindex.folders", "not json");
  EXPECT_EQ(ErrorOf([&] { mgr.IsFullPathProcessing("/v/s/a"); }).code, kErrorLoadJson);
}

// A crash marker in either file means the share's events were lost and it
// is (or will be) checked against the disk; other events do not.
TEST_F(QueueMgrTest, LostEventsAreACrashMarkerInTheLiveOrTheTakenOverQueue) {
  QueueMgr mgr(queue_);
  EXPECT_FALSE(mgr.HasLostEvents());
  Write(queue_, Line(kEventCreate, "/v/s/a") + Line(kEventReindex, "/v/s", "", true));
  EXPECT_FALSE(mgr.HasLostEvents());
  Append(queue_, Line(kEventQueueCrash, "/v/s", "", true));
  EXPECT_TRUE(mgr.HasLostEvents());
  mgr.PrepareTmpQueue();
  Write(queue_, Line(kEventDelete, "/v/s/a"));
  EXPECT_TRUE(mgr.HasLostEvents()) << "the taken-over queue still holds it";
  mgr.DeleteTmp();
  EXPECT_FALSE(mgr.HasLostEvents());
  Write(queue_, Line(kEventQueueCrash | kEventCreate, "/v/s/b"));
  EXPECT_TRUE(mgr.HasLostEvents());
}

TEST_F(QueueMgrTest, AppendIsCreatedWhenMissingAndSilentWithoutADirectory) {
  EXPECT_TRUE(AppendQueueLine(queue_, "{\"event\":64,\"path\":\"/v/s/a\"}"));
  EXPECT_TRUE(AppendQueueLine(queue_, "{\"event\":64,\"path\":\"/v/s/b\"}"));
  QueueMgr mgr(queue_);
  EXPECT_EQ(Process(mgr, false).first, (std::vector<std::string>{"/v/s/a", "/v/s/b"}));
  LogCapture log;
  EXPECT_FALSE(AppendQueueLine(sandbox_.root() + "/no/such/dir/fileindex.queue", "{}"));
  EXPECT_TRUE(log.Lines().empty());
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
