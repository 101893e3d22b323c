// Listing, reading, adding and changing folders end to end in a sandbox,
// with fake fileindexd and corvelasticd.
#include "common/json_util.h"
#include "fileindex/mgmt/index_mgr.h"
#include "tests/fileindex/mgmt/mgmt_test_base.h"

namespace corvlumex {
namespace fileindex {
namespace {

// The reindex event of a folder as queued: the kinds to index again.
std::string ReindexLine(const std::string& path, const std::string& kinds) {
  return "{\"data\":" + kinds + ",\"event\":131072,\"path\":\"" + path + "\",\"path_old\":\"\"}";
}
const char kAllKinds[] = R"({"audio":true,"document":true,"photo":true,"video":true})";

class FolderUpsertTest : public testing_support::MgmtTest {
 protected:
  void SetUp() override {
    photo_ = sandbox_.AddShare("photo");
    music_ = sandbox_.AddShare("music", Json::Value(), "volume2");
    sandbox_.AddShare("ro", JsonOf(R"({"readonly": true})"));
    sandbox_.MakeDir("volume1/photo/a");
    sandbox_.MakeDir("volume1/photo/b");
  }
  std::string QueueText(const std::string& share, size_t index) const {
    return JsonToString(sandbox_.QueueEvents(share).at(index));
  }

