// The daemon as the library and the command line see it: every command over
// the real socket, compound answers, busy answers, restarts.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <functional>
#include <thread>
#include <fstream>
#include <sstream>

#include "common/json_util.h"
#include "tests/corvelasticd/daemon_harness.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace elasticd_test {
namespace {

// Repeats `ask` while the index answers 1401 (still opening), for at most
// 30 seconds: a loaded machine can take a while to reopen it.
Json::Value WhileOpening(const std::function<Json::Value()>& ask) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  Json::Value answer = ask();
  while (answer["error"]["code"].asInt() == 1401 && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
    answer = ask();
  }
  return answer;
}

using testing_support::SandboxRoot;

constexpr const char* kIndex = "fileindex_share";

Json::Value Data(const std::string& text) {
  Json::Value value;
  JsonFromString(value, text);
  return value;
}

class DaemonTest : public ::testing::Test {
 protected:
  void SetUp() override {
    daemon_ = std::make_unique<Daemon>(root_.path(), ExtraArgs());
    daemon_->Start();
    Json::Value data;
    data["id"] = kIndex;
    data["path"] = root_.path() + "/volume1/share/@eaDir/index";
    data["settings"] = Json::Value(Json::objectValue);
    data["mappings"] = LibraryMappings();
    data["event_handler"]["lib_path"] = root_.path() + "/no/such/handler.so";
    const Json::Value answer = Run("index_create", data);
    ASSERT_TRUE(answer["success"].asBool()) << JsonToString(answer);
  }

  virtual std::vector<std::string> ExtraArgs() { return {}; }

  Json::Value Run(const std::string& command, Json::Value data) {
    if (!data.isMember("id") && command != "search" && command != "suggest") data["id"] = kIndex;
    return Command(daemon_->socket_path(), command, data);
  }

  void Upsert(const std::string& path, const std::string& text = "", long long size = 1) {
    Json::Value data;
    data["doc_id"] = path;
    data["data"] = FileDocument(path, text, size);
    const Json::Value answer = Run("document_upsert_by_id", data);
    ASSERT_TRUE(answer["success"].asBool()) << JsonToString(answer);
  }

  void Commit() { ASSERT_TRUE(Run("commit", Json::Value(Json::objectValue))["success"].asBool()); }

  Json::Value Search(const std::string& qsl, const std::string& extra = "{}") {
    Json::Value data = Data(extra);
    data["query"]["qsl"] = Data(qsl);
    return Run("search", data);
  }

  std::vector<std::string> Paths(const std::string& prefix) {
    Json::Value data;
    data["query"]["qsl"]["prefix"]["CORVMDPath"] = prefix;
    data["query"]["load_field"].append("CORVMDPath");
    std::vector<std::string> paths;
    const Json::Value answer = Run("document_get_by_query", data);
    EXPECT_TRUE(answer["success"].asBool()) << JsonToString(answer);
    for (const Json::Value& doc : answer["data"]) paths.push_back(doc["CORVMDPath"].asString());
    return paths;
  }

  SandboxRoot root_;
  std::unique_ptr<Daemon> daemon_;
};

TEST_F(DaemonTest, WritesBecomeVisibleToSearchesAtCommitButTheWriterSeesThemAtOnce) {
  Upsert("/volume1/share/a/report.txt", "quarterly figures");
  EXPECT_EQ(Search(R"({"match": {"_all": "quarterly"}})")["data"]["total"].asInt(), 0);
  EXPECT_EQ(Paths("/volume1/share/a/"), std::vector<std::string>({"/volume1/share/a/report.txt"}));
  Commit();
  const Json::Value answer = Search(R"({"match": {"_all": "quarterly"}})");
  EXPECT_EQ(HitIds(answer), std::vector<std::string>({"/volume1/share/a/report.txt"}));
  EXPECT_EQ(answer["data"]["hits"][0]["index"].asString(), kIndex);
  EXPECT_EQ(answer["data"]["hits"][0]["fields"]["CORVMDTextContent"].asString(), "quarterly figures");
}

