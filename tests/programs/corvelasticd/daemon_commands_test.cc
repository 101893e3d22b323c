// The daemon as the library and the command line see it: every command over
// the real socket, compound answers, busy answers, restarts.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <functional>
#include <thread>

#include "common/json_util.h"
#include "fileindex/elastic/daemon_codes.h"
#include "tests/programs/corvelasticd/daemon_harness.h"

namespace corvlumex {
namespace elasticd_test {
namespace {

using Ids = std::vector<std::string>;

// Repeats `ask` while the index answers 1401 (still opening), for at most
// 30 seconds: a loaded machine can take a while to reopen it.
Json::Value WhileOpening(const std::function<Json::Value()>& ask) {
  Json::Value answer;
  testing_support::PollUntil([&] { return (answer = ask())["error"]["code"].asInt() != elasticd::kCodeOpening; }, std::chrono::seconds(30),
                             std::chrono::milliseconds(10));
  return answer;
}

class CommandsTest : public DaemonTest {};

TEST_F(CommandsTest, WordSearchesFollowRenamesDeletesAndReusedRowsCommittedAfterEarlierSearches) {
  // Searches keep the keys by row in memory once they have searched: they
  // must follow each commit, and see nothing of what is not yet committed.
  const std::string needle = R"({"match": {"_all": "needle"}})";
  for (const char* name : {"a", "b", "c"}) Upsert(std::string("/volume1/share/") + name + ".txt", "needle");
  Commit();
  EXPECT_EQ(HitIds(Search(needle)), Ids({"/volume1/share/a.txt", "/volume1/share/b.txt", "/volume1/share/c.txt"}));
  Json::Value rename;
  rename["doc_id"] = "/volume1/share/b.txt";
  rename["data"]["CORVMDPath"] = "/volume1/share/z.txt";
  ASSERT_TRUE(Run("document_set_by_id", rename)["success"].asBool());
  Json::Value remove;
  remove["doc_id"] = "/volume1/share/c.txt";
  ASSERT_EQ(Run("document_del_by_id", remove)["data"]["deleted"].asInt(), 1);
  Upsert("/volume1/share/d.txt", "needle");  // takes the deleted last row's number
  Json::Value missing;
  missing["doc_id"] = "/volume1/share/none.txt";
  missing["data"]["CORVMDPath"] = "/volume1/share/a.txt";
  EXPECT_EQ(Run("document_set_by_id", missing)["error"]["code"].asInt(), elasticd::kCodeDocumentNotFound);
  EXPECT_EQ(HitIds(Search(needle)), Ids({"/volume1/share/a.txt", "/volume1/share/b.txt", "/volume1/share/c.txt"}));
  Commit();
  EXPECT_EQ(HitIds(Search(needle)), Ids({"/volume1/share/a.txt", "/volume1/share/d.txt", "/volume1/share/z.txt"}));
  // After a restart the keys are read again.
  ASSERT_EQ(daemon_->Terminate(), 0);
  daemon_->Start();
  const Json::Value answer = WhileOpening([&] { return Search(needle); });
  EXPECT_EQ(HitIds(answer), Ids({"/volume1/share/a.txt", "/volume1/share/d.txt", "/volume1/share/z.txt"}));
}

TEST_F(CommandsTest, CompoundAnswersOneResultPerElementAndFlagsFailures) {
  Upsert("/volume1/share/t.txt", "tokyo tower");
  Commit();
  const Json::Value answer = Send(daemon_->socket_path(), Data(R"({"compound": [
      {"command": "update_term_suggestion", "data": {"doc_id_field": "CORVMDTextContent", "db_name": "fileindex_share"}},
      {"command": "update_term_suggestion", "data": {"doc_id_field": "NoSuchField", "db_name": "fileindex_share"}},
      {"command": "no_such_command", "data": {}}]})"));
  ASSERT_TRUE(answer["success"].asBool());
  EXPECT_TRUE(answer["has_fail"].asBool());
  ASSERT_EQ(answer["data"].size(), 3u);
  EXPECT_TRUE(answer["data"][0]["success"].asBool());
  EXPECT_EQ(answer["data"][1]["error"]["code"].asInt(), elasticd::kCodeBadArgument);
  EXPECT_EQ(answer["data"][2]["error"]["code"].asInt(), elasticd::kCodeUnknownCommand);
  const Json::Value suggestions = Run("suggest", R"({"field": "CORVMDTextContent", "text": "TO"})");
  ASSERT_EQ(suggestions["data"]["suggestions"].size(), 2u) << JsonToString(suggestions);
  EXPECT_EQ(suggestions["data"]["suggestions"][0]["term"].asString(), "tokyo");
}

// A kill -9 keeps what was committed and loses the rest; a paused index
// answers busy to writes, searches on, and stays paused across a restart.
TEST_F(CommandsTest, KillNineKeepsCommittedDataAndAPauseOutlivesARestart) {
  Upsert("/volume1/share/kept.txt", "durable");
  Commit();
  Upsert("/volume1/share/lost.txt", "volatile");
  daemon_->Kill9();
  daemon_->Start();
  // Named, the index answers 1401 while it reopens (unnamed, a search waits for it, then answers 1401 too).
  const Json::Value answer = WhileOpening([&] { return Search(R"({"match_all": {}})", R"({"id": "fileindex_share"})"); });
  EXPECT_EQ(HitIds(answer), Ids({"/volume1/share/kept.txt"})) << JsonToString(answer);
  ASSERT_TRUE(Run("index_pause")["success"].asBool());
  Json::Value data;
  data["doc_id"] = "/volume1/share/new.txt";
  data["data"] = FileDocument("/volume1/share/new.txt", "", 1);
  EXPECT_EQ(Run("document_upsert_by_id", data)["error"]["code"].asInt(), elasticd::kCodeBusy);
  EXPECT_EQ(Search(R"({"match": {"_all": "durable"}})")["data"]["total"].asInt(), 1);
  ASSERT_EQ(daemon_->Terminate(), 0);
  daemon_->Start();
  const Json::Value reopened = WhileOpening([&] { return Run("document_upsert_by_id", data); });
  EXPECT_EQ(reopened["error"]["code"].asInt(), elasticd::kCodeBusy);
  ASSERT_TRUE(Run("index_resume")["success"].asBool());
  EXPECT_TRUE(Run("document_upsert_by_id", data)["success"].asBool());
  Commit();
  EXPECT_EQ(Search(R"({"match_all": {}})")["data"]["total"].asInt(), 2);
}

// Moving refuses to overwrite another database; a renamed share takes its
// metadata folder, and so the database, along before the index is told: the
// daemon adopts what it finds at the new place.
TEST_F(CommandsTest, ConfigSetMovesOrAdoptsTheDatabaseButNeverOverwritesAnother) {
  const std::string other = root_.path() + "/volume2/other/@eaDir/index";
  std::filesystem::create_directories(other);
  { std::ofstream(other + "/corvelasticd.db") << "someone else's"; }
  EXPECT_FALSE(Run("index_config_set", R"({"data": {"id": "fileindex_other", "path": ")" + other + R"("}})")["success"].asBool());
  EXPECT_TRUE(Run("search", R"({"id": "fileindex_share"})")["success"].asBool());

  Upsert("/volume1/share/m.txt", "moving");
  const std::string moved = root_.path() + "/volume2/share2/@eaDir/index";
  ASSERT_TRUE(Run("index_config_set", R"({"data": {"id": "fileindex_share2", "path": ")" + moved + R"("}})")["success"].asBool())
      << daemon_->LogText();
  struct stat info;
  EXPECT_EQ(stat((moved + "/corvelasticd.db").c_str(), &info), 0);
  EXPECT_EQ(Run("commit")["error"]["code"].asInt(), elasticd::kCodeIndexNotFound);
  EXPECT_EQ(Run("search", R"({"id": "fileindex_share2", "query": {"qsl": {"match": {"_all": "moving"}}}})")["data"]["total"].asInt(), 1);

  ASSERT_EQ(rename((root_.path() + "/volume2/share2").c_str(), (root_.path() + "/volume2/share3").c_str()), 0);
  ASSERT_TRUE(Run("index_config_set", R"({"id": "fileindex_share2", "data": {"id": "fileindex_share3", "path": ")" +
                                          root_.path() + R"(/volume2/share3/@eaDir/index"}})")["success"].asBool()) << daemon_->LogText();
  daemon_->Kill9();
  daemon_->Start();
  const Json::Value again = WhileOpening(
      [&] { return Run("search", R"({"id": "fileindex_share3", "query": {"qsl": {"match": {"_all": "moving"}}}})"); });
  EXPECT_EQ(again["data"]["total"].asInt(), 1) << JsonToString(again);
}