  std::string photo_;
  std::string music_;
};

TEST_F(FolderUpsertTest, AddPreparesIndexMonitorDaemonAndReindex) {
  FolderAdd(JsonList({FolderJson("/photo/a"), FolderJson("/music", true, true, false, false),
                      FolderJson("/photo/b")}),
            false);

  // Touched shares in name order, one index each, created once.
  EXPECT_THAT(SearchCommands(), ElementsAre("index_create fileindex_music", "index_create fileindex_photo"));
  EXPECT_EQ(SearchRequests()[1]["data"]["path"].asString(), photo_ + "/@eaDir/fileindex.db");
  const Json::Value cfg = MonitorCfg("photo");
  ASSERT_EQ(cfg["config"].size(), 2u);
  EXPECT_EQ(cfg["config"][0]["path"].asString(), photo_ + "/a");
  EXPECT_EQ(MonitorCfg("music")["config"][0]["path"].asString(), music_);
  EXPECT_THAT(SavedPaths(), ElementsAre("/photo/a", "/music", "/photo/b"));
  EXPECT_THAT(NewDaemonSummaries(),
              ElementsAre("notify_setting_changed music", "notify_setting_changed photo"));
  EXPECT_TRUE(sandbox_.DaemonCommands()[1]["data"]["is_upsert"].asBool());

  // Everything in a new folder is indexed: all four kinds, whatever it selects.
  EXPECT_THAT(QueueSummaries("photo"), ElementsAre("131072 " + photo_ + "/a", "131072 " + photo_ + "/b"));
  EXPECT_EQ(QueueText("photo", 0), ReindexLine(photo_ + "/a", kAllKinds));
  EXPECT_EQ(QueueText("music", 0), ReindexLine(music_, kAllKinds));
  EXPECT_EQ(ServiceRequests().back(), "start pkg-CorvLumex-fileindexd.service");

  // A second folder of an indexed share does not create its index again.
  sandbox_.MakeDir("volume1/photo/c");
  FolderAdd(JsonList({FolderJson("/photo/c")}), false);
  EXPECT_EQ(SearchRequests().size(), 2u);
}

TEST_F(FolderUpsertTest, SetReindexesOnlyTheKindsThatChanged) {
  FolderAdd(JsonList({FolderJson("/photo/a")}), false);
  const size_t requests = SearchRequests().size();
  FolderSet(JsonList({FolderJson("/photo/a", false, true, true, false)}), false);
  EXPECT_EQ(SearchRequests().size(), requests);  // no index created for a change
  ASSERT_EQ(sandbox_.QueueEvents("photo").size(), 2u);
  EXPECT_EQ(QueueText("photo", 1),
            ReindexLine(photo_ + "/a", R"({"audio":false,"document":true,"photo":true,"video":false})"));
  EXPECT_EQ(sandbox_.DaemonCommands().size(), 2u);

  // A new folder inside an indexed one, set rather than added: only what differs
  // from the folder that governed it.
  sandbox_.MakeDir("volume1/photo/a/x");
  FolderSet(JsonList({FolderJson("/photo/a/x", false, true, false, false)}), false);
  EXPECT_EQ(QueueText("photo", 2),
            ReindexLine(photo_ + "/a/x", R"({"audio":false,"document":false,"photo":false,"video":true})"));
}

TEST_F(FolderUpsertTest, RefusalsChangeNothing) {
  FolderAdd(JsonList({FolderJson("/photo/a")}), false);
  const auto refused = [this](const Json::Value& list, bool create, ErrorCode code, const std::string& reason,
                              const std::string& condition) {
    ExpectRefused([&] { FolderUpsert(list, create, false); }, code, condition, reason);
  };
  refused(Json::Value(Json::objectValue), true, kErrorBadArgument, "{}", "!folder_list.isArray()");
  // Failures are logged under the operation's own name.
  ExpectRefused([] { FolderSet(Json::Value(Json::objectValue), false); }, kErrorBadArgument,
                "!folder_list.isArray()", "{}", "FolderUpsert");
  refused(JsonList({FolderJson("/photo/b"), FolderJson("/ro")}), true, kErrorPathCannotIndex,
          "Path cannot index: /ro", "!CanPathBeIndexed(folder_new->GetPath()) && !updater_mode");
  for (const char* twice : {"/photo/a", "/photo/b"}) {
    refused(JsonList({FolderJson("/photo/b"), FolderJson(twice)}), true, kErrorDuplicatedId,
            std::string("Duplicated ID: ") + twice, "create && folder_mgr.HasFolder(folder_new->GetPath())");
  }
  // A malformed element, and a share that does not exist.
  Json::Value no_name = FolderJson("/photo/b");
  no_name.removeMember("name");
  refused(JsonList({FolderJson("/photo/b"), FolderJson("/nosuch")}), false, kErrorShareNotFound, "", "");
  refused(JsonList({no_name}), false, kErrorBadArgument, "", "");
  ScopedFakePlatform platform;  // a full volume
  platform->QuotaIsEnoughHook = [](auto&&...) { return FakePlatform::NoSpace(); };
  refused(JsonList({FolderJson("/photo/a")}), true, kErrorNoSpace, "Share (photo) space not enough",
          "!share.IsSpaceEnough()");
}

// Once every folder is accepted the steps run in order and a failure stops
// them where it happens: what was done stays, what follows never runs.
TEST_F(FolderUpsertTest, LateFailurePropagatesAndLeavesEarlierStepsInPlace) {
  const std::string folders_before = ReadFileText(FoldersFile());
  {
    ScopedFakePlatform platform;
    platform->RefuseMonitorQueues();
    const Error error = ErrorOf([] { FolderAdd(JsonList({FolderJson("/photo/a")}), false); });
    EXPECT_EQ(error.code, kErrorSystem);
    EXPECT_EQ(error.reason, "MonitorQueue::Upsert failed, share=photo");
  }
  EXPECT_THAT(SearchCommands(), ElementsAre("index_create fileindex_photo"));
  EXPECT_EQ(ServiceRequests().back(), "start pkg-CorvLumex-fileindexd.service");
  EXPECT_EQ(ReadFileText(FoldersFile()), folders_before) << "not saved";
  EXPECT_TRUE(sandbox_.DaemonCommands().empty());
  EXPECT_TRUE(sandbox_.QueueEvents("photo").empty());

  // The lock went with the failed call; the folder is still new to the file.
  FolderAdd(JsonList({FolderJson("/photo/a")}), false);
  EXPECT_THAT(SearchCommands(), ElementsAre("index_create fileindex_photo", "index_create fileindex_photo"));
  EXPECT_EQ(sandbox_.QueueEvents("photo").size(), 1u);
}

// The updater stores refused paths without a reindex; an empty list starts
// the services and saves the same (empty) list.
TEST_F(FolderUpsertTest, UpdaterModeAndEmptyList) {
  FolderAdd(Json::Value(Json::arrayValue), false);
  EXPECT_EQ(ReadFileText(FoldersFile()), "[]\n");
  EXPECT_EQ(ServiceRequests().back(), "start pkg-CorvLumex-fileindexd.service");
  EXPECT_TRUE(SearchRequests().empty());
  EXPECT_TRUE(sandbox_.DaemonCommands().empty());
  FolderAdd(JsonList({FolderJson("/ro")}), true);
  EXPECT_THAT(SavedPaths(), ElementsAre("/ro"));
  EXPECT_THAT(SearchCommands(), ElementsAre("index_create fileindex_ro"));
  EXPECT_EQ(sandbox_.DaemonCommands().size(), 1u);
  EXPECT_TRUE(sandbox_.QueueEvents("ro").empty());
}

TEST_F(FolderUpsertTest, ListAndGet) {
  FolderAdd(JsonList({FolderJson("/photo/b"), FolderJson("/music"), FolderJson("/photo/a")}), false);
  Json::Value out;
  FolderList(out, 1, 1, "path", "ASC", Json::Value(Json::arrayValue));
  EXPECT_EQ(out["total"].asUInt(), 3u);
  EXPECT_EQ(out["offset"].asUInt(), 1u);
  ASSERT_EQ(out["folder"].size(), 1u);
  EXPECT_EQ(out["folder"][0]["path"].asString(), "/photo/a");
  EXPECT_FALSE(out["folder"][0].isMember("additional"));
  FolderList(out, 0, 0, "", "", JsonList({"status"}));
  ASSERT_EQ(out["folder"].size(), 3u);
  EXPECT_TRUE(out["folder"][2]["additional"]["status"].isMember("text"));
  FolderList(out, 10, 5, "name", "DESC", Json::Value(Json::arrayValue));
  EXPECT_EQ(JsonToString(out), "{\"folder\":[],\"offset\":10,\"total\":3}");

  FolderGet(out, "/music");
  EXPECT_EQ(out["path"].asString(), "/music");
  EXPECT_EQ(out["name"].asString(), "music");
  EXPECT_EQ(ErrorOf([&] { FolderGet(out, "/music/x"); }).code, kErrorFolderNotFound);
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
