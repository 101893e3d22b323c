// Following a renamed share, a share moved to another volume, and a recycle
// bin switched on or off, end to end in a sandbox.

#include "common/json_util.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "tests/fileindex/mgmt/mgmt_test_base.h"

namespace corvlumex {
namespace fileindex {
namespace {

class ShareOpsTest : public testing_support::MgmtTest {
 protected:
  void SetUp() override {
    photo_ = sandbox_.AddShare("photo");
    sandbox_.AddShare("music", Json::Value(), "volume2");
    sandbox_.MakeDir("volume1/photo/a");
    FolderAdd(JsonList({FolderJson("/photo"), FolderJson("/photo/a", true, false, false, false)}), false);
    Mark({"photo"});
  }

  std::string photo_;
};

TEST_F(ShareOpsTest, RenameMovesFoldersIndexMonitorAndStatus) {
  StatusMgr().SetShareStatus("photo", kShareStatusPaused);
  const std::vector<std::string> old_monitor_files = MonitorFiles();
  const std::string pics = sandbox_.RenameShare("photo", "pics");
  ShareRename("photo", "pics");

  const std::vector<Json::Value> requests = SearchRequests();
  EXPECT_THAT(NewSearchCommands(), ElementsAre("index_config_set fileindex_photo",
                                               "document_del_by_query fileindex_pics prefix=" + photo_ + "/",
                                               "document_del_by_id fileindex_pics " + photo_));
  EXPECT_EQ(JsonToString(requests[requests.size() - 3]["data"]["data"]),
            "{\"id\":\"fileindex_pics\",\"path\":\"" + pics + "/@eaDir/fileindex.db\"}");
  EXPECT_THAT(SavedPaths(), ElementsAre("/pics", "/pics/a"));
  EXPECT_NE(ReadFileText(FoldersFile()).find(R"("path":"/pics/a","name":"a","document":true,"audio":false)"),
            std::string::npos);
  EXPECT_NE(MonitorFiles(), old_monitor_files);
  EXPECT_EQ(MonitorFiles().size(), 1u);
  const Json::Value cfg = MonitorCfg("pics");
  ASSERT_EQ(cfg["config"].size(), 2u);
  EXPECT_EQ(cfg["config"][1]["path"].asString(), pics + "/a");
  EXPECT_EQ(StatusMgr().GetShareStatus("pics"), kShareStatusPaused);
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0u);
  const std::vector<Json::Value> commands = NewDaemonCommands();
  ASSERT_EQ(commands.size(), 2u);
  EXPECT_EQ(JsonToString(commands[0]["data"]), "{\"is_upsert\":false,\"share_name\":\"photo\"}");
  EXPECT_EQ(JsonToString(commands[1]["data"]), "{\"is_upsert\":true,\"share_name\":\"pics\"}");
  // One reindex of the share covers its inner folder.
  EXPECT_THAT(QueueSummaries("pics"), ElementsAre("65536 " + pics));
}

TEST_F(ShareOpsTest, RenameRefusalsChangeNothing) {
  ExpectRefused([] { ShareRename("", "pics"); }, kErrorBadArgument, "share_from.empty()");
  ExpectRefused([] { ShareRename("photo", ""); }, kErrorBadArgument, "share_to.empty()");
  ExpectRefused([] { ShareRename("photo", "pics"); }, kErrorShareNotFound, "");  // not renamed yet
  FolderAdd(JsonList({FolderJson("/music")}), false);
  ExpectRefused([] { ShareRename("photo", "music"); }, kErrorDuplicatedId, "folder_mgr.IsShareIndexed(share_to)");
}

TEST_F(ShareOpsTest, RenameOfAShareWithoutFoldersCarriesItsStatusOnly) {
  StatusMgr().SetShareStatus("music", 1);
  sandbox_.RenameShare("music", "songs");
  ShareRename("music", "songs");
  EXPECT_EQ(StatusMgr().GetShareStatus("songs"), 1u);
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 0u);
  EXPECT_TRUE(NewSearchCommands().empty());
  EXPECT_TRUE(NewDaemonCommands().empty());
}

TEST_F(ShareOpsTest, MigrateFollowsTheShareToItsNewVolume) {
  const std::string folders = ReadFileText(FoldersFile());
  const std::string moved = sandbox_.MoveShare("photo", "volume2");
  ShareMigrate("photo", photo_, moved);
  EXPECT_THAT(NewSearchCommands(), ElementsAre("index_config_set fileindex_photo",
                                               "document_del_by_query fileindex_photo prefix=" + photo_ + "/",
                                               "document_del_by_id fileindex_photo " + photo_));
  EXPECT_EQ(JsonToString(SearchRequests()[SearchRequests().size() - 3]["data"]["data"]),
            "{\"path\":\"" + moved + "/@eaDir/fileindex.db\"}");
  EXPECT_EQ(ReadFileText(FoldersFile()), folders);
  EXPECT_EQ(MonitorFiles().size(), 1u);  // the old place's configuration is gone
  EXPECT_EQ(MonitorCfg("photo")["config"][0]["path"].asString(), moved);
  ASSERT_EQ(NewDaemonCommands().size(), 1u);
  EXPECT_TRUE(NewDaemonCommands()[0]["data"]["is_upsert"].asBool());
  EXPECT_THAT(QueueSummaries("photo"), ElementsAre("65536 " + moved));

  ExpectRefused([&] { ShareMigrate("", photo_, moved); }, kErrorBadArgument, "share_name.empty()");
  ExpectRefused([&] { ShareMigrate("photo", "", moved); }, kErrorBadArgument, "path_from.empty()");
  ExpectRefused([&] { ShareMigrate("photo", moved, ""); }, kErrorBadArgument, "path_to.empty()");
  // The share's record does not place it where the request says.
  ExpectRefused([&] { ShareMigrate("photo", moved, photo_); }, kErrorBadArgument, "share.GetPath() != path_to");
}

// "#recycle" is a bin only while the share's switch is on: then its
// documents leave the index; off, it is an ordinary folder and is indexed.
TEST_F(ShareOpsTest, RecycleBinLeavesOrEntersTheIndexWithTheSharesSwitch) {
  sandbox_.MakeDir("volume1/photo/#recycle/old");
  ScopedFakePlatform platform;
  platform->ShareIsShareRecycleHook = [&](const std::string& path) {
    const int in_bin = platform->RealShareIsShareRecycle(path);
    return in_bin <= 0 ? in_bin : sandbox_.registry().Entry("photo")["recycle_bin"].asBool() ? 1 : 0;
  };
  ShareCheckRecycle("photo");
  EXPECT_TRUE(NewSearchCommands().empty());
  EXPECT_THAT(QueueSummaries("photo"), ElementsAre("65536 " + photo_ + "/#recycle"));

  sandbox_.registry().Set("photo", "recycle_bin", true);
  Mark({"photo"});
  ShareCheckRecycle("photo");
  EXPECT_THAT(NewSearchCommands(),
              ElementsAre("document_del_by_query fileindex_photo prefix=" + photo_ + "/#recycle/",
                          "document_del_by_id fileindex_photo " + photo_ + "/#recycle"));
  EXPECT_TRUE(sandbox_.QueueEvents("photo").empty());
  ExpectRefused([] { ShareCheckRecycle(""); }, kErrorBadArgument, "share_name.empty()");
  ShareCheckRecycle("music");  // nothing indexed there
  EXPECT_EQ(NewSearchCommands().size(), 2u);
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
