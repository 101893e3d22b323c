// Deleting and reindexing folders, and the term suggestions, end to end in
// a sandbox with fake fileindexd and corvelasticd.
#include <filesystem>
#include <fstream>

#include "common/json_util.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "platform/platform.h"
#include "tests/fileindex/mgmt/mgmt_test_base.h"

namespace corvlumex {
namespace fileindex {
namespace {

class FolderDeleteTest : public testing_support::MgmtTest {
 protected:
  void SetUp() override {
    photo_ = sandbox_.AddShare("photo");
    music_ = sandbox_.AddShare("music", Json::Value(), "volume2");
    for (const char* dir : {"volume1/photo/a/x", "volume1/photo/b"}) sandbox_.MakeDir(dir);
  }
  void Add(const std::vector<Json::Value>& folders) {
    FolderAdd(JsonList(folders), false);
    Mark({"photo", "music"});
  }

  std::string photo_;
  std::string music_;
};

TEST_F(FolderDeleteTest, LastFolderOfAShareTakesItsIndexAndDataAlong) {
  Add({FolderJson("/photo/a"), FolderJson("/music")});
  sandbox_.MakeDir("volume1/photo/@eaDir/fileindex.db");
  sandbox_.MakeDir("volume1/photo/@eaDir/fileindex.queue.tmp");
  std::ofstream(photo_ + "/@eaDir/fileindex.queue") << "{\"event\":2,\"path\":\"" << photo_ << "/a/f\"}\n";
  StatusMgr().SetShareStatus("photo", 3);
  StatusMgr().SetShareStatus("video", 1);

  FolderDelete(JsonList({"/photo/a"}));
  EXPECT_THAT(SavedPaths(), ElementsAre("/music"));
  EXPECT_THAT(NewSearchCommands(), ElementsAre("index_delete fileindex_photo"));
  EXPECT_TRUE(MonitorCfg("photo").isNull());
  EXPECT_FALSE(MonitorCfg("music").isNull());
  for (const char* gone : {"fileindex.queue", "fileindex.queue.tmp", "fileindex.db"}) {
    EXPECT_FALSE(std::filesystem::exists(photo_ + "/@eaDir/" + gone)) << gone;
  }
  EXPECT_TRUE(std::filesystem::exists(photo_ + "/@eaDir"));
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0u);
  EXPECT_EQ(StatusMgr().GetShareStatus("video"), 1u);
  ASSERT_EQ(NewDaemonCommands().size(), 1u);
  EXPECT_EQ(JsonToString(NewDaemonCommands()[0]["data"]), "{\"is_upsert\":false,\"share_name\":\"photo\"}");
  // music is still indexed; samba re-reads that photo has no Spotlight now.
  EXPECT_THAT(NewServiceRequests(), ElementsAre("reload smbd.service"));
  EXPECT_EQ(platform::Current()->SMBIsEnableSpotlight(), 1);
  Mark();

  FolderDelete(JsonList({"/music"}));
  EXPECT_THAT(SavedPaths(), ElementsAre());
  EXPECT_THAT(NewServiceRequests(), ElementsAre("reload smbd.service", "--no-block stop corvcontentextractd.service",
                                                "stop pkg-CorvLumex-fileindexd.service"));
}

TEST_F(FolderDeleteTest, OrphanedDocumentsLeaveAndInnerFoldersAreRebuilt) {
  Add({FolderJson("/photo/a"), FolderJson("/photo/a/x"), FolderJson("/photo/b")});
  FolderDelete(JsonList({"/photo/a"}));
  EXPECT_THAT(SavedPaths(), ElementsAre("/photo/a/x", "/photo/b"));
  EXPECT_THAT(NewSearchCommands(),
              ElementsAre("document_del_by_query fileindex_photo prefix=" + photo_ + "/a/",
                          "document_del_by_id fileindex_photo " + photo_ + "/a"));
  const Json::Value cfg = MonitorCfg("photo");
  ASSERT_EQ(cfg["config"].size(), 2u);
  EXPECT_EQ(cfg["config"][0]["path"].asString(), photo_ + "/a/x");
  // The inner folder lost its documents with the outer one: it is reindexed.
  EXPECT_THAT(QueueSummaries("photo"), ElementsAre("65536 " + photo_ + "/a/x"));
  ASSERT_EQ(NewDaemonCommands().size(), 1u);
  EXPECT_FALSE(NewDaemonCommands()[0]["data"]["is_upsert"].asBool());
}

TEST_F(FolderDeleteTest, DocumentsOfAnOuterFolderFollowItsSettings) {
  Add({FolderJson("/photo"), FolderJson("/photo/a", true, false, false, false)});
  FolderDelete(JsonList({"/photo/a"}));
  EXPECT_TRUE(NewSearchCommands().empty());
  ASSERT_EQ(sandbox_.QueueEvents("photo").size(), 1u);
  EXPECT_EQ(JsonToString(sandbox_.QueueEvents("photo")[0]),
            R"({"data":{"audio":true,"document":false,"photo":true,"video":true},"event":131072,"path":")" +
                photo_ + R"(/a","path_old":""})");

