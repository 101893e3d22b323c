// The neighbours of indexing: services, the notifier's queue configuration,
// the removal of a share's index data and the setting-changed notice.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "common/json_util.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/related_services.h"
#include "fileindex/status_mgr.h"
#include "tests/mgmt/mgmt_test_base.h"
#include "tests/mgmt/test_platform.h"

namespace corvlumex {
namespace fileindex {
namespace {

using testing_support::ErrorOf;
using testing_support::FolderJson;
using testing_support::LogCapture;
using testing_support::MgmtSandbox;
using testing_support::ScopedTestPlatform;
using ::testing::ElementsAre;

void WriteFolders(const MgmtSandbox& sandbox, const std::vector<Json::Value>& folders) {
  ASSERT_TRUE(JsonToFile(testing_support::JsonList(folders), sandbox.FoldersFile()));
}

TEST(RelatedServicesTest, EnableStartsEverythingAndSwitchesSpotlightOnlyOnce) {
  MgmtSandbox sandbox;
  SetupRelatedServices(true);
  EXPECT_THAT(sandbox.ServiceRequests(),
              ElementsAre("restart smbd.service", "start corvcontentextractd.service",
                          "start pkg-CorvLumex-fileindexd.service"));
  SetupRelatedServices(true);  // Spotlight already on: samba is not restarted again
  EXPECT_EQ(sandbox.ServiceRequests().size(), 5u);
  EXPECT_EQ(sandbox.ServiceRequests()[3], "start corvcontentextractd.service");

  SetupRelatedServices(false);
  SetupRelatedServices(false);  // already off: no second restart
  const std::vector<std::string> requests = sandbox.ServiceRequests();
  EXPECT_THAT(std::vector<std::string>(requests.begin() + 5, requests.end()),
              ElementsAre("restart smbd.service", "--no-block stop corvcontentextractd.service",
                          "stop pkg-CorvLumex-fileindexd.service", "--no-block stop corvcontentextractd.service",
                          "stop pkg-CorvLumex-fileindexd.service"));
}

TEST(RelatedServicesTest, FailuresAreLoggedAndEveryStepStillRuns) {
  MgmtSandbox sandbox;
  ScopedTestPlatform platform;
  setenv("CORVLUMEX_SERVICE_COMMAND", "/bin/false", 1);  // every service request fails
  LogCapture log;
  SetupRelatedServices(true);  // does not throw
  unsetenv("CORVLUMEX_SERVICE_COMMAND");
  EXPECT_EQ(log.Matching("KLIBServiceRestart failed: err=[0x0800 services.cc:").size(), 1u);
  EXPECT_EQ(log.Matching("(SetupRelatedServices) Failed [0 > KLIBServiceStart(\"corvcontentextractd\", TRUE)]").size(), 1u);
  EXPECT_EQ(log.Matching("Failed [0 > KLIBServicectlStart(\"pkg-CorvLumex-fileindexd\", KLIB_SERVICECTL_UPSTART)]")
                .size(),
            1u);

  platform->fail_spotlight_switch = true;
  log.Clear();
  SetupRelatedServices(false);  // Spotlight is on: the switch fails, samba is left alone
  EXPECT_EQ(log.Matching("(SetupRelatedServices) CORVSMBSetSpotlight failed: err=[0x0A00").size(), 1u);
  const std::vector<std::string> requests = sandbox.ServiceRequests();
  ASSERT_GE(requests.size(), 2u);
  EXPECT_THAT(std::vector<std::string>(requests.end() - 2, requests.end()),
              ElementsAre("--no-block stop corvcontentextractd.service", "stop pkg-CorvLumex-fileindexd.service"));
}

TEST(RelatedServicesTest, PrepareServicesFollowsTheFolderFile) {
  MgmtSandbox sandbox;
  PrepareServices();  // no folder file: stop
  EXPECT_THAT(sandbox.ServiceRequests(),
              ElementsAre("--no-block stop corvcontentextractd.service", "stop pkg-CorvLumex-fileindexd.service"));
  sandbox.AddShare("photo");
  WriteFolders(sandbox, {FolderJson("/photo")});
  PrepareServices();
  EXPECT_EQ(sandbox.ServiceRequests().back(), "start pkg-CorvLumex-fileindexd.service");
  // A file whose list is empty counts as nothing configured.
  WriteFolders(sandbox, {});
  PrepareServices();
  const std::vector<std::string> requests = sandbox.ServiceRequests();
  ASSERT_GE(requests.size(), 2u);
  EXPECT_THAT(std::vector<std::string>(requests.end() - 2, requests.end()),
              ElementsAre("--no-block stop corvcontentextractd.service", "stop pkg-CorvLumex-fileindexd.service"));
}

TEST(RelatedServicesTest, MonitorConfigurationListsTheShareFoldersOnly) {
  MgmtSandbox sandbox;
  const std::string photo = sandbox.AddShare("photo");
  const std::string upper = sandbox.AddShare("Photo", "volume2");
  WriteFolders(sandbox, {FolderJson("/photo/a"), FolderJson("/Photo"), FolderJson("/photo/b")});
  const FolderMgr folder_mgr;
  UpsertCORVNotifydCfg("photo", folder_mgr);
  const Json::Value cfg = sandbox.MonitorCfg("photo");
  EXPECT_EQ(cfg["queue"].asString(), photo + "/@eaDir/fileindex.queue");
  ASSERT_EQ(cfg["config"].size(), 2u);
  EXPECT_EQ(cfg["config"][0]["path"].asString(), photo + "/a");
  EXPECT_EQ(cfg["config"][1]["path"].asString(), photo + "/b");
  EXPECT_EQ(cfg["config"][1]["mask"].asUInt(), 65478u);
  EXPECT_EQ(JsonToString(cfg["config"][1]["ignore"]), "[\"@eaDir\"]");

  // A share without folders keeps its queue and watches nothing: "config"
  // is null, not an empty list.
  const std::string music = sandbox.AddShare("music");
  UpsertCORVNotifydCfg("music", folder_mgr);
  EXPECT_EQ(sandbox.MonitorCfg("music")["queue"].asString(), music + "/@eaDir/fileindex.queue");
  EXPECT_TRUE(sandbox.MonitorCfg("music").isMember("config"));
  EXPECT_TRUE(sandbox.MonitorCfg("music")["config"].isNull());

  DeleteCORVNotifydCfg("photo");
  EXPECT_TRUE(sandbox.MonitorCfg("photo").isNull());
  EXPECT_EQ(ErrorOf([&] { UpsertCORVNotifydCfg("nosuch", folder_mgr); }).code, kErrorShareNotFound);
  (void)upper;
}

TEST(RelatedServicesTest, RefusedMonitorConfigurationIsError502) {
  MgmtSandbox sandbox;
  sandbox.AddShare("photo");
  ScopedTestPlatform platform;
  platform->fail_monitor = true;
  LogCapture log;
  const FolderMgr folder_mgr;
  const Error upsert = ErrorOf([&] { UpsertCORVNotifydCfg("photo", folder_mgr); });
  EXPECT_EQ(upsert.code, kErrorSystem);
  EXPECT_EQ(upsert.reason, "MonitorQueue::Upsert failed, share=photo");
  EXPECT_EQ(log.Matching("(UpsertCORVNotifydCfg) Failed [!MonitorQueue::Upsert(monitor_queue, kAppName, "
                         "MONITOR_QUEUE_TYPE_APPLICATION)], reason: MonitorQueue::Upsert failed, share=photo")
                .size(),
            1u);
  const Error remove = ErrorOf([&] { DeleteCORVNotifydCfg("photo"); });
  EXPECT_EQ(remove.reason, "MonitorQueue::Delete failed, share=photo");
  EXPECT_EQ(log.Matching("(DeleteCORVNotifydCfg) Failed [!MonitorQueue::Delete(share.GetQueuePath(), kAppName, "
                         "MONITOR_QUEUE_TYPE_APPLICATION)]")
                .size(),
            1u);
}

TEST(RelatedServicesTest, CleanShareIndexDataStopsAtTheFirstCompositionFailure) {
  MgmtSandbox sandbox;
  const std::string photo = sandbox.AddShare("photo");
  sandbox.MakeDir("volume1/photo/@eaDir/fileindex.db");
  std::ofstream(photo + "/@eaDir/fileindex.queue") << "{}\n";
  StatusMgr().SetShareStatus("photo", 1);
  ScopedTestPlatform platform;
  platform->fail_db_compose = true;
  LogCapture log;
  const Error error = ErrorOf([&] { CleanShareIndexData("photo", photo); });
  EXPECT_EQ(error.code, kErrorSystem);
  EXPECT_EQ(error.reason, "FILEIDXDBPathCompose failed, share_path=" + photo);
  EXPECT_EQ(log.Matching("(CleanShareIndexData) Failed [0 > FILEIDXDBPathCompose(share_path.c_str(), path, "
                         "sizeof(path))]")
                .size(),
            1u);
  EXPECT_FALSE(std::filesystem::exists(photo + "/@eaDir/fileindex.queue"));  // step 2 ran
  EXPECT_TRUE(std::filesystem::exists(photo + "/@eaDir/fileindex.db"));
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 1u);

  const Error queue = ErrorOf([] { CleanShareIndexData("photo", ""); });
  EXPECT_EQ(queue.reason, "FILEIDXQueuePathCompose failed, share_path=");
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
