#include <gtest/gtest.h>

#include <ctime>
#include <fstream>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/state/folder.h"
#include "fileindex/state/status_mgr.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

using testing_support::JsonOf;

// --- The record and its stored form (no platform needed) ---

TEST(FolderRecord, OptionalKeysDefaultAndAreWrittenBack) {
  const Folder folder(JsonOf(R"({"path":"/photo/2019","name":"Trip","document":true,"audio":false,
                                 "video":true,"photo":false,"extra":1})"));
  EXPECT_FALSE(folder.IsPrivileged());
  EXPECT_FALSE(folder.IsPaused());
  EXPECT_EQ(folder.GetVolumeToBeClean(), "");
  const Json::Value data = folder.GetData();
  EXPECT_EQ(data.size(), 9u);
  EXPECT_EQ(data["privileged"], false);
  EXPECT_EQ(data["paused"], false);
  EXPECT_EQ(data["volume_to_be_clean"], "");
  EXPECT_FALSE(data.isMember("extra"));
}

// The constructor takes document, audio, video, photo, privileged, paused.
TEST(FolderRecord, StoredTextKeepsTheStoredMemberOrder) {
  Folder folder("/photo/a\"b", "Name", true, false, true, false, true, false);
  folder.SetVolumeToBeClean("/volume2");
  EXPECT_EQ(folder.GetStoredText(),
            R"({"path":"/photo/a\"b","name":"Name","document":true,"audio":false,"video":true,"photo":false,)"
            R"("paused":false,"privileged":true,"volume_to_be_clean":"/volume2"})");
  // The text reads back into the same record.
  EXPECT_EQ(Folder(JsonOf(folder.GetStoredText())).GetData(), folder.GetData());
  EXPECT_EQ(folder.GetIndexCfg(), JsonOf(R"({"document":true,"audio":false,"video":true,"photo":false})"));
  const Folder paused("/s/d", "n", false, false, false, true, false, true);
  EXPECT_TRUE(paused.IsPhoto());
  EXPECT_TRUE(paused.IsPaused());
  EXPECT_FALSE(paused.IsPrivileged());
}

// A mistyped key, and the first missing key in reading order, are named; a
// mistyped optional key falls back to its default.
TEST(FolderRecord, MalformedRecordsNameTheirFault) {
  for (const auto& [text, reason] : std::vector<std::pair<std::string, std::string>>{
           {R"({"path":"/s","name":"n","document":true,"audio":true,"video":true,"photo":"yes"})",
            "Not a string, data="},
           {R"({"document":true})", "Missing property: path"},
           {R"({"path":"/s","video":true})", "Missing property: name"},
           {"[]", "Not an object"}}) {
    const Error error = ErrorOf([&] { Folder{JsonOf(text)}; });
    EXPECT_EQ(error.code, kErrorBadArgument) << text;
    EXPECT_EQ(error.reason.rfind(reason, 0), 0u) << error.reason;
  }
  const Folder lenient(JsonOf(R"({"path":"/s","name":"n","document":true,"audio":true,"video":true,"photo":true,
                                  "paused":"yes","volume_to_be_clean":[5]})"));
  EXPECT_FALSE(lenient.IsPaused());
  EXPECT_EQ(lenient.GetVolumeToBeClean(), "");
}

TEST(FolderRecord, SetShareReplacesThePathAndSetsTheCacheWithoutThePlatform) {
  Folder folder("/photo/2019/photo", "n", true, true, true, true, false, false);
  folder.SetShare("x");
  EXPECT_EQ(folder.GetShare(), "x");
  EXPECT_EQ(folder.GetPath(), "/x/2019/photo");
  Folder bare("/photo", "n", true, true, true, true, false, false);
  bare.SetShare("pics");
  EXPECT_EQ(bare.GetPath(), "/pics");
  EXPECT_EQ(ErrorOf([] { Folder("photo", "n", true, true, true, true, false, false).GetShare(); }).code,
            kErrorBadArgument);
}

TEST(FolderRecord, AdditionalMustBeAnArrayOfKnownNames) {
  const Folder folder("/s/d", "n", true, true, true, true, false, false);
  ExpectError([&] { folder.GetDataWithAdditional(Json::Value()); }, kErrorBadArgument, "null",
              "!addiitionals.isArray()", "GetDataWithAdditional");
  ExpectError([&] { folder.GetDataWithAdditional(JsonOf("[1]")); }, kErrorBadArgument, "1", "!it.isString()");
  // An empty object is not an empty list.
  EXPECT_EQ(ErrorOf([&] { folder.GetDataWithAdditional(JsonOf("{}")); }).code, kErrorBadArgument);
  ExpectError([&] { folder.GetDataWithAdditional(JsonOf(R"(["size"])")); }, kErrorBadArgument,
              "Unknown additioal: size");
  EXPECT_EQ(folder.GetDataWithAdditional(JsonOf("[]")), folder.GetData());
}

