#include "fileindex/elastic/elastic_control.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/elastic/daemon_codes.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/state/status_mgr.h"
#include "platform/linux/linux_platform.h"
#include "tests/fileindex/elastic/fake_search_daemon.h"
#include "tests/support/fake_platform.h"
#include "tests/support/log_capture.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace elastic {
namespace {

using testing_support::FakeAnswer;
using testing_support::ErrorOrNone;
using testing_support::FakePlatform;
using testing_support::FakeSearchDaemon;
using testing_support::JsonOf;
using testing_support::LogCapture;
using testing_support::Sandbox;
using testing_support::SleepRecorder;

class ElasticControlTest : public ::testing::Test {
 protected:
  ElasticControlTest() {
    share_path_ = root_.MakeDir("volume1/music");
    // Where the status file and its lock live.
    root_.MakeDir("tmp");
    root_.MakeDir("var/packages/CorvLumex/etc");
    root_.registry().Add("music", share_path_);
    // A scripted extractor, a volume that can be full and a notification tool that only records its calls.
    platform_->ParseFileHook = [this](const std::string& path, const Json::Value& options, Json::Value& document) {
      parsed_options_.push_back(options);
      if (extract_fails_) throw std::runtime_error("cannot read " + path);
      document = JsonOf(R"({"CORVMDFSName": "song.mp3", "CORVMDFSSize": 42})");
    };
    platform_->QuotaIsEnoughHook = [this](auto&&...) { return volume_full_ ? FakePlatform::NoSpace() : 1; };
    platform_->ExecHook = [this](const std::string&, const std::vector<std::string>& args, int) {
      for (const std::string& arg : args) notices_.push_back(arg);
      return 0;
    };
  }
  int Notices(const std::string& message_key) const { return std::count(notices_.begin(), notices_.end(), message_key); }