TEST_F(CommandsTest, IndexLifecycleOverOneConnection) {
  // Several requests on one connection, each answered in turn.
  const int fd = ConnectTo(daemon_->socket_path());
  ASSERT_GE(fd, 0);
  const auto ask = [&](const std::string& command, Json::Value data) {
    if (!data.isMember("id")) data["id"] = kIndex;
    Json::Value request;
    request["command"] = command;
    request["data"] = data;
    return Exchange(fd, request);
  };
  const auto create = [&](const std::string& id, const std::string& path) {
    Json::Value data;
    data["id"] = id;
    data["path"] = root_.path() + path;
    data["mappings"] = LibraryMappings();
    data["event_handler"]["lib_path"] = root_.path() + "/no/such/handler.so";
    return ask("index_create", data);
  };
  const Json::Value again = create(kIndex, "/volume1/share/@eaDir/index");
  EXPECT_TRUE(again["success"].asBool()) << "the same index again is harmless";
  EXPECT_FALSE(again["data"]["created"].asBool());
  EXPECT_EQ(create(kIndex, "/elsewhere")["error"]["code"].asInt(), elasticd::kCodeIndexExists);
  // A missing event handler is said once, however many indexes name it.
  ASSERT_TRUE(create("fileindex_b", "/b")["success"].asBool());
  EXPECT_TRUE(ask("commit", Data(R"({"id": "fileindex_b"})"))["success"].asBool());
  EXPECT_TRUE(ask("commit", Json::Value())["success"].asBool());
  const std::string log = daemon_->LogText();
  const size_t first = log.find("handler.so is not installed");
  EXPECT_NE(first, std::string::npos) << log;
  EXPECT_EQ(log.find("handler.so is not installed", first + 1), std::string::npos) << log;

  ASSERT_TRUE(ask("index_delete", Json::Value())["success"].asBool());
  struct stat info;
  EXPECT_NE(stat((root_.path() + "/volume1/share/@eaDir/index/corvelasticd.db").c_str(), &info), 0);
  EXPECT_EQ(ask("commit", Json::Value())["error"]["code"].asInt(), elasticd::kCodeIndexNotFound);
  EXPECT_EQ(ask("index_delete", Json::Value())["error"]["code"].asInt(), elasticd::kCodeIndexNotFound);
  close(fd);
}