// --- Full paths and status (a sandboxed share registry) ---

class FolderStatus : public ::testing::Test {
 protected:
  FolderStatus() {
    share_dir_ = sandbox_.AddShare("photo");
    sandbox_.AddShare("locked", testing_support::JsonOf(R"({"readonly": true})"));
    queue_ = share_dir_ + "/@eaDir/fileindex.queue";
  }
  void Queue(const std::string& lines) { std::ofstream(queue_) << lines; }
  std::string Status(const Folder& folder) {
    Json::Value out;
    folder.GetStatus(out);
    EXPECT_TRUE(out["text"].isString());
    return out["text"].asString() + (out.isMember("desc") ? "/" + out["desc"].asString() : "");
  }

  Sandbox sandbox_{true, Sandbox::kFakeIndexer};
  SleepRecorder sleeps_;
  std::string share_dir_;
  std::string queue_;
};

TEST_F(FolderStatus, FullPathIsDerivedOnceAndKeptAcrossSetShare) {
  Folder folder("/photo/2019", "n", true, true, true, true, false, false);
  EXPECT_EQ(folder.GetFullPath(), share_dir_ + "/2019");
  folder.SetShare("pics");
  EXPECT_EQ(folder.GetFullPath(), share_dir_ + "/2019");
  EXPECT_EQ(Folder("/pics/2019", "n", true, true, true, true, false, false).GetShare(), "pics");
  EXPECT_EQ(ErrorOf([] { Folder("/nosuch/x", "n", true, true, true, true, false, false).GetFullPath(); }).code,
            kErrorShareNotFound);
}

TEST_F(FolderStatus, RulesApplyInTheirOrder) {
  sandbox_.Write("volume1/photo/2019/a.jpg", "x");
  const Folder folder("/photo/2019", "n", true, true, true, true, false, false);
  EXPECT_EQ(Status(folder), "finished");

  Queue("{\"event\":64,\"path\":\"" + share_dir_ + "/2019/a.jpg\"}\n");
  EXPECT_EQ(Status(folder), "processing") << "never paused counts as running";
  StatusMgr().Pause(0);
  EXPECT_EQ(Status(folder), "paused");
  sandbox_.Write("var/packages/CorvLumex/etc/fileindex.status",
                 "{\"resume_time\":" + std::to_string(time(nullptr) + 3600) + "}");
  EXPECT_EQ(Status(folder), "paused") << "resume time still ahead";
  sandbox_.Write("var/packages/CorvLumex/etc/fileindex.status",
                 "{\"resume_time\":" + std::to_string(time(nullptr) - 1) + "}");
  EXPECT_EQ(Status(folder), "processing") << "resume time passed";

  StatusMgr().SetShareStatus("photo", 2);
  EXPECT_EQ(Status(folder), "processing") << "only bit 1 asks for a reindex";
  StatusMgr().SetShareStatus("photo", 1);
  EXPECT_EQ(Status(folder), "need_reindex");

  // A path that cannot be indexed wins over everything.
  const Folder gone("/photo/missing", "n", true, true, true, true, false, false);
  EXPECT_EQ(Status(gone), "error/invalid_path");
  sandbox_.Write("var/packages/CorvLumex/etc/fileindex.status", "{\"share\":{\"locked\":1}}");
  EXPECT_EQ(Status(Folder("/locked", "n", true, true, true, true, false, false)), "error/invalid_path");
}

TEST_F(FolderStatus, StatusIsComputedBeforeAnUnknownAdditional) {
  sandbox_.Write("volume1/photo/2019/.keep", "");
  const Folder folder("/photo/2019", "n", true, true, true, true, false, false);
  StatusMgr().SetShareStatus("photo", 1);
  const Json::Value result = folder.GetDataWithAdditional(JsonOf(R"(["status"])"));
  EXPECT_EQ(result["additional"], JsonOf(R"({"status":{"text":"need_reindex"}})"));
  EXPECT_EQ(ErrorOf([&] { folder.GetDataWithAdditional(JsonOf(R"(["status","size"])")); }).reason,
            "Unknown additioal: size");
  // With an unreadable status file the status step fails first.
  sandbox_.Write("var/packages/CorvLumex/etc/fileindex.status", "{");
  EXPECT_EQ(ErrorOf([&] { folder.GetDataWithAdditional(JsonOf(R"(["status","size"])")); }).code, kErrorLoadJson);
  EXPECT_EQ(ErrorOf([&] { folder.GetDataWithAdditional(JsonOf(R"(["size","status"])")); }).code, kErrorBadArgument);
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
