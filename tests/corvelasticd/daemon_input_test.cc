// What the daemon does with bad input and with ordinary users: an error
// answer naming the fault, never a crash or a hang, and never a document the
// asking user could not read.
#include <gtest/gtest.h>
#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <fstream>

#include "common/json_util.h"
#include "tests/corvelasticd/daemon_harness.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace elasticd_test {
namespace {

using testing_support::SandboxRoot;

constexpr const char* kIndex = "fileindex_share";
// Names come back exactly as they were stored.
constexpr const char* kDecomposedName = "Cafe\xCC\x81 Paris.jpg";

class DaemonInputTest : public ::testing::Test {
 protected:
  void SetUp() override {
    daemon_ = std::make_unique<Daemon>(root_.path(), std::vector<std::string>{"--max-frame-bytes", "4096"});
    daemon_->Start();
    Json::Value data;
    data["id"] = kIndex;
    data["path"] = root_.path() + "/index";
    data["mappings"] = LibraryMappings();
    ASSERT_TRUE(Command(daemon_->socket_path(), "index_create", data)["success"].asBool());
  }

  int ErrorCode(const std::string& text) {
    Json::Value request;
    if (!JsonFromString(request, text)) return ErrorOf(SendRaw(daemon_->socket_path(), Frame(text)));
    return Send(daemon_->socket_path(), request)["error"]["code"].asInt();
  }

  static int ErrorOf(const std::string& answer_text) {
    Json::Value answer;
    if (!JsonFromString(answer, answer_text)) return -1;
    return answer["error"]["code"].asInt();
  }

  // The daemon still answers after whatever the test did.
  void ExpectAlive() {
    EXPECT_TRUE(Command(daemon_->socket_path(), "index_list", Json::Value(Json::objectValue))["success"].asBool());
  }