  // The same settings inside and outside: nothing to redo.
  Add({FolderJson("/photo/b")});
  FolderDelete(JsonList({"/photo/b"}));
  EXPECT_TRUE(sandbox_.QueueEvents("photo").empty());
  EXPECT_THAT(SavedPaths(), ElementsAre("/photo"));
}

TEST_F(FolderDeleteTest, FoldersOfAVanishedShareCanStillBeRemoved) {
  Add({FolderJson("/photo/a"), FolderJson("/music")});
  StatusMgr().SetShareStatus("photo", 1);
  sandbox_.RemoveShare("photo");
  FolderDelete(JsonList({"/photo/a"}));
  EXPECT_THAT(SavedPaths(), ElementsAre("/music"));
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0u);
  EXPECT_THAT(NewSearchCommands(), ElementsAre("index_delete fileindex_photo"));
  EXPECT_TRUE(NewDaemonCommands().empty());
  // An index the search daemon no longer knows does not stop the deletion.
  sandbox_.MakeDir("volume2/music/x");
  Add({FolderJson("/music/x")});
  search_.Enqueue(testing_support::FakeAnswer::Failure(2010, "No index fileindex_music"));
  sandbox_.RemoveShare("music");
  FolderDelete(JsonList({"/music", "/music/x"}));
  EXPECT_THAT(SavedPaths(), ElementsAre());
}

TEST_F(FolderDeleteTest, RefusalsChangeNothing) {
  Add({FolderJson("/photo/a"), FolderJson("/music")});
  ExpectRefused([] { FolderDelete(Json::Value("/photo/a")); }, kErrorBadArgument, "!path_list.isArray()",
                "\"/photo/a\"", "FolderDelete");
  ExpectRefused([] { FolderDelete(JsonList({"/photo/a", ""})); }, kErrorBadArgument, "");
  ExpectRefused([] { FolderDelete(JsonList({"/photo/a", 7})); }, kErrorBadArgument, "");
  ExpectRefused([] { FolderDelete(JsonList({"/photo/a", "/photo/zzz"})); }, kErrorFolderNotFound, "");
  ExpectRefused([] { FolderReindex(JsonList({"/music", "/photo/zzz"})); }, kErrorFolderNotFound, "");
  ExpectRefused([] { FolderReindex(Json::Value(Json::objectValue)); }, kErrorBadArgument, "");
  // A monitor failure restores the folder file.
  ScopedFakePlatform platform;
  platform->RefuseMonitorQueues();
  ExpectRefused([] { FolderDelete(JsonList({"/photo/a", "/music"})); }, kErrorSystem, "");
}

TEST_F(FolderDeleteTest, IndexFailureMarksTheShareForRebuild) {
  Add({FolderJson("/photo/a"), FolderJson("/photo/b")});
  search_.Enqueue(testing_support::FakeAnswer::Failure(2003, "disk I/O error"));
  EXPECT_EQ(ErrorOf([] { FolderDelete(JsonList({"/photo/a"})); }).code, 2003);
  // The folder is gone from the file and the notifier; the index, which may
  // still hold its documents, is marked for a rebuild.
  EXPECT_THAT(SavedPaths(), ElementsAre("/photo/b"));
  EXPECT_EQ(MonitorCfg("photo")["config"].size(), 1u);
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 1u);
}

TEST_F(FolderDeleteTest, ReindexQueuesOneEventPerFolder) {
  Add({FolderJson("/photo/a"), FolderJson("/photo/b"), FolderJson("/music")});
  FolderReindex(JsonList({"/photo/b", Json::Value(FolderJson("/music")), "/photo/a", "/photo/b"}));
  EXPECT_THAT(QueueSummaries("photo"), ElementsAre("65536 " + photo_ + "/b", "65536 " + photo_ + "/a"));
  EXPECT_EQ(JsonToString(sandbox_.QueueEvents("photo")[0]),
            "{\"data\":null,\"event\":65536,\"path\":\"" + photo_ + "/b\",\"path_old\":\"\"}");
  EXPECT_EQ(sandbox_.QueueEvents("music").size(), 1u);
  EXPECT_TRUE(NewSearchCommands().empty());
  EXPECT_TRUE(NewDaemonCommands().empty());
}

TEST_F(FolderDeleteTest, TermSuggestionsOfEveryIndexedShare) {
  Add({FolderJson("/photo/a"), FolderJson("/music")});
  UpdateTermSuggestion();
  const std::vector<Json::Value> requests = SearchRequests();
  ASSERT_EQ(NewSearchCommands().size(), 2u);
  EXPECT_EQ(JsonToString(requests[requests.size() - 2]["compound"]),
            "[{\"command\":\"update_term_suggestion\",\"data\":{\"db_name\":\"fileindex_music\","
            "\"doc_id_field\":\"CORVMDSearchFileName\"}}]");
  EXPECT_EQ(requests[requests.size() - 1]["compound"][0]["data"]["db_name"].asString(), "fileindex_photo");
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