TEST_F(DaemonTest, WordQueriesThroughTheWriterSeeUncommittedWritesInOrder) {
  // Word-index rows wait for the commit; queries through the writer and the
  // commit itself must still see every change, in the order it was made.
  Upsert("/volume1/share/a.txt", "alpha beta");
  Upsert("/volume1/share/b.txt", "alpha");
  Json::Value get;
  get["query"]["qsl"]["match"]["_all"] = "alpha";
  get["query"]["load_field"].append("CORVMDPath");
  EXPECT_EQ(Run("document_get_by_query", get)["data"].size(), 2u);
  Json::Value bad;
  bad["doc_id"] = "/volume1/share/a.txt";
  bad["data"]["CORVMDFSSize"] = "not a number";
  EXPECT_EQ(Run("document_set_by_id", bad)["error"]["code"].asInt(), 2021);
  Upsert("/volume1/share/a.txt", "gamma");
  Json::Value del;
  del["query"]["qsl"]["match"]["_all"] = "alpha";
  EXPECT_EQ(Run("document_del_by_query", del)["data"]["deleted"].asInt(), 1);
  Upsert("/volume1/share/c.txt", "beta gamma");
  Commit();
  EXPECT_EQ(HitIds(Search(R"({"match": {"_all": "gamma"}})")),
            std::vector<std::string>({"/volume1/share/a.txt", "/volume1/share/c.txt"}));
  EXPECT_EQ(HitIds(Search(R"({"match": {"_all": "beta"}})")), std::vector<std::string>({"/volume1/share/c.txt"}));
  EXPECT_EQ(Search(R"({"match": {"_all": "alpha"}})")["data"]["total"].asInt(), 0);
}

TEST_F(DaemonTest, UpsertReplacesTheWholeDocument) {
  Upsert("/volume1/share/a.txt", "old words", 5);
  Upsert("/volume1/share/a.txt", "", 7);
  Commit();
  EXPECT_EQ(Search(R"({"match": {"_all": "old"}})")["data"]["total"].asInt(), 0);
  const Json::Value answer = Search(R"({"term": {"CORVMDFSSize": 7}})");
  ASSERT_EQ(answer["data"]["total"].asInt(), 1);
  EXPECT_FALSE(answer["data"]["hits"][0]["fields"].isMember("CORVMDTextContent"));
}

TEST_F(DaemonTest, SetByIdMergesFieldsAndKeepsTheKey) {
  Upsert("/volume1/share/a.txt", "alpha", 5);
  Json::Value data;
  data["doc_id"] = "/volume1/share/a.txt";
  data["data"]["CORVMDFSSize"] = 9;
  ASSERT_TRUE(Run("document_set_by_id", data)["success"].asBool());
  Commit();
  const Json::Value answer = Search(R"({"match": {"_all": "alpha"}})");
  ASSERT_EQ(HitIds(answer), std::vector<std::string>({"/volume1/share/a.txt"}));
  EXPECT_EQ(answer["data"]["hits"][0]["fields"]["CORVMDFSSize"].asInt(), 9);
}

TEST_F(DaemonTest, SetByIdOfAMissingDocumentIsAnError) {
  Json::Value data;
  data["doc_id"] = "/volume1/share/none";
  data["data"]["CORVMDFSSize"] = 9;
  const Json::Value answer = Run("document_set_by_id", data);
  EXPECT_FALSE(answer["success"].asBool());
  EXPECT_EQ(answer["error"]["code"].asInt(), 2020);
}

// Saving by writing a temporary file and renaming it over the original must
// leave exactly one document, reachable under the final path.
TEST_F(DaemonTest, RenameOverAnExistingFileLeavesOneDocumentUnderTheNewKey) {
  Upsert("/volume1/share/doc.txt", "first version");
  Upsert("/volume1/share/.doc.txt.tmp", "second version");
  Json::Value rename;
  rename["doc_id"] = "/volume1/share/.doc.txt.tmp";
  rename["data"]["CORVMDPath"] = "/volume1/share/doc.txt";
  rename["data"]["CORVMDFSName"] = "doc.txt";
  rename["data"]["CORVMDSearchFileName"] = "doc.txt";
  ASSERT_TRUE(Run("document_set_by_id", rename)["success"].asBool());
  EXPECT_EQ(Paths("/volume1/share/"), std::vector<std::string>({"/volume1/share/doc.txt"}));
  Json::Value attr;
  attr["doc_id"] = "/volume1/share/doc.txt";
  attr["data"]["CORVMDFSSize"] = 42;
  ASSERT_TRUE(Run("document_set_by_id", attr)["success"].asBool());
  Commit();
  const Json::Value answer = Search(R"({"match": {"_all": "version"}})");
  ASSERT_EQ(HitIds(answer), std::vector<std::string>({"/volume1/share/doc.txt"}));
  EXPECT_EQ(answer["data"]["hits"][0]["fields"]["CORVMDTextContent"].asString(), "second version");
  EXPECT_EQ(answer["data"]["hits"][0]["fields"]["CORVMDFSSize"].asInt(), 42);
  Json::Value del;
  del["doc_id"] = "/volume1/share/doc.txt";
  EXPECT_EQ(Run("document_del_by_id", del)["data"]["deleted"].asInt(), 1);
  EXPECT_TRUE(Paths("/volume1/share/").empty());
}