  SandboxRoot root_;
  std::unique_ptr<Daemon> daemon_;
};

TEST_F(DaemonInputTest, MalformedEnvelopes) {
  EXPECT_EQ(ErrorCode("{not json"), 2000);
  EXPECT_EQ(ErrorCode("[1, 2]"), 2000);
  EXPECT_EQ(ErrorCode(R"({"data": {}})"), 2000);
  EXPECT_EQ(ErrorCode(R"({"command": 5})"), 2000);
  EXPECT_EQ(ErrorCode(R"({"command": "commit", "data": "x"})"), 2000);
  EXPECT_EQ(ErrorCode(R"({"command": "no_such"})"), 2001);
  EXPECT_EQ(ErrorCode(R"({"compound": 3})"), 2000);
  EXPECT_EQ(ErrorOf(SendRaw(daemon_->socket_path(), Frame(""))), 2000);
  const Json::Value nested = Send(daemon_->socket_path(), [] {
    Json::Value request;
    JsonFromString(request, R"({"compound": [{"compound": []}, "text"]})");
    return request;
  }());
  EXPECT_TRUE(nested["has_fail"].asBool());
  EXPECT_EQ(nested["data"][0]["error"]["code"].asInt(), 2000);
  EXPECT_EQ(nested["data"][1]["error"]["code"].asInt(), 2000);
  ExpectAlive();
}

TEST_F(DaemonInputTest, WrongArgumentTypesNameTheMember) {
  const Json::Value answer = Send(daemon_->socket_path(), [] {
    Json::Value request;
    JsonFromString(request, R"({"command": "document_upsert_by_id", "data": {"id": "fileindex_share", "doc_id": 7, "data": {}}})");
    return request;
  }());
  EXPECT_EQ(answer["error"]["code"].asInt(), 2002);
  EXPECT_NE(answer["error"]["msg"].asString().find("doc_id"), std::string::npos);
  EXPECT_EQ(ErrorCode(R"({"command": "document_upsert_by_id", "data": {"id": "fileindex_share", "doc_id": "/a", "data": []}})"), 2002);
  EXPECT_EQ(ErrorCode(R"({"command": "document_upsert_by_id", "data": {"id": "fileindex_share", "doc_id": "/a", "data": {"CORVMDFSSize": "big"}}})"), 2021);
  EXPECT_EQ(ErrorCode(R"({"command": "document_upsert_by_id", "data": {"id": "fileindex_share", "doc_id": "/a", "data": {"CORVMDTitle": {"x": 1}}}})"), 2021);
  EXPECT_EQ(ErrorCode(R"({"command": "document_upsert_by_id", "data": {"id": "nope", "doc_id": "/a", "data": {}}})"), 2010);
  EXPECT_EQ(ErrorCode(R"({"command": "index_create", "data": {"id": "x", "path": "/tmp/x", "mappings": {"property_id": "P", "properties": {}}}})"), 2013);
  EXPECT_EQ(ErrorCode(R"({"command": "index_create", "data": {"id": "x", "path": "relative", "mappings": {"property_id": "P", "properties": {"P": {"analyzer": "keyword"}}}}})"), 2012);
  EXPECT_EQ(ErrorCode(R"({"command": "search", "data": {"size": -1}})"), 2002);
  EXPECT_EQ(ErrorCode(R"({"command": "search", "data": {"ids": "fileindex_share"}})"), 2002);
  ExpectAlive();
}

TEST_F(DaemonInputTest, BadQueriesAreRefusedWithTheirReason) {
  for (const char* qsl : {R"({"match": {"NoSuchField": "x"}})", R"({"range": {"CORVMDFSName": {"gt": 1}}})",
                          R"({"range": {"CORVMDFSSize": {"between": 1}}})", R"({"bool": {"must": 5}})",
                          R"({"match": {"a": 1}, "term": {"b": 2}})", R"({"fuzzy": {"CORVMDFSName": "x"}})",
                          R"({"term": {"CORVMDIsDir": "maybe"}})", R"("text")"}) {
    std::string request = std::string(R"({"command": "search", "data": {"query": {"qsl": )") + qsl + "}}}";
    EXPECT_EQ(ErrorCode(request), 2030) << qsl;
  }
  std::string deep = R"({"match_all": {}})";
  for (int i = 0; i < 40; ++i) deep = R"({"bool": {"must": [)" + deep + "]}}";
  EXPECT_EQ(ErrorCode(R"({"command": "search", "data": {"query": {"qsl": )" + deep + "}}}"), 2030);
  ExpectAlive();
}

TEST_F(DaemonInputTest, OversizeFramesAreAnsweredAndTheConnectionClosed) {
  const std::string big(5000, 'x');
  EXPECT_EQ(ErrorOf(SendRaw(daemon_->socket_path(), Frame(big))), 2003);
  uint32_t huge = 0xFFFFFFF0u;
  EXPECT_EQ(ErrorOf(SendRaw(daemon_->socket_path(), std::string(reinterpret_cast<const char*>(&huge), 4))), 2003);
  ExpectAlive();
}

TEST_F(DaemonInputTest, ClientsThatVanishMidFrameDoNotDisturbOthers) {
  for (const std::string& partial : {std::string("\x10"), Frame(R"({"command": "index_list"})").substr(0, 9)}) {
    const int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un address;
    memset(&address, 0, sizeof(address));
    address.sun_family = AF_UNIX;
    strncpy(address.sun_path, daemon_->socket_path().c_str(), sizeof(address.sun_path) - 1);
    ASSERT_EQ(connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0);
    ASSERT_EQ(write(fd, partial.data(), partial.size()), static_cast<ssize_t>(partial.size()));
    // A stalled client holds only its own connection.
    ExpectAlive();
    close(fd);
  }
  ExpectAlive();
}

// ---------------------------------------------------------------- search language

class SearchLanguageTest : public DaemonInputTest {
 protected:
  void SetUp() override {
    DaemonInputTest::SetUp();
    Add("/v/share/Reports/Quarterly Report 2023.pdf", "Revenue grew in the north region", 5000, 1700000000);
    Add("/v/share/Reports/summary.TXT", "Short summary of the quarterly revenue", 300, 1600000000);
    // The name as a client with decomposed accents writes it.
    Add("/v/share/Photos/Cafe\xCC\x81 Paris.jpg", "", 900000, 1650000000);
    Add("/v/share/Music/東京タワー.mp3", "東京の夜景", 4000000, 1500000000);
    Add("/v/share/Code/ac-3_decoder.c", "decoder for AC-3 audio", 1200, 1690000000);
    Json::Value commit;
    commit["id"] = kIndex;
    ASSERT_TRUE(Command(daemon_->socket_path(), "commit", commit)["success"].asBool());
  }