// The daemon started with one of its limits.
class OpeningDaemonTest : public CommandsTest {
  std::vector<std::string> ExtraArgs() override { return {"--test-open-delay-ms", "3000"}; }
};

TEST_F(OpeningDaemonTest, AnIndexStillOpeningAnswers1401) {
  Upsert("/volume1/share/o.txt");
  Commit();
  daemon_->Kill9();
  daemon_->Start();
  const Json::Value answer = Search(R"({"match_all": {}})", R"({"id": "fileindex_share"})");
  EXPECT_EQ(answer["error"]["code"].asInt(), elasticd::kCodeOpening) << JsonToString(answer);
  EXPECT_EQ(Run("document_del_by_id", R"({"doc_id": "/volume1/share/o.txt"})")["error"]["code"].asInt(), elasticd::kCodeOpening);
  // A search naming no index waits a little for it and then says it is still
  // opening: never an answer that silently leaves it out.
  const Json::Value unnamed = Search(R"({"match_all": {}})");
  if (unnamed["success"].asBool()) {
    EXPECT_EQ(HitIds(unnamed), Ids({"/volume1/share/o.txt"}));
  } else {
    EXPECT_EQ(unnamed["error"]["code"].asInt(), elasticd::kCodeOpening) << JsonToString(unnamed);
  }
}

class BacklogDaemonTest : public CommandsTest {
  std::vector<std::string> ExtraArgs() override { return {"--max-writer-backlog", "0"}; }
};

TEST_F(BacklogDaemonTest, WritesOverTheBacklogBoundAnswer1400) {
  Json::Value data;
  data["doc_id"] = "/volume1/share/x";
  data["data"] = FileDocument("/volume1/share/x", "", 1);
  const Json::Value answer = Run("document_upsert_by_id", data);
  EXPECT_EQ(answer["error"]["code"].asInt(), elasticd::kCodeBusy);
  EXPECT_NE(answer["error"]["msg"].asString().find("too many writes"), std::string::npos);
}

// The test plug-in writes one line per event to the file named in its environment.
class EventHandlerTest : public DaemonTest {
 protected:
  void SetUp() override {
    setenv("CORVELASTICD_TEST_HANDLER_OUT", events_.c_str(), 1);
    DaemonTest::SetUp();
  }
  void TearDown() override { unsetenv("CORVELASTICD_TEST_HANDLER_OUT"); }
  std::string HandlerPath() override { return CORVELASTICD_TEST_HANDLER; }
  const std::string events_ = root_.path() + "/events.txt";
};

TEST_F(EventHandlerTest, ThePluginIsLoadedAndToldOfEachCommit) {
  Upsert("/v/s/a.txt");
  Commit();
  ASSERT_TRUE(Run("document_del_by_id", R"({"doc_id": "/v/s/a.txt"})")["success"].asBool());
  Commit();
  Commit();  // nothing changed: no event
  ASSERT_EQ(daemon_->Terminate(), 0);
  EXPECT_EQ(testing_support::ReadFileText(events_),
            "open fileindex_share\n"
            "commit fileindex_share +1 -0 +/v/s/a.txt\n"
            "commit fileindex_share +0 -1 -/v/s/a.txt\n"
            "close fileindex_share\n");
}

}  // namespace
}  // namespace elasticd_test
}  // namespace corvlumex