  Sandbox root_;
  SleepRecorder sleeps_;
  LogCapture log_;
  FakeSearchDaemon daemon_;
  testing_support::ScopedFakePlatform platform_;
  bool extract_fails_ = false;
  bool volume_full_ = false;
  std::vector<Json::Value> parsed_options_;
  std::vector<std::string> notices_;  // every argument of every notice
  std::string share_path_;
};

// The look whether a restarted daemon can take the share's requests: one
// "index_list", never the busy retry's sleep.
TEST_F(ElasticControlTest, AnIndexIsReadyUnlessTheDaemonIsBusyOrStillOpeningIt) {
  const struct {
    const char* name;
    FakeAnswer answer;
    bool ready;
  } cases[] = {
      {"opening", FakeAnswer::Success(JsonOf(R"([{"id": "fileindex_music", "state": "opening"}])")), false},
      {"busy", FakeAnswer::Failure(elasticd::kCodeOpening, "opening"), false},
      {"ready", FakeAnswer::Success(JsonOf(R"([{"id": "fileindex_other", "state": "opening"},
                                                {"id": "fileindex_music", "state": "ready"}])")), true},
      {"not listed", FakeAnswer::Success(JsonOf("[]")), true},
      {"another failure", FakeAnswer::Failure(elasticd::kCodeBadRequest, "bad request"), true},
  };
  for (const auto& c : cases) {
    daemon_.Enqueue(c.answer);
    EXPECT_EQ(IsIndexReady("music"), c.ready) << c.name;
    EXPECT_EQ(daemon_.Requests().back(), JsonOf(R"({"command": "index_list"})")) << c.name;
  }
  EXPECT_TRUE(sleeps_.Sleeps().empty());
}

// Each command's request, exactly; an empty list of suggestion fields sends nothing.
TEST_F(ElasticControlTest, ShareIndexCommandsCarryTheirEnvelopes) {
  Json::Value create = JsonOf(R"({"command": "index_create", "data": {"id": "fileindex_music"}})");
  create["data"]["path"] = share_path_ + "/@eaDir/fileindex.db";
  create["data"]["settings"] = GetFileIndexSettings();
  create["data"]["mappings"] = GetFileIndexMappings();
  create["data"]["event_handler"] = GetFileIndexEventHandler();
  const struct {
    std::function<void()> run;
    std::string expected;
  } cases[] = {
      {[] { ShareIndexCreate("music"); }, JsonToString(create)},
      {[] { ShareIndexDelete("music"); }, R"({"command": "index_delete", "data": {"id": "fileindex_music"}})"},
      {[] { ShareIndexPause("music"); }, R"({"command": "index_pause", "data": {"id": "fileindex_music"}})"},
      // The index id is the prefix and the share name unchanged.
      {[] { ShareIndexPause("Music Share"); },
       R"({"command": "index_pause", "data": {"id": "fileindex_Music Share"}})"},
      {[] { ShareIndexResume("music"); }, R"({"command": "index_resume", "data": {"id": "fileindex_music"}})"},
      {[] { ShareIndexRename("music", "audio", "/volume2/audio/@eaDir/fileindex.db"); },
       R"({"command": "index_config_set", "data": {"id": "fileindex_music",
           "data": {"id": "fileindex_audio", "path": "/volume2/audio/@eaDir/fileindex.db"}}})"},
      {[] { ShareIndexMigrate("music", "/volume2/music/@eaDir/fileindex.db"); },
       R"({"command": "index_config_set", "data": {"id": "fileindex_music",
           "data": {"path": "/volume2/music/@eaDir/fileindex.db"}}})"},
      {[] { IndexDel("music", "/volume1/music/a.mp3"); },
       R"({"command": "document_del_by_id", "data": {"id": "fileindex_music", "doc_id": "/volume1/music/a.mp3"}})"},
      {[] { IndexDelDir("music", "/volume1/music/b"); },
       R"({"command": "document_del_by_query", "data": {"id": "fileindex_music",
           "query": {"qsl": {"prefix": {"CORVMDPath": "/volume1/music/b/"}}}}})"},
      {[] { IndexCommit("music"); }, R"({"command": "commit", "data": {"id": "fileindex_music"}})"},
      {[] {
         UpdateTermSuggestion("fileindex_music", {"CORVMDFSName", "CORVMDTitle"});
         UpdateTermSuggestion("fileindex_music", {});
       },
       R"({"compound": [
           {"command": "update_term_suggestion",
            "data": {"doc_id_field": "CORVMDFSName", "db_name": "fileindex_music"}},
           {"command": "update_term_suggestion",
            "data": {"doc_id_field": "CORVMDTitle", "db_name": "fileindex_music"}}]})"},
  };
  size_t index = 0;
  for (const auto& c : cases) {
    c.run();
    ASSERT_EQ(daemon_.Requests().size(), ++index);
    EXPECT_EQ(daemon_.Requests().back(), JsonOf(c.expected)) << c.expected;
  }
  // Only a share the registry knows gets an index.
  EXPECT_THROW(ShareIndexCreate("nosuch"), Error);
  EXPECT_EQ(daemon_.Requests().size(), index);
}

TEST_F(ElasticControlTest, UpsertSendsTheExtractedDocumentWithItsSearchName) {
  IndexUpsert("music", "/volume1/music/song.mp3", true);
  IndexAttr("music", "/volume1/music/song.mp3");
  const auto requests = daemon_.Requests();
  ASSERT_EQ(requests.size(), 2u);
  const Json::Value document = JsonOf(R"({"CORVMDFSName": "song.mp3", "CORVMDFSSize": 42,
                                         "CORVMDSearchFileName": "song.mp3"})");
  Json::Value expected = JsonOf(R"({"command": "document_upsert_by_id",
      "data": {"id": "fileindex_music", "doc_id": "/volume1/music/song.mp3"}})");
  expected["data"]["data"] = document;
  EXPECT_EQ(requests[0], expected);
  expected["command"] = "document_set_by_id";
  EXPECT_EQ(requests[1], expected);
  ASSERT_EQ(parsed_options_.size(), 2u);
  EXPECT_EQ(parsed_options_[0], JsonOf(R"({"need_meta": true})"));
  EXPECT_EQ(parsed_options_[1], JsonOf(R"({"need_meta": false})")) << "attributes never need metadata";
}