  void Add(const std::string& path, const std::string& text, long long size, long long date) {
    Json::Value data;
    data["id"] = kIndex;
    data["doc_id"] = path;
    data["data"] = FileDocument(path, text, size);
    data["data"]["CORVMDFSContentChangeDate"] = static_cast<Json::Int64>(date);
    ASSERT_TRUE(Command(daemon_->socket_path(), "document_upsert_by_id", data)["success"].asBool());
  }

  Json::Value Search(const std::string& qsl, const std::string& extra = "{}") {
    Json::Value data;
    JsonFromString(data, extra);
    Json::Value clause;
    EXPECT_TRUE(JsonFromString(clause, qsl)) << qsl;
    data["query"]["qsl"] = clause;
    const Json::Value answer = Command(daemon_->socket_path(), "search", data);
    EXPECT_TRUE(answer["success"].asBool()) << qsl << " " << JsonToString(answer);
    return answer;
  }

  std::vector<std::string> Names(const std::string& qsl, const std::string& extra = "{}") {
    std::vector<std::string> names;
    const Json::Value answer = Search(qsl, extra);
    for (const Json::Value& hit : answer["data"]["hits"]) names.push_back(hit["fields"]["CORVMDFSName"].asString());
    return names;
  }
};

TEST_F(SearchLanguageTest, FullTextIsCaseAndAccentInsensitive) {
  EXPECT_EQ(Names(R"({"match": {"_all": "REVENUE"}})", R"({"sort": "CORVMDFSName"})"),
            std::vector<std::string>({"Quarterly Report 2023.pdf", "summary.TXT"}));
  EXPECT_EQ(Names(R"({"match": {"_all": "revenue north"}})"), std::vector<std::string>({"Quarterly Report 2023.pdf"}));
  EXPECT_EQ(Names(R"({"match": {"_all": {"query": "north summary", "operator": "or"}}})").size(), 2u);
  EXPECT_EQ(Names(R"({"match": {"CORVMDTextContent": "ac-3"}})"), std::vector<std::string>({"ac-3_decoder.c"}));
  EXPECT_EQ(Names(R"({"match": {"_all": "東京"}})"), std::vector<std::string>({"東京タワー.mp3"}));
  // The words of names are part of the catch-all field.
  EXPECT_EQ(Names(R"({"match": {"_all": "cafe"}})"), std::vector<std::string>({kDecomposedName}));
}

TEST_F(SearchLanguageTest, NameSubstringsMatchInsideNamesWhateverTheNormalisation) {
  EXPECT_EQ(Names(R"({"match": {"CORVMDSearchFileName": "RTERLY rep"}})"), std::vector<std::string>({"Quarterly Report 2023.pdf"}));
  EXPECT_EQ(Names(R"({"match": {"CORVMDSearchFileName": "café"}})"), std::vector<std::string>({kDecomposedName}));
  EXPECT_EQ(Names(R"({"match": {"CORVMDSearchFileName": "CAFE"}})"), std::vector<std::string>({kDecomposedName}));
  EXPECT_EQ(Names(R"({"match": {"CORVMDSearchFileName": "タワ"}})"), std::vector<std::string>({"東京タワー.mp3"}));
  EXPECT_EQ(Names(R"({"match": {"CORVMDSearchFileName": "y.t"}})"), std::vector<std::string>({"summary.TXT"}));
}

TEST_F(SearchLanguageTest, KeywordTermsPrefixesAndRanges) {
  EXPECT_EQ(Names(R"({"term": {"CORVMDFSName": "SUMMARY.txt"}})"), std::vector<std::string>({"summary.TXT"}));
  // A decomposed query meets a precomposed keyword and the other way round.
  EXPECT_EQ(Names(R"({"term": {"CORVMDFSName": "Café Paris.jpg"}})"), std::vector<std::string>({kDecomposedName}));
  EXPECT_EQ(Names(R"({"terms": {"CORVMDExtension": ["pdf", "mp3"]}})", R"({"sort": "CORVMDFSName"})"),
            std::vector<std::string>({"Quarterly Report 2023.pdf", "東京タワー.mp3"}));
  EXPECT_EQ(Names(R"({"prefix": {"CORVMDPath": "/v/share/Reports/"}})").size(), 2u);
  EXPECT_TRUE(Names(R"({"prefix": {"CORVMDPath": "/v/share/reports/"}})").empty()) << "paths are exact";
  EXPECT_EQ(Names(R"({"prefix": {"CORVMDFSName": "quart"}})"), std::vector<std::string>({"Quarterly Report 2023.pdf"}));
  EXPECT_EQ(Names(R"({"range": {"CORVMDFSSize": {"gte": 1200, "lt": 900000}}})", R"({"sort": "CORVMDFSSize"})"),
            std::vector<std::string>({"ac-3_decoder.c", "Quarterly Report 2023.pdf"}));
  EXPECT_EQ(Names(R"({"range": {"CORVMDFSContentChangeDate": {"gte": "2023-11-01"}}})"), std::vector<std::string>({"Quarterly Report 2023.pdf"}));
  EXPECT_EQ(Names(R"({"term": {"CORVMDIsDir": false}})").size(), 5u);
}

TEST_F(SearchLanguageTest, BoolPagingSortingFieldsAndHighlight) {
  EXPECT_EQ(Names(R"({"bool": {"must": [{"match": {"_all": "revenue"}}], "must_not": [{"term": {"CORVMDExtension": "pdf"}}]}})"),
            std::vector<std::string>({"summary.TXT"}));
  EXPECT_EQ(Names(R"({"bool": {"should": [{"term": {"CORVMDExtension": "c"}}, {"term": {"CORVMDExtension": "mp3"}}]}})").size(), 2u);
  const Json::Value page = Search(R"({"match_all": {}})", R"({"sort": {"field": "CORVMDFSSize", "order": "desc"}, "from": 1, "size": 2, "load_field": ["CORVMDFSSize"]})");
  EXPECT_EQ(page["data"]["total"].asInt(), 5);
  ASSERT_EQ(page["data"]["hits"].size(), 2u);
  EXPECT_EQ(page["data"]["hits"][0]["fields"]["CORVMDFSSize"].asInt(), 900000);
  EXPECT_EQ(page["data"]["hits"][1]["fields"]["CORVMDFSSize"].asInt(), 5000);
  EXPECT_EQ(page["data"]["hits"][0]["fields"].size(), 1u);
  const Json::Value ranked = Search(R"({"match": {"_all": "revenue"}})", R"({"highlight": {"pre": "[", "post": "]"}})");
  ASSERT_EQ(ranked["data"]["hits"].size(), 2u);
  EXPECT_GT(ranked["data"]["hits"][0]["score"].asDouble(), 0.0);
  EXPECT_GE(ranked["data"]["hits"][0]["score"].asDouble(), ranked["data"]["hits"][1]["score"].asDouble());
  EXPECT_NE(ranked["data"]["hits"][0]["highlight"].asString().find("evenue]"), std::string::npos);
}

// ---------------------------------------------------------------- access

// Runs `body` in a child that has become `user`; returns what it printed.
std::string AsUser(const struct passwd& user, const std::function<std::string()>& body) {
  int pipe_fds[2];
  if (pipe(pipe_fds) != 0) return "";
  const pid_t child = fork();
  if (child == 0) {
    close(pipe_fds[0]);
    if (setgroups(0, nullptr) != 0 || setgid(user.pw_gid) != 0 || setuid(user.pw_uid) != 0) _exit(3);
    const std::string out = body();
    if (write(pipe_fds[1], out.data(), out.size()) < 0) _exit(4);
    _exit(0);
  }
  close(pipe_fds[1]);
  std::string out;
  char buffer[4096];
  ssize_t n = 0;
  while ((n = read(pipe_fds[0], buffer, sizeof(buffer))) > 0) out.append(buffer, static_cast<size_t>(n));
  close(pipe_fds[0]);
  waitpid(child, nullptr, 0);
  return out;
}

TEST_F(DaemonInputTest, OrdinaryUsersSeeOnlyFilesTheyCanReadAndCannotChangeIndexes) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to run a client as another user";
  const struct passwd* nobody = getpwnam("nobody");
  ASSERT_NE(nobody, nullptr);
  const struct passwd user = *nobody;
  chmod(root_.path().c_str(), 0755);
  const std::string share = root_.MakeDir("share");
  chmod(share.c_str(), 0755);
  std::vector<std::string> readable;
  Json::Value commit;
  commit["id"] = kIndex;
  // Many unreadable hits first in key order, so paging has to look past them.
  for (int i = 0; i < 150; ++i) {
    const std::string path = share + "/a-secret-" + std::to_string(1000 + i) + ".txt";
    std::ofstream(path) << "x";
    chmod(path.c_str(), 0600);
    Json::Value data;
    data["id"] = kIndex;
    data["doc_id"] = path;
    data["data"] = FileDocument(path, "common word", 1);
    ASSERT_TRUE(Command(daemon_->socket_path(), "document_upsert_by_id", data)["success"].asBool());
  }
  for (int i = 0; i < 3; ++i) {
    const std::string path = share + "/b-public-" + std::to_string(i) + ".txt";
    std::ofstream(path) << "x";
    chmod(path.c_str(), 0644);
    readable.push_back(path);
    Json::Value data;
    data["id"] = kIndex;
    data["doc_id"] = path;
    data["data"] = FileDocument(path, "common word", 1);
    ASSERT_TRUE(Command(daemon_->socket_path(), "document_upsert_by_id", data)["success"].asBool());
  }
  ASSERT_TRUE(Command(daemon_->socket_path(), "commit", commit)["success"].asBool());
  const std::string socket = daemon_->socket_path();

  const std::string seen = AsUser(user, [&] {
    Json::Value data;
    data["query"]["qsl"]["match"]["_all"] = "common";
    data["size"] = 2;
    data["sort"] = "_key";
    return JsonToString(Command(socket, "search", data));
  });
  Json::Value answer;
  ASSERT_TRUE(JsonFromString(answer, seen)) << seen;
  EXPECT_EQ(HitIds(answer), std::vector<std::string>({readable[0], readable[1]}));
  EXPECT_EQ(answer["data"]["total"].asInt(), 3);
  EXPECT_TRUE(answer["data"]["total_exact"].asBool());

  const std::string refused = AsUser(user, [&] {
    Json::Value data;
    data["id"] = kIndex;
    data["doc_id"] = readable[0];
    return JsonToString(Command(socket, "document_del_by_id", data));
  });
  ASSERT_TRUE(JsonFromString(answer, refused)) << refused;
  EXPECT_EQ(answer["error"]["code"].asInt(), 2004);

  // Root sees everything.
  Json::Value all;
  all["query"]["qsl"]["match"]["_all"] = "common";
  EXPECT_EQ(Command(socket, "search", all)["data"]["total"].asInt(), 153);
}

}  // namespace
}  // namespace elasticd_test
}  // namespace corvlumex
