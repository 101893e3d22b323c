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
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

std::string Line(unsigned event, const std::string& path, const std::string& path_old = "", bool is_dir = false) {
  Json::Value line(Json::objectValue);
  line["event"] = event;
  line["path"] = path;
  if (!path_old.empty()) line["path_old"] = path_old;
  if (is_dir) line["is_dir"] = true;
  return JsonToString(line) + "\n";
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

TEST_F(QueueMgrTest, ProcessingMeansAnEventOnThePathOrBelowInEitherFile) {
  QueueMgr mgr(queue_);
  Write(queue_, Line(kEventCreate, "/v/s/dir/f"));
  EXPECT_TRUE(mgr.IsFullPathProcessing("/v/s/dir"));
  EXPECT_TRUE(mgr.IsFullPathProcessing("/v/s/dir/f"));
  EXPECT_FALSE(mgr.IsFullPathProcessing("/v/s/dir/f/g"));
  Write(queue_, Line(kEventCreate, "/v/s/dirx"));
  EXPECT_FALSE(mgr.IsFullPathProcessing("/v/s/dir"));
  // The old name of a rename counts, and so does the taken-over file.
  Write(tmp_, Line(kEventRename, "/v/s/elsewhere", "/v/s/dir/moved", true));
  EXPECT_TRUE(mgr.IsFullPathProcessing("/v/s/dir"));
  ASSERT_EQ(unlink(queue_.c_str()), 0);
  EXPECT_TRUE(mgr.IsFullPathProcessing("/v/s/dir"));
}

TEST_F(QueueMgrTest, ProcessingLoadsTheFolderFile) {
  sandbox_.Write("var/packages/CorvLumex/etc/fileindex.folders", "not json");
  QueueMgr mgr(queue_);
  EXPECT_EQ(ErrorOf([&] { mgr.IsFullPathProcessing("/v/s/dir"); }).code, kErrorLoadJson);
}

TEST_F(QueueMgrTest, ReindexCoversThePathAndWhatIsBelowIt) {
  QueueMgr mgr(queue_);
  Write(queue_, Line(kEventReindex, "/v/s/dir"));
  EXPECT_TRUE(mgr.IsFullPathHasReindex("/v/s/dir/f"));
  EXPECT_TRUE(mgr.IsFullPathHasReindex("/v/s/dir"));
  EXPECT_FALSE(mgr.IsFullPathHasReindex("/v/s/dirx/f"));
  EXPECT_FALSE(mgr.IsFullPathHasReindex("/v/s"));
  Write(queue_, Line(kEventReindex, "/v/s/dir/f/g"));
  EXPECT_FALSE(mgr.IsFullPathHasReindex("/v/s/dir/f"));
  // A directory create is not a reindex, nor is a reindex with another bit.
  Write(queue_, Line(kEventCreate, "/v/s/dir", "", true) + Line(kEventReindex | kEventCreate, "/v/s/dir"));
  EXPECT_FALSE(mgr.IsFullPathHasReindex("/v/s/dir/f"));
  Write(tmp_, Line(kEventReindex, "/v/s"));
  EXPECT_TRUE(mgr.IsFullPathHasReindex("/v/s/dir/f"));
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

TEST_F(QueueMgrTest, AMalformedLineFailsTheScan) {
  QueueMgr mgr(queue_);
  Write(queue_, Line(kEventCreate, "/v/s/a") + "\n" + Line(kEventCreate, "/v/s/dir/f"));
  EXPECT_EQ(ErrorOf([&] { mgr.IsFullPathProcessing("/v/s/dir"); }).code, kErrorMalformedEvent);
  // A hit before the bad line ends the scan first.
  EXPECT_TRUE(mgr.IsFullPathProcessing("/v/s/a"));
}

TEST_F(QueueMgrTest, ALastLineStillBeingAppendedIsNotThereYet) {
  QueueMgr mgr(queue_);
  const std::string whole = Line(kEventReindex, "/v/s/dir");
  Write(queue_, Line(kEventCreate, "/v/s/a") + whole.substr(0, whole.size() / 2));
  EXPECT_FALSE(mgr.IsFullPathHasReindex("/v/s/dir/f"));
  EXPECT_TRUE(mgr.IsFullPathProcessing("/v/s/a"));
  // Complete but without its newline yet: it counts.
  Write(queue_, whole.substr(0, whole.size() - 1));
  EXPECT_TRUE(mgr.IsFullPathHasReindex("/v/s/dir/f"));
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