TEST_F(ElasticControlTest, DocumentThatCannotBeExtractedIsNotSent) {
  extract_fails_ = true;
  for (const auto& run : {std::function<void()>([] { IndexUpsert("music", "/volume1/music/x.pdf", false); }),
                          std::function<void()>([] { IndexAttr("music", "/volume1/music/x.pdf"); })}) {
    const Error error = ErrorOrNone(run);
    EXPECT_EQ(error.code, kErrorParseDocument);
    EXPECT_EQ(error.reason, "Parse failed, path=/volume1/music/x.pdf");
  }
  EXPECT_TRUE(daemon_.Requests().empty());
  EXPECT_EQ(log_.Matching("cannot read /volume1/music/x.pdf").size(), 2u) << "the extractor's reason is kept";
}

TEST_F(ElasticControlTest, RenameRewritesTheFolderAndEveryDescendantByPosition) {
  daemon_.Enqueue(FakeAnswer::Success());
  daemon_.Enqueue(FakeAnswer::Success(JsonOf(R"([
      {"CORVMDPath": "/v/s/a/x", "CORVMDFSName": "x", "CORVMDParent": "/v/s/a"},
      {"CORVMDPath": "/v/s/a/x/y.txt", "CORVMDFSName": "y.txt", "CORVMDParent": "/v/s/a/x"}])")));
  IndexRename("s", "/v/s/a", "/v/s/b.Dir");
  const auto requests = daemon_.Requests();
  ASSERT_EQ(requests.size(), 3u);
  EXPECT_EQ(requests[0], JsonOf(R"({"command": "document_set_by_id", "data": {"id": "fileindex_s",
      "doc_id": "/v/s/a", "data": {"CORVMDPath": "/v/s/b.Dir", "CORVMDParent": "/v/s",
      "CORVMDFSName": "b.Dir", "CORVMDSearchFileName": "b.Dir", "CORVMDDisplayName": "b.Dir",
      "CORVMDKind": "dir", "CORVMDExtension": "dir"}}})"));
  EXPECT_EQ(requests[1], JsonOf(R"({"command": "document_get_by_query", "data": {"id": "fileindex_s",
      "query": {"qsl": {"prefix": {"CORVMDPath": "/v/s/a/"}},
                "load_field": ["CORVMDPath", "CORVMDFSName", "CORVMDParent"]}}})"));
  EXPECT_EQ(requests[2], JsonOf(R"({"compound": [
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/a/x",
       "data": {"CORVMDParent": "/v/s/b.Dir", "CORVMDPath": "/v/s/b.Dir/x", "CORVMDSearchFileName": "x"}}},
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/a/x/y.txt",
       "data": {"CORVMDParent": "/v/s/b.Dir/x", "CORVMDPath": "/v/s/b.Dir/x/y.txt",
                "CORVMDSearchFileName": "y.txt"}}}]})"));
  // Without descendants, the compound is empty.
  daemon_.Enqueue(FakeAnswer::Success());
  daemon_.Enqueue(FakeAnswer::Success(Json::Value(Json::arrayValue)));
  IndexRename("s", "/v/s/a.txt", "/v/s/b.txt");
  ASSERT_EQ(daemon_.Requests().size(), 6u);
  EXPECT_EQ(daemon_.Requests()[5], JsonOf(R"({"compound": []})"));
}

TEST_F(ElasticControlTest, QueryAnswerWithoutADocumentListIs916) {
  daemon_.Enqueue(FakeAnswer::Success());
  daemon_.Enqueue(FakeAnswer::Success(JsonOf(R"({"CORVMDPath": "/v/s/a/x"})")));
  daemon_.Enqueue(FakeAnswer::Raw(R"({"success": true})"));
  const Error error = ErrorOrNone([] { IndexRename("s", "/v/s/a", "/v/s/b"); });
  EXPECT_EQ(error.code, kErrorQueryAnswer);
  EXPECT_EQ(daemon_.Requests().size(), 2u) << "nothing rewritten";
  std::vector<std::string> paths;
  EXPECT_THROW(IndexGetByPrefixPath("s", "/v/s/a", paths), Error);
  EXPECT_EQ(log_.Matching("Failed [!res.isMember(\"data\") || !res[\"data\"].isArray()]").size(), 2u);
}

