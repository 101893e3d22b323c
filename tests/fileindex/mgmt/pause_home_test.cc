// Pausing and resuming shares and volumes, the home service switch and user
// renames, end to end in a sandbox.
#include <filesystem>

#include "common/json_util.h"
#include "common/sys.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/status_mgr.h"
#include "tests/fileindex/mgmt/mgmt_test_base.h"

namespace corvlumex {
namespace fileindex {
namespace {

using testing_support::SystemSnapshot;

class PauseHomeTest : public testing_support::MgmtTest {
 protected:
  void SetUp() override {
    photo_ = sandbox_.AddShare("photo");
    sandbox_.AddShare("video");
    sandbox_.AddShare("music", Json::Value(), "volume2");
    homes_ = sandbox_.AddShare("homes");
    for (const char* dir : {"volume1/homes/alice/docs", "volume1/homes/bob"}) sandbox_.MakeDir(dir);
    FolderAdd(JsonList({FolderJson("/photo"), FolderJson("/music"), FolderJson("/homes/alice/docs")}), false);
    Mark({"photo", "music", "homes"});
  }

  std::string photo_;
  std::string homes_;
};

TEST_F(PauseHomeTest, SharePauseAndResumeTellTheDaemonOncePerChange) {
  SharePause("photo");
  SharePause("photo");
  SharePause("video");  // not indexed: recorded, the daemon has no worker to stop
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), kShareStatusPaused);
  EXPECT_EQ(StatusMgr().GetShareStatus("video"), kShareStatusPaused);
  EXPECT_THAT(NewDaemonSummaries(), ElementsAre("worker_delete photo"));

  ShareResume("photo");
  ShareResume("photo");
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0u);
  EXPECT_THAT(NewDaemonSummaries(), ElementsAre("worker_delete photo", "worker_create photo"));

  ShareClearPaused("video");
  EXPECT_EQ(StatusMgr().GetShareStatus("video"), 0u);
  EXPECT_EQ(NewDaemonSummaries().size(), 2u);
}

TEST_F(PauseHomeTest, VolumeAndSharePausesAddUp) {
  SharePause("photo");
  VolumePause(sandbox_.Volume("volume1") + "/");
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), kShareStatusPaused | kShareStatusVolumePaused);
  EXPECT_EQ(StatusMgr().GetShareStatus("homes"), kShareStatusVolumePaused);
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 0u);  // on the other volume
  EXPECT_THAT(NewDaemonSummaries(), ElementsAre("worker_delete photo", "worker_delete homes"));

  ShareResume("photo");  // the volume still holds it
  EXPECT_EQ(NewDaemonSummaries().size(), 2u);
  VolumeResume(sandbox_.Volume("volume1"));
  EXPECT_THAT(NewDaemonSummaries(), ElementsAre("worker_delete photo", "worker_delete homes", "worker_create homes",
                                               "worker_create photo"));

  VolumePause(sandbox_.Volume("volume2"));
  VolumeClearPaused(sandbox_.Volume("volume2"));
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 0u);
  EXPECT_EQ(NewDaemonSummaries().back(), "worker_delete music");
}

TEST_F(PauseHomeTest, PauseRefusalsAndUnreachableDaemonChangeNothing) {
  for (const auto operation : {SharePause, ShareResume, ShareClearPaused}) {
    ExpectRefused([&] { operation(""); }, kErrorBadArgument, "share_name.empty()");
  }
  ExpectRefused([] { SharePause("nosuch"); }, kErrorShareNotFound, "");
  for (const auto operation : {VolumePause, VolumeResume, VolumeClearPaused}) {
    ExpectRefused([&] { operation(""); }, kErrorBadArgument, "volume_path.empty()");
  }

  // The daemon cannot be told: the pause is not recorded either.
  StatusMgr().SetShareStatus("video", kShareStatusNeedReindex);
  std::filesystem::remove(SysPath("/var/run/fileindexd.sock"));
  ExpectRefused([] { SharePause("photo"); }, kErrorSystem, "");
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0u);
}

TEST_F(PauseHomeTest, HomeServiceSwitchSuspendsAndRestoresTheHomes) {
  const Json::Value cfg = MonitorCfg("homes");
  ASSERT_FALSE(cfg.isNull());
  HomeDisable();
  HomeDisable();
  EXPECT_TRUE(MonitorCfg("homes").isNull());
  EXPECT_EQ(StatusMgr().GetShareStatus("homes"), kShareStatusHomeDisabled);
  EXPECT_THAT(NewDaemonSummaries(), ElementsAre("worker_delete homes"));
  EXPECT_NE(ReadFileText(FoldersFile()).find("/homes/alice/docs"), std::string::npos);

  HomeEnable();
  EXPECT_EQ(JsonToString(MonitorCfg("homes")), JsonToString(cfg));
  EXPECT_EQ(StatusMgr().GetShareStatus("homes"), 0u);
  EXPECT_THAT(NewDaemonSummaries(), ElementsAre("worker_delete homes", "worker_create homes"));
  EXPECT_THAT(QueueSummaries("homes"), ElementsAre("65536 " + homes_ + "/alice/docs"));
  EXPECT_TRUE(NewSearchCommands().empty());  // the index stayed all along
}

TEST_F(PauseHomeTest, UserRenameMovesTheUsersFolders) {
  std::filesystem::rename(homes_ + "/alice", homes_ + "/carol");
  LogCapture log;
  UserRename("alice", "carol");
  EXPECT_EQ(log.Matching("Update homes rule: [/homes/alice/docs] -> [/homes/carol/docs]").size(), 1u);
  EXPECT_THAT(SavedPaths(), ElementsAre("/photo", "/music", "/homes/carol/docs"));
  EXPECT_EQ(MonitorCfg("homes")["config"][0]["path"].asString(), homes_ + "/carol/docs");
  EXPECT_THAT(NewSearchCommands(),
              ElementsAre("document_del_by_query fileindex_homes prefix=" + homes_ + "/alice/docs/",
                          "document_del_by_id fileindex_homes " + homes_ + "/alice/docs"));
  EXPECT_THAT(NewDaemonSummaries(), ElementsAre("notify_setting_changed homes"));
  EXPECT_THAT(QueueSummaries("homes"), ElementsAre("65536 " + homes_ + "/carol/docs"));

  // A user without folders of their own changes nothing.
  const SystemSnapshot before = Snapshot();
  UserRename("bob", "dave");
  EXPECT_EQ(Snapshot(), before);
}

TEST_F(PauseHomeTest, HomeAndUserRenameRefusalsChangeNothing) {
  ExpectRefused([] { UserRename("", "carol"); }, kErrorBadArgument, "user_from.empty()");
  ExpectRefused([] { UserRename("alice", ""); }, kErrorBadArgument, "user_to.empty()");
  sandbox_.RemoveShare("homes");  // without the homes share
  ExpectRefused([] { HomeDisable(); }, kErrorShareNotFound, "");
  ExpectRefused([] { HomeEnable(); }, kErrorShareNotFound, "");
  ExpectRefused([] { UserRename("alice", "carol"); }, kErrorShareNotFound, "");
  sandbox_.AddShare("homes");
  sandbox_.MakeDir("volume1/homes/bob/docs");
  FolderAdd(JsonList({FolderJson("/homes/bob/docs")}), false);
  ExpectRefused([] { UserRename("alice", "bob"); }, kErrorDuplicatedId, "folder_mgr.HasFolder(renamed->GetPath())");
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