// The library's folder rename: the folder first, then its descendants found
// by an uncommitted prefix query, then one compound of path rewrites.
TEST_F(DaemonTest, FolderRenameAsTheLibrarySendsIt) {
  Upsert("/volume1/share/a");
  Upsert("/volume1/share/a/x");
  Upsert("/volume1/share/a/x/f.txt", "inside");
  Upsert("/volume1/share/a2/g.txt");
  Json::Value folder;
  folder["doc_id"] = "/volume1/share/a";
  folder["data"]["CORVMDPath"] = "/volume1/share/b";
  folder["data"]["CORVMDParent"] = "/volume1/share";
  ASSERT_TRUE(Run("document_set_by_id", folder)["success"].asBool());
  Json::Value query;
  query["query"]["qsl"]["prefix"]["CORVMDPath"] = "/volume1/share/a/";
  for (const char* field : {"CORVMDPath", "CORVMDFSName", "CORVMDParent"}) query["query"]["load_field"].append(field);
  const Json::Value descendants = Run("document_get_by_query", query);
  ASSERT_EQ(descendants["data"].size(), 2u) << JsonToString(descendants);
  Json::Value compound;
  for (const Json::Value& doc : descendants["data"]) {
    const std::string parent = "/volume1/share/b" + doc["CORVMDParent"].asString().substr(std::string("/volume1/share/a").size());
    Json::Value element;
    element["command"] = "document_set_by_id";
    element["data"]["id"] = kIndex;
    element["data"]["doc_id"] = doc["CORVMDPath"];
    element["data"]["data"]["CORVMDParent"] = parent;
    element["data"]["data"]["CORVMDPath"] = parent + "/" + doc["CORVMDFSName"].asString();
    compound["compound"].append(element);
  }
  const Json::Value answer = Send(daemon_->socket_path(), compound);
  EXPECT_FALSE(answer["has_fail"].asBool()) << JsonToString(answer);
  EXPECT_EQ(Paths("/volume1/share/b/"), std::vector<std::string>({"/volume1/share/b/x", "/volume1/share/b/x/f.txt"}));
  EXPECT_TRUE(Paths("/volume1/share/a/").empty());
  EXPECT_EQ(Paths("/volume1/share/a2/"), std::vector<std::string>({"/volume1/share/a2/g.txt"}));
}

TEST_F(DaemonTest, DeleteByPrefixLeavesSiblingsWithALongerName) {
  Upsert("/volume1/share/b/1");
  Upsert("/volume1/share/b/c/2");
  Upsert("/volume1/share/b2/3");
  Json::Value data;
  data["query"]["qsl"]["prefix"]["CORVMDPath"] = "/volume1/share/b/";
  EXPECT_EQ(Run("document_del_by_query", data)["data"]["deleted"].asInt(), 2);
  EXPECT_EQ(Paths("/volume1/share/"), std::vector<std::string>({"/volume1/share/b2/3"}));
}

TEST_F(DaemonTest, CompoundAnswersOneResultPerElementAndFlagsFailures) {
  Upsert("/volume1/share/t.txt", "tokyo tower");
  Commit();
  Json::Value request;
  for (const char* field : {"CORVMDTextContent", "NoSuchField"}) {
    Json::Value element;
    element["command"] = "update_term_suggestion";
    element["data"]["doc_id_field"] = field;
    element["data"]["db_name"] = kIndex;
    request["compound"].append(element);
  }
  request["compound"].append(Data(R"({"command": "no_such_command", "data": {}})"));
  const Json::Value answer = Send(daemon_->socket_path(), request);
  ASSERT_TRUE(answer["success"].asBool());
  EXPECT_TRUE(answer["has_fail"].asBool());
  ASSERT_EQ(answer["data"].size(), 3u);
  EXPECT_TRUE(answer["data"][0]["success"].asBool());
  EXPECT_EQ(answer["data"][1]["error"]["code"].asInt(), 2002);
  EXPECT_EQ(answer["data"][2]["error"]["code"].asInt(), 2001);
  const Json::Value suggestions = Run("suggest", Data(R"({"field": "CORVMDTextContent", "text": "TO"})"));
  ASSERT_EQ(suggestions["data"]["suggestions"].size(), 2u) << JsonToString(suggestions);
  EXPECT_EQ(suggestions["data"]["suggestions"][0]["term"].asString(), "tokyo");
}