TEST_F(ElasticControlTest, PrefixQueryAppendsThePathsInAnswerOrder) {
  daemon_.Enqueue(FakeAnswer::Success(JsonOf(R"([{"CORVMDPath": "/v/s/a/z"}, {"CORVMDPath": "/v/s/a/b"}])")));
  daemon_.Enqueue(FakeAnswer::Success(Json::Value(Json::arrayValue)));
  std::vector<std::string> paths = {"/kept"};
  IndexGetByPrefixPath("s", "/v/s/a", paths);
  IndexGetByPrefixPath("s", "/v/s/empty", paths);
  EXPECT_EQ(paths, (std::vector<std::string>{"/kept", "/v/s/a/z", "/v/s/a/b"}));
  EXPECT_EQ(daemon_.Requests()[0], JsonOf(R"({"command": "document_get_by_query", "data": {"id": "fileindex_s",
      "query": {"qsl": {"prefix": {"CORVMDPath": "/v/s/a/"}}, "load_field": ["CORVMDPath"]}}})"));
}

TEST_F(ElasticControlTest, OnlyBusyAnswersAreRetriedWithLongSleepsAndOneMemoryNoticeAfterTen) {
  daemon_.Enqueue(FakeAnswer::Failure(elasticd::kCodeBusy, "busy"), 10);
  ShareIndexPause("music");
  EXPECT_EQ(sleeps_.Sleeps().size(), 10u);
  EXPECT_EQ(Notices("error:lack_of_memory"), 0) << "ten busy answers send no notice";
  daemon_.Enqueue(FakeAnswer::Failure(elasticd::kCodeBusy, "busy"), 7);
  daemon_.Enqueue(FakeAnswer::Failure(elasticd::kCodeOpening, "not ready"), 6);
  ShareIndexDelete("music");
  EXPECT_EQ(daemon_.Requests().size(), 11u + 14u);
  const auto sleeps = sleeps_.Sleeps();
  ASSERT_EQ(sleeps.size(), 10u + 13u);
  for (const auto& sleep : sleeps) {
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(sleep).count();
    EXPECT_TRUE(seconds >= 900 && seconds <= 1140 && seconds % 60 == 0) << seconds;
  }
  const auto retries = log_.Matching("since corvelasticd is busy. Command: index_delete, db: fileindex_music");
  ASSERT_EQ(retries.size(), 13u);
  EXPECT_NE(retries.front().find("Retry[0]"), std::string::npos);
  EXPECT_NE(retries.back().find("Retry[12]"), std::string::npos);
  EXPECT_EQ(Notices("error:lack_of_memory"), 1);
  // A busy sub-request sends the whole compound again.
  daemon_.Enqueue(FakeAnswer::Raw(R"({"success": true, "has_fail": true, "data": [
      {"success": true}, {"success": false, "error": {"code": 1401, "msg": "not ready"}}]})"));
  UpdateTermSuggestion("fileindex_music", {"CORVMDFSName", "CORVMDTitle"});
  ASSERT_EQ(daemon_.Requests().size(), 25u + 2u);
  EXPECT_EQ(daemon_.Requests()[25], daemon_.Requests()[26]);
  EXPECT_EQ(sleeps_.Sleeps().size(), 23u + 1u);
  // Other failures are not retried.
  daemon_.Enqueue(FakeAnswer::Failure(1300, "no such index"));
  const Error error = ErrorOrNone([] { ShareIndexResume("music"); });
  EXPECT_EQ(error.code, 1300);
  EXPECT_EQ(error.reason, "Request failed, msg=no such index");
  EXPECT_EQ(daemon_.Requests().size(), 28u);
  EXPECT_EQ(sleeps_.Sleeps().size(), 24u);
}

TEST_F(ElasticControlTest, CommitFailureMarksTheShareOnlyOnAFullVolume) {
  for (const bool full : {false, true}) {
    volume_full_ = full;
    daemon_.Enqueue(FakeAnswer::Failure(1300, "write failed"));
    const Error error = ErrorOrNone([] { IndexCommit("music"); });
    EXPECT_EQ(error.code, full ? kErrorNoSpace : 1300);
    EXPECT_EQ(error.reason, full ? "Share (music) space not enough" : "Request failed, msg=write failed");
    EXPECT_EQ(StatusMgr().GetShareStatus("music"), full ? 1u : 0u);
  }
}

}  // namespace
}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex
