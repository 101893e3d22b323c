// The neighbours of indexing: services, the notifier's queue configuration
// and the removal of a share's index data.
#include <filesystem>
#include <fstream>

#include "common/json_util.h"
#include "fileindex/mgmt/related_services.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "tests/fileindex/mgmt/mgmt_test_base.h"

namespace corvlumex {
namespace fileindex {
namespace {

constexpr char kStopExtract[] = "--no-block stop corvcontentextractd.service";
constexpr char kStopIndexer[] = "stop pkg-CorvLumex-fileindexd.service";

class RelatedServicesTest : public testing_support::MgmtTest {
 protected:
  void WriteFolders(const std::vector<Json::Value>& folders) {
    ASSERT_TRUE(JsonToFile(JsonList(folders), FoldersFile()));
  }
};

TEST_F(RelatedServicesTest, EnableStartsEverythingAndSwitchesSpotlightOnlyOnce) {
  SetupRelatedServices(true);
  EXPECT_THAT(NewServiceRequests(), ElementsAre("reload smbd.service", "start corvcontentextractd.service",
                                                "start pkg-CorvLumex-fileindexd.service"));
  Mark();
  SetupRelatedServices(true);  // Spotlight already on: samba is not restarted again
  EXPECT_THAT(NewServiceRequests(),
              ElementsAre("start corvcontentextractd.service", "start pkg-CorvLumex-fileindexd.service"));
  Mark();
  SetupRelatedServices(false);
  SetupRelatedServices(false);  // already off: no second restart
  EXPECT_THAT(NewServiceRequests(),
              ElementsAre("reload smbd.service", kStopExtract, kStopIndexer, kStopExtract, kStopIndexer));
}

TEST_F(RelatedServicesTest, FailuresAreLoggedAndEveryStepStillRuns) {
  ScopedFakePlatform platform;
  setenv("CORVLUMEX_SERVICE_COMMAND", "/bin/false", 1);  // every service request fails
  LogCapture log;
  SetupRelatedServices(true);  // does not throw
  unsetenv("CORVLUMEX_SERVICE_COMMAND");
  EXPECT_EQ(log.Matching("KLIBServiceRestart failed: err=[0x0800 services.cc:").size(), 1u);
  EXPECT_EQ(log.Matching("(SetupRelatedServices) Failed [0 > KLIBServiceStart(\"corvcontentextractd\", TRUE)]").size(), 1u);
  EXPECT_EQ(log.Matching("Failed [0 > KLIBServicectlStart(\"pkg-CorvLumex-fileindexd\", KLIB_SERVICECTL_UPSTART)]")
                .size(),
            1u);

  platform->SMBSetSpotlightHook = [](bool) { return FakePlatform::Refuse(platform::kPlatformErrConfig); };
  log.Clear();
  Mark();
  SetupRelatedServices(false);  // Spotlight is on: the switch fails, samba is left alone
  EXPECT_EQ(log.Matching("(SetupRelatedServices) CORVSMBSetSpotlight failed: err=[0x0A00").size(), 1u);
  EXPECT_THAT(NewServiceRequests(), ElementsAre(kStopExtract, kStopIndexer));
}

TEST_F(RelatedServicesTest, PrepareServicesFollowsTheFolderFile) {
  PrepareServices();  // no folder file: stop
  EXPECT_THAT(NewServiceRequests(), ElementsAre(kStopExtract, kStopIndexer));
  sandbox_.AddShare("photo");
  WriteFolders({FolderJson("/photo")});
  Mark();
  PrepareServices();
  EXPECT_EQ(NewServiceRequests().back(), "start pkg-CorvLumex-fileindexd.service");
  // A file whose list is empty counts as nothing configured: Spotlight goes off too.
  WriteFolders({});
  Mark();
  PrepareServices();
  EXPECT_THAT(NewServiceRequests(), ElementsAre("reload smbd.service", kStopExtract, kStopIndexer));
}

TEST_F(RelatedServicesTest, MonitorConfigurationListsTheShareFoldersOnly) {
  const std::string photo = sandbox_.AddShare("photo");
  sandbox_.AddShare("Photo", Json::Value(), "volume2");
  WriteFolders({FolderJson("/photo/a"), FolderJson("/Photo"), FolderJson("/photo/b")});
  const FolderMgr folder_mgr;
  UpsertCORVNotifydCfg("photo", folder_mgr);
  const Json::Value cfg = MonitorCfg("photo");
  EXPECT_EQ(cfg["queue"].asString(), photo + "/@eaDir/fileindex.queue");
  ASSERT_EQ(cfg["config"].size(), 2u);
  EXPECT_EQ(cfg["config"][0]["path"].asString(), photo + "/a");
  EXPECT_EQ(cfg["config"][1]["path"].asString(), photo + "/b");
  EXPECT_EQ(cfg["config"][1]["mask"].asUInt(), 65478u);
  EXPECT_EQ(JsonToString(cfg["config"][1]["ignore"]), "[\"@eaDir\"]");

  // A share without folders keeps its queue and watches nothing: "config"
  // is null, not an empty list.
  const std::string music = sandbox_.AddShare("music");
  UpsertCORVNotifydCfg("music", folder_mgr);
  EXPECT_EQ(MonitorCfg("music")["queue"].asString(), music + "/@eaDir/fileindex.queue");
  EXPECT_TRUE(MonitorCfg("music").isMember("config"));
  EXPECT_TRUE(MonitorCfg("music")["config"].isNull());

  DeleteCORVNotifydCfg("photo");
  EXPECT_TRUE(MonitorCfg("photo").isNull());
  EXPECT_EQ(ErrorOf([&] { UpsertCORVNotifydCfg("nosuch", folder_mgr); }).code, kErrorShareNotFound);
}

TEST_F(RelatedServicesTest, RefusedMonitorConfigurationIsError502) {
  sandbox_.AddShare("photo");
  ScopedFakePlatform platform;
  platform->RefuseMonitorQueues();
  const FolderMgr folder_mgr;
  ExpectError([&] { UpsertCORVNotifydCfg("photo", folder_mgr); }, kErrorSystem,
              "MonitorQueue::Upsert failed, share=photo",
              "!MonitorQueue::Upsert(monitor_queue, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)", "UpsertCORVNotifydCfg");
  ExpectError([&] { DeleteCORVNotifydCfg("photo"); }, kErrorSystem, "MonitorQueue::Delete failed, share=photo",
              "!MonitorQueue::Delete(share.GetQueuePath(), kAppName, MONITOR_QUEUE_TYPE_APPLICATION)",
              "DeleteCORVNotifydCfg");
}

TEST_F(RelatedServicesTest, CleanShareIndexDataStopsAtTheFirstCompositionFailure) {
  const std::string photo = sandbox_.AddShare("photo");
  sandbox_.MakeDir("volume1/photo/@eaDir/fileindex.db");
  std::ofstream(photo + "/@eaDir/fileindex.queue") << "{}\n";
  StatusMgr().SetShareStatus("photo", 1);
  ScopedFakePlatform platform;
  platform->DBPathComposeHook = [](auto&&...) { return FakePlatform::Refuse(platform::kPlatformErrBadArgument); };
  ExpectError([&] { CleanShareIndexData("photo", photo); }, kErrorSystem,
              "FILEIDXDBPathCompose failed, share_path=" + photo,
              "0 > FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path))", "CleanShareIndexData");
  EXPECT_FALSE(std::filesystem::exists(photo + "/@eaDir/fileindex.queue"));  // step 2 ran
  EXPECT_TRUE(std::filesystem::exists(photo + "/@eaDir/fileindex.db"));
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 1u);
  EXPECT_EQ(ErrorOf([] { CleanShareIndexData("photo", ""); }).reason, "FILEIDXQueuePathCompose failed, share_path=");
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