TEST_F(DaemonTest, APausedIndexAnswersBusyForWritesAndStillSearches) {
  Upsert("/volume1/share/p.txt", "paused words");
  Commit();
  ASSERT_TRUE(Run("index_pause", Json::Value(Json::objectValue))["success"].asBool());
  Json::Value data;
  data["doc_id"] = "/volume1/share/q.txt";
  data["data"] = FileDocument("/volume1/share/q.txt", "", 1);
  const Json::Value busy = Run("document_upsert_by_id", data);
  EXPECT_EQ(busy["error"]["code"].asInt(), 1400);
  EXPECT_EQ(Search(R"({"match": {"_all": "paused"}})")["data"]["total"].asInt(), 1);
  // The pause survives a restart.
  daemon_->Terminate();
  daemon_->Start();
  const Json::Value answer = WhileOpening([&] { return Run("document_upsert_by_id", data); });
  EXPECT_EQ(answer["error"]["code"].asInt(), 1400);
  ASSERT_TRUE(Run("index_resume", Json::Value(Json::objectValue))["success"].asBool());
  EXPECT_TRUE(Run("document_upsert_by_id", data)["success"].asBool());
}

TEST_F(DaemonTest, KillNineKeepsCommittedDataAndLosesTheRest) {
  Upsert("/volume1/share/kept.txt", "durable");
  Commit();
  Upsert("/volume1/share/lost.txt", "volatile");
  daemon_->Kill9();
  daemon_->Start();
  // Named, the index answers 1401 while it reopens (unnamed, a search skips it).
  const Json::Value answer =
      WhileOpening([&] { return Search(R"({"match_all": {}})", R"({"id": "fileindex_share"})"); });
  EXPECT_EQ(HitIds(answer), std::vector<std::string>({"/volume1/share/kept.txt"})) << JsonToString(answer);
  Upsert("/volume1/share/new.txt");
  Commit();
  EXPECT_EQ(Search(R"({"match_all": {}})")["data"]["total"].asInt(), 2);
}

TEST_F(DaemonTest, ConfigSetMovesTheDatabaseAndRenamesTheIndex) {
  Upsert("/volume1/share/m.txt", "moving");
  const std::string new_path = root_.path() + "/volume2/share2/@eaDir/index";
  Json::Value data;
  data["data"]["id"] = "fileindex_share2";
  data["data"]["path"] = new_path;
  ASSERT_TRUE(Run("index_config_set", data)["success"].asBool()) << daemon_->LogText();
  struct stat info;
  EXPECT_EQ(stat((new_path + "/corvelasticd.db").c_str(), &info), 0);
  EXPECT_EQ(Run("commit", Json::Value(Json::objectValue))["error"]["code"].asInt(), 2010);
  const Json::Value answer = Run("search", Data(R"({"id": "fileindex_share2", "query": {"qsl": {"match": {"_all": "moving"}}}})"));
  EXPECT_EQ(answer["data"]["total"].asInt(), 1) << JsonToString(answer);
  daemon_->Kill9();
  daemon_->Start();
  const Json::Value again = WhileOpening([&] { return Run("search", Data(R"({"id": "fileindex_share2"})")); });
  EXPECT_EQ(again["data"]["total"].asInt(), 1);
}

// A renamed share takes its metadata folder, and so the database, along
// before the index is told: the daemon adopts what it finds at the new place.
TEST_F(DaemonTest, ConfigSetAdoptsADatabaseThatAlreadyMovedWithItsShare) {
  Upsert("/volume1/share/r.txt", "renamed along");
  Commit();
  ASSERT_EQ(rename((root_.path() + "/volume1/share").c_str(), (root_.path() + "/volume1/share3").c_str()), 0);
  Json::Value data;
  data["data"]["id"] = "fileindex_share3";
  data["data"]["path"] = root_.path() + "/volume1/share3/@eaDir/index";
  ASSERT_TRUE(Run("index_config_set", data)["success"].asBool()) << daemon_->LogText();
  const Json::Value answer = Run("search", Data(R"({"id": "fileindex_share3", "query": {"qsl": {"match": {"_all": "renamed"}}}})"));
  EXPECT_EQ(answer["data"]["total"].asInt(), 1) << JsonToString(answer);
}

TEST_F(DaemonTest, ConfigSetRefusesToOverwriteAnotherDatabase) {
  const std::string other = root_.path() + "/volume2/other/@eaDir/index";
  std::filesystem::create_directories(other);
  { std::ofstream(other + "/corvelasticd.db") << "someone else's"; }
  Json::Value data;
  data["data"]["id"] = "fileindex_other";
  data["data"]["path"] = other;
  EXPECT_FALSE(Run("index_config_set", data)["success"].asBool());
  const Json::Value answer = Run("search", Data(R"({"id": "fileindex_share"})"));
  EXPECT_TRUE(answer["success"].asBool()) << JsonToString(answer);
}

TEST_F(DaemonTest, DeleteRemovesTheIndexAndItsFiles) {
  const std::string path = root_.path() + "/volume1/share/@eaDir/index/corvelasticd.db";
  ASSERT_TRUE(Run("index_delete", Json::Value(Json::objectValue))["success"].asBool());
  struct stat info;
  EXPECT_NE(stat(path.c_str(), &info), 0);
  EXPECT_EQ(Run("commit", Json::Value(Json::objectValue))["error"]["code"].asInt(), 2010);
  EXPECT_EQ(Run("index_delete", Json::Value(Json::objectValue))["error"]["code"].asInt(), 2010);
}

TEST_F(DaemonTest, CreatingTheSameIndexAgainIsHarmlessButAnotherPathIsRefused) {
  Json::Value data;
  data["path"] = root_.path() + "/volume1/share/@eaDir/index";
  data["mappings"] = LibraryMappings();
  const Json::Value again = Run("index_create", data);
  EXPECT_TRUE(again["success"].asBool());
  EXPECT_FALSE(again["data"]["created"].asBool());
  data["path"] = root_.path() + "/elsewhere";
  EXPECT_EQ(Run("index_create", data)["error"]["code"].asInt(), 2011);
}

TEST_F(DaemonTest, SeveralRequestsOnOneConnection) {
  std::string bytes;
  for (int i = 0; i < 3; ++i) bytes += Frame(R"({"command": "index_list", "data": {}})");
  // The first answer is read by SendRaw; the connection stays usable for the others.
  EXPECT_NE(SendRaw(daemon_->socket_path(), bytes).find(kIndex), std::string::npos);
}

class OpeningDaemonTest : public DaemonTest {
 protected:
  std::vector<std::string> ExtraArgs() override { return {"--test-open-delay-ms", "3000"}; }
};

TEST_F(OpeningDaemonTest, AnIndexStillOpeningAnswers1401) {
  Upsert("/volume1/share/o.txt");
  Commit();
  daemon_->Kill9();
  daemon_->Start();
  const Json::Value answer = Search(R"({"match_all": {}})", R"({"id": "fileindex_share"})");
  EXPECT_EQ(answer["error"]["code"].asInt(), 1401) << JsonToString(answer);
  Json::Value data;
  data["doc_id"] = "/volume1/share/o.txt";
  EXPECT_EQ(Run("document_del_by_id", data)["error"]["code"].asInt(), 1401);
}

class BacklogDaemonTest : public DaemonTest {
 protected:
  std::vector<std::string> ExtraArgs() override { return {"--max-writer-backlog", "0"}; }
};

TEST_F(BacklogDaemonTest, WritesOverTheBacklogBoundAnswer1400) {
  Json::Value data;
  data["doc_id"] = "/volume1/share/x";
  data["data"] = FileDocument("/volume1/share/x", "", 1);
  const Json::Value answer = Run("document_upsert_by_id", data);
  EXPECT_EQ(answer["error"]["code"].asInt(), 1400);
  EXPECT_NE(answer["error"]["msg"].asString().find("too many writes"), std::string::npos);
}

class ClientLimitDaemonTest : public DaemonTest {
 protected:
  std::vector<std::string> ExtraArgs() override { return {"--max-clients", "2"}; }
};

TEST_F(ClientLimitDaemonTest, ClientsOverTheLimitAnswer1400AndTheOthersGoOn) {
  Json::Value list(Json::objectValue);
  list["command"] = "index_list";
  // Two kept-open connections, each known to be served (it has been answered).
  // The daemon counts a closed connection out only once it has seen the
  // close, so a connection opened right after the set-up's may be refused:
  // those are tried again.
  std::vector<int> held;
  for (int attempt = 0; held.size() < 2 && attempt < 500; ++attempt) {
    const int fd = ConnectTo(daemon_->socket_path());
    ASSERT_GE(fd, 0);
    const Json::Value answer = Exchange(fd, list);
    if (answer["success"].asBool()) {
      held.push_back(fd);
    } else {
      EXPECT_EQ(answer["error"]["code"].asInt(), 1400);
      close(fd);
    }
  }
  ASSERT_EQ(held.size(), 2u);
  const Json::Value refused = Send(daemon_->socket_path(), list);
  EXPECT_EQ(refused["error"]["code"].asInt(), 1400) << JsonToString(refused);
  for (const int fd : held) {
    EXPECT_TRUE(Exchange(fd, list)["success"].asBool());
    close(fd);
  }
}

}  // namespace
}  // namespace elasticd_test
}  // namespace corvlumex

namespace corvlumex {
namespace elasticd_test {
namespace {

TEST(EventHandlerTest, ThePluginIsLoadedAndToldOfEachCommit) {
  SandboxRoot root;
  const std::string out = root.path() + "/events.txt";
  setenv("CORVELASTICD_TEST_HANDLER_OUT", out.c_str(), 1);
  Daemon daemon(root.path());
  daemon.Start();
  Json::Value data;
  data["id"] = kIndex;
  data["path"] = root.path() + "/index";
  data["mappings"] = LibraryMappings();
  data["event_handler"]["lib_path"] = CORVELASTICD_TEST_HANDLER;
  ASSERT_TRUE(Command(daemon.socket_path(), "index_create", data)["success"].asBool());
  Json::Value doc;
  doc["id"] = kIndex;
  doc["doc_id"] = "/v/s/a.txt";
  doc["data"] = FileDocument("/v/s/a.txt", "", 1);
  ASSERT_TRUE(Command(daemon.socket_path(), "document_upsert_by_id", doc)["success"].asBool());
  Json::Value commit;
  commit["id"] = kIndex;
  ASSERT_TRUE(Command(daemon.socket_path(), "commit", commit)["success"].asBool());
  Json::Value del;
  del["id"] = kIndex;
  del["doc_id"] = "/v/s/a.txt";
  ASSERT_TRUE(Command(daemon.socket_path(), "document_del_by_id", del)["success"].asBool());
  ASSERT_TRUE(Command(daemon.socket_path(), "commit", commit)["success"].asBool());
  ASSERT_TRUE(Command(daemon.socket_path(), "commit", commit)["success"].asBool());  // nothing changed: no event
  daemon.Terminate();
  unsetenv("CORVELASTICD_TEST_HANDLER_OUT");
  std::ifstream input(out);
  std::stringstream text;
  text << input.rdbuf();
  EXPECT_EQ(text.str(),
            "open fileindex_share\n"
            "commit fileindex_share +1 -0 +/v/s/a.txt\n"
            "commit fileindex_share +0 -1 -/v/s/a.txt\n"
            "close fileindex_share\n");
}

TEST(EventHandlerTest, AMissingPluginIsLoggedOnceAndTheIndexWorks) {
  SandboxRoot root;
  Daemon daemon(root.path());
  daemon.Start();
  for (const char* id : {"fileindex_a", "fileindex_b"}) {
    Json::Value data;
    data["id"] = id;
    data["path"] = root.path() + "/" + id;
    data["mappings"] = LibraryMappings();
    data["event_handler"]["lib_path"] = root.path() + "/missing.so";
    ASSERT_TRUE(Command(daemon.socket_path(), "index_create", data)["success"].asBool());
    Json::Value commit;
    commit["id"] = id;
    EXPECT_TRUE(Command(daemon.socket_path(), "commit", commit)["success"].asBool());
  }
  const std::string log = daemon.LogText();
  const size_t first = log.find("missing.so is not installed");
  EXPECT_NE(first, std::string::npos) << log;
  EXPECT_EQ(log.find("missing.so is not installed", first + 1), std::string::npos) << log;
}

}  // namespace
}  // namespace elasticd_test
}  // namespace corvlumex
