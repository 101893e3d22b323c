// What the daemon does with bad input and with ordinary users: an error
// answer naming the fault, never a crash or a hang, and never a document the
// asking user could not read.
#include <gtest/gtest.h>
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <functional>

#include "common/json_util.h"
#include "fileindex/elastic/daemon_codes.h"
#include "tests/programs/corvelasticd/daemon_harness.h"

namespace corvlumex {
namespace elasticd_test {
namespace {

using Names = std::vector<std::string>;
// Names come back exactly as they were stored.
constexpr const char* kDecomposedName = "Cafe\xCC\x81 Paris.jpg";

class DaemonInputTest : public DaemonTest {
 protected:
  // The daemon still answers after whatever the test did.
  void ExpectAlive() { EXPECT_TRUE(Run("index_list")["success"].asBool()); }

  // The folder "share" in the root, open to every user, for files of several owners.
  std::string OpenShare() {
    chmod(root_.path().c_str(), 0755);
    const std::string share = root_.MakeDir("share");
    chmod(share.c_str(), 0755);
    return share;
  }
  // A file with `mode` on disk and its document holding `text`.
  void AddFile(const std::string& path, mode_t mode, const std::string& text) {
    std::ofstream(path) << "x";
    chmod(path.c_str(), mode);
    Json::Value data;
    data["doc_id"] = path;
    data["data"] = FileDocument(path, text, 1);
    ASSERT_TRUE(Run("document_upsert_by_id", data)["success"].asBool());
  }
};

std::string Repeat(const std::string& piece, int times) {
  std::string out;
  for (int i = 0; i < times; ++i) out += piece;
  return out;
}

// Every request that is malformed, names what does not exist, or is built to
// stop or tie up the daemon gets an answer with its code and the part at
// fault, and the daemon serves on. What each refusal says in detail is
// checked in-process (query_test, search_test, index_store_test); here, that
// the daemon gives it back over the socket.
TEST_F(DaemonInputTest, EveryBadOrHostileRequestIsAnsweredWithItsCodeAndTheDaemonServesOn) {
  std::string deep = R"({"match_all": {}})";
  for (int i = 0; i < 40; ++i) deep = R"({"bool": {"must": [)" + deep + "]}}";
  std::string words;
  for (int i = 0; i < 100000; ++i) words += "w" + std::to_string(i) + " ";
  const std::string upsert = R"({"command": "document_upsert_by_id", "data": {"id": "fileindex_share", )";
  const std::string search = R"({"command": "search", "data": {"query": {"qsl": )";
  const std::string create = R"({"command": "index_create", "data": {"id": "x", )";
  const struct {
    std::string request;
    int code;
    const char* message;  // a part of the answer's message
  } cases[] = {
      // Envelopes.
      {"", elasticd::kCodeBadRequest, ""},
      {"{not json", elasticd::kCodeBadRequest, "JSON"},
      {"[1, 2]", elasticd::kCodeBadRequest, ""},
      {R"({"data": {}})", elasticd::kCodeBadRequest, ""},
      {R"({"command": 5})", elasticd::kCodeBadRequest, ""},
      {R"({"command": "commit", "data": "x"})", elasticd::kCodeBadRequest, ""},
      {R"({"compound": 3})", elasticd::kCodeBadRequest, ""},
      {R"({"command": "no_such"})", elasticd::kCodeUnknownCommand, ""},
      {"{\"command\": \"\xff\xfe\x80\"}", elasticd::kCodeUnknownCommand, "Unknown"},
      // JSON nested past the reader's limit, alone or inside a request.
      {Repeat("[", 1001) + Repeat("]", 1001), elasticd::kCodeBadRequest, "JSON"},
      {Repeat(R"({"a":)", 1001) + "1" + Repeat("}", 1001), elasticd::kCodeBadRequest, "JSON"},
      {search + Repeat("[", 1200) + Repeat("]", 1200) + "}}}", elasticd::kCodeBadRequest, "JSON"},
      // Arguments of the wrong type or meaning.
      {upsert + R"("doc_id": 7, "data": {}}})", elasticd::kCodeBadArgument, "doc_id"},
      {upsert + R"("doc_id": "/a", "data": []}})", elasticd::kCodeBadArgument, ""},
      {upsert + R"("doc_id": "/a", "data": {"CORVMDFSSize": "big"}}})", elasticd::kCodeBadDocument,
       "CORVMDFSSize"},
      {R"({"command": "commit", "data": {"id": "nope"}})", elasticd::kCodeIndexNotFound, ""},
      {create + R"("path": "/tmp/x", "mappings": {"property_id": "P", "properties": {}}}})",
       elasticd::kCodeBadMappings, ""},
      {create + R"("path": "relative",
          "mappings": {"property_id": "P", "properties": {"P": {"analyzer": "keyword"}}}}})",
       elasticd::kCodeIndexPath, ""},
      {R"({"command": "search", "data": {"size": -1}})", elasticd::kCodeBadArgument, "size"},
      // Queries.
      {search + R"({"match": {"NoSuchField": "x"}}}}})", elasticd::kCodeBadQuery, "NoSuchField"},
      {search + deep + "}}}", elasticd::kCodeBadQuery, "deeper"},
      {search + R"({"match": {"_all": ")" + words + R"("}}}}})", elasticd::kCodeBadQuery, "words"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.request.substr(0, 120));
    const std::string answer_text = SendRaw(daemon_->socket_path(), Frame(c.request));
    Json::Value answer;
    ASSERT_TRUE(JsonFromString(answer, answer_text)) << "no answer; " << daemon_->LogText();
    EXPECT_EQ(answer["error"]["code"].asInt(), c.code) << answer_text;
    EXPECT_NE(answer["error"]["msg"].asString().find(c.message), std::string::npos) << answer_text;
    ASSERT_TRUE(Run("index_list")["success"].asBool());
  }
  // Elements of a compound are judged one by one.
  const Json::Value nested = Send(daemon_->socket_path(), Data(R"({"compound": [{"compound": []}, "text"]})"));
  EXPECT_TRUE(nested["has_fail"].asBool());
  EXPECT_EQ(nested["data"][0]["error"]["code"].asInt(), elasticd::kCodeBadRequest);
  EXPECT_EQ(nested["data"][1]["error"]["code"].asInt(), elasticd::kCodeBadRequest);
}

// The daemon started with a small frame bound.
class FrameBoundTest : public DaemonInputTest {
 protected:
  std::vector<std::string> ExtraArgs() override { return {"--max-frame-bytes", "4096"}; }
};

TEST_F(FrameBoundTest, OversizeFramesAndClientsThatVanishMidFrameDisturbNobody) {
  Json::Value answer;
  ASSERT_TRUE(JsonFromString(answer, SendRaw(daemon_->socket_path(), Frame(std::string(5000, 'x')))));
  EXPECT_EQ(answer["error"]["code"].asInt(), elasticd::kCodeFrameTooLarge);
  const uint32_t huge = 0xFFFFFFF0u;
  ASSERT_TRUE(JsonFromString(answer, SendRaw(daemon_->socket_path(), std::string(reinterpret_cast<const char*>(&huge), 4))));
  EXPECT_EQ(answer["error"]["code"].asInt(), elasticd::kCodeFrameTooLarge);
  for (const std::string& partial : {std::string("\x10"), Frame(R"({"command": "index_list"})").substr(0, 9)}) {
    const int fd = ConnectTo(daemon_->socket_path());
    ASSERT_GE(fd, 0);
    ASSERT_EQ(write(fd, partial.data(), partial.size()), static_cast<ssize_t>(partial.size()));
    // A stalled client holds only its own connection.
    ExpectAlive();
    close(fd);
  }
  ExpectAlive();
}

// What each clause finds in a real index. Words, phrases, prefixes, name
// fragments, extensions, sizes, dates, OR and NOT over many documents are
// proved against a scan (corpus_scan_test); these rows are the cases a
// random corpus does not make: decomposed names, blanks inside name parts,
// phrases across a gap, exact keys.
TEST_F(DaemonInputTest, TheSearchLanguage) {
  const auto add = [&](const std::string& path, const std::string& text, long long size, long long date) {
    Json::Value data;
    data["doc_id"] = path;
    data["data"] = FileDocument(path, text, size);
    data["data"]["CORVMDFSContentChangeDate"] = static_cast<Json::Int64>(date);
    ASSERT_TRUE(Run("document_upsert_by_id", data)["success"].asBool());
  };
  add("/v/share/Reports/Quarterly Report 2023.pdf", "Revenue grew in the north region", 5000, 1700000000);
  add("/v/share/Reports/summary.TXT", "Short summary of the quarterly revenue", 300, 1600000000);
  // The name as a client with decomposed accents writes it.
  add(std::string("/v/share/Photos/") + kDecomposedName, "", 900000, 1650000000);
  add("/v/share/Music/東京タワー.mp3", "東京の夜景", 4000000, 1500000000);
  add("/v/share/Code/ac-3_decoder.c", "decoder for AC-3 audio", 1200, 1690000000);
  Commit();
  const auto names = [&](const std::string& qsl, const std::string& extra) {
    const Json::Value answer = Search(qsl, extra);
    EXPECT_TRUE(answer["success"].asBool()) << qsl << " " << JsonToString(answer);
    Names out;
    for (const Json::Value& hit : answer["data"]["hits"]) out.push_back(hit["fields"]["CORVMDFSName"].asString());
    return out;
  };
  const std::string report = "Quarterly Report 2023.pdf", summary = "summary.TXT", song = "東京タワー.mp3",
                    code = "ac-3_decoder.c", photo = kDecomposedName;
  const struct {
    const char* qsl;
    const char* extra;
    Names expected;
  } cases[] = {
      // Full text is case and accent insensitive; the words of names are part of the catch-all field.
      {R"({"match": {"_all": "REVENUE"}})", R"({"sort": "CORVMDFSName"})", {report, summary}},
      {R"({"match": {"CORVMDTextContent": "ac-3"}})", "{}", {code}},
      {R"({"match": {"_all": "cafe"}})", "{}", {photo}},
      // Phrases: the words next to each other, in this order, within one field.
      {R"({"match_phrase": {"_all": "GREW in the"}})", "{}", {report}},
      {R"({"match_phrase": {"_all": "revenue grew north"}})", "{}", {}},
      {R"({"match_phrase": {"CORVMDTextContent": {"query": "quarterly revenue"}}})", "{}", {summary}},
      {R"({"match_phrase": {"_all": "..."}})", "{}", {}},
      {R"({"prefix": {"_all": "revenue gr"}})", "{}", {report}},
      // Name substrings match inside names whatever the normalisation.
      {R"({"match": {"CORVMDSearchFileName": "RTERLY rep"}})", "{}", {report}},
      {R"({"match": {"CORVMDSearchFileName": "café"}})", "{}", {photo}},
      {R"({"match": {"CORVMDSearchFileName": "CAFE"}})", "{}", {photo}},
      // Keyword terms (a decomposed query meets a precomposed keyword), prefixes and ranges; paths are exact.
      {R"({"term": {"CORVMDFSName": "SUMMARY.txt"}})", "{}", {summary}},
      {R"({"term": {"CORVMDFSName": "Café Paris.jpg"}})", "{}", {photo}},
      {R"({"prefix": {"CORVMDPath": "/v/share/Reports/"}})", R"({"sort": "CORVMDFSName"})", {report, summary}},
      {R"({"prefix": {"CORVMDPath": "/v/share/reports/"}})", "{}", {}},
      {R"({"prefix": {"CORVMDFSName": "quart"}})", "{}", {report}},
      {R"({"term": {"CORVMDIsDir": false}})", R"({"sort": "CORVMDFSSize"})", {summary, code, report, photo, song}},
  };
  for (const auto& c : cases) EXPECT_EQ(names(c.qsl, c.extra), c.expected) << c.qsl;

  // Paging, sorting, loaded fields, ranking and highlight.
  const Json::Value page = Search(R"({"match_all": {}})",
      R"({"sort": {"field": "CORVMDFSSize", "order": "desc"}, "from": 1, "size": 2, "load_field": ["CORVMDFSSize"]})");
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

TEST_F(DaemonInputTest, WordSearchesRankNamesFirstThenContentThenNewer) {
  const auto add = [&](const std::string& path, const std::string& text, long long date, bool dir) {
    Json::Value data;
    data["doc_id"] = path;
    data["data"] = FileDocument(path, text, 100);
    data["data"]["CORVMDFSContentChangeDate"] = static_cast<Json::Int64>(date);
    data["data"]["CORVMDIsDir"] = dir;
    ASSERT_TRUE(Run("document_upsert_by_id", data)["success"].asBool());
  };
  // Keys in reverse of the expected order, so key order cannot pass for ranking.
  add("/v/s/a/recipes/pilaf.txt", "saffron rice with saffron and more saffron", 1000, false);
  add("/v/s/b/old copy.txt", "a pinch of saffron in warm milk", 1000, false);
  add("/v/s/c/new copy.txt", "a pinch of saffron in warm milk", 2000, false);
  add("/v/s/d/Saffron Rice Notes.md", "notes", 500, false);
  add("/v/s/e/saffron.txt", "", 10, false);
  add("/v/s/f/Saffron", "", 5, true);  // a folder counts as a result
  Commit();
  const std::vector<std::string> expected = {"/v/s/f/Saffron",           "/v/s/e/saffron.txt",   "/v/s/d/Saffron Rice Notes.md",
                                             "/v/s/a/recipes/pilaf.txt", "/v/s/c/new copy.txt", "/v/s/b/old copy.txt"};
  // Alone (ordered from the full-text scores) and with a filter (ordered by SQL): one order.
  for (const char* qsl : {R"({"match": {"_all": "saffron"}})",
                          R"({"bool": {"must": [{"match": {"_all": "saffron"}}], "filter": [{"prefix": {"CORVMDPath": "/v/s/"}}]}})"}) {
    const Json::Value answer = Search(qsl);
    std::vector<std::string> order;
    for (const Json::Value& hit : answer["data"]["hits"]) order.push_back(hit["doc_id"].asString());
    EXPECT_EQ(order, expected) << qsl;
  }
  // An exact name beats a shorter name that merely holds the words.
  add("/v/s/g/rice saffron", "", 1, false);
  add("/v/s/h/saffron rice.txt", "", 1, false);
  Commit();
  const Json::Value exact = Search(R"({"match": {"_all": "saffron rice"}})");
  ASSERT_GE(exact["data"]["hits"].size(), 2u);
  EXPECT_EQ(exact["data"]["hits"][0]["doc_id"].asString(), "/v/s/h/saffron rice.txt");
  // A phrase and a prefix rank the same way: names first.
  for (const char* qsl : {R"({"match_phrase": {"_all": "saffron rice"}})", R"({"prefix": {"_all": "saffr"}})"}) {
    const Json::Value answer = Search(qsl);
    ASSERT_GE(answer["data"]["hits"].size(), 2u) << qsl;
    const std::string first = answer["data"]["hits"][0]["doc_id"].asString();
    EXPECT_NE(first.substr(first.rfind('/')).find("affron"), std::string::npos) << qsl << ": " << first;
  }
}

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
  for (ssize_t n; (n = read(pipe_fds[0], buffer, sizeof(buffer))) > 0;) out.append(buffer, static_cast<size_t>(n));
  close(pipe_fds[0]);
  waitpid(child, nullptr, 0);
  return out;
}

// An ordinary user sees only files they can read, filtered before paging,
// and cannot change indexes; a front end running as root searches on behalf
// of a signed-in user with that user's ids and groups, and an ordinary user
// cannot borrow another identity.
TEST_F(DaemonInputTest, UsersSeeOnlyFilesTheyCanReadDirectlyOrOnTheirBehalf) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to run a client as another user";
  const struct passwd* nobody = getpwnam("nobody");
  ASSERT_NE(nobody, nullptr);
  const struct passwd user = *nobody;
  const std::string share = OpenShare();
  // Many unreadable hits first in key order, so paging has to look past them.
  for (int i = 0; i < 150; ++i) {
    AddFile(share + "/a-secret-" + std::to_string(1000 + i) + ".txt", 0600, "common zanzibar");
  }
  Names readable;
  for (int i = 0; i < 3; ++i) {
    readable.push_back(share + "/b-public-" + std::to_string(i) + ".txt");
    AddFile(readable.back(), 0644, "common word");
  }
  const char* suggestions =
      R"({"doc_id_field": "CORVMDTextContent", "db_name": "fileindex_share"})";
  ASSERT_TRUE(Run("update_term_suggestion", suggestions)["success"].asBool());
  Commit();
  const std::string socket = daemon_->socket_path();
  const char* query = R"({"query": {"qsl": {"match": {"_all": "common"}}},
                          "size": 2, "sort": "_key", "track_total": true})";
  // `data` sent by the user nobody.
  const auto as_nobody = [&](const std::string& command, Json::Value data) {
    data["id"] = kIndex;
    Json::Value answer;
    const std::string text =
        AsUser(user, [&] { return JsonToString(Command(socket, command, data)); });
    EXPECT_TRUE(JsonFromString(answer, text)) << text;
    return answer;
  };
  const Json::Value direct = as_nobody("search", Data(query));
  EXPECT_EQ(HitIds(direct), Names({readable[0], readable[1]}));
  EXPECT_EQ(direct["data"]["total"].asInt(), 3);
  EXPECT_TRUE(direct["data"]["total_exact"].asBool());
  Json::Value remove;
  remove["doc_id"] = readable[0];
  EXPECT_EQ(as_nobody("document_del_by_id", remove)["error"]["code"].asInt(),
            elasticd::kCodePermissionDenied);
  Json::Value as_root = Data(query);
  as_root["as_user"] = "root";
  EXPECT_EQ(as_nobody("search", as_root)["error"]["code"].asInt(), elasticd::kCodePermissionDenied);
  const struct {
    const char* as_user;
    int code;  // 0: answered
    int total;
    size_t suggestions;  // of "zan"
  } cases[] = {
      {nullptr, 0, 153, 1},
      {"root", 0, 153, 1},
      {"nobody", 0, 3, 0},
      {"no-such-user-here", elasticd::kCodeBadArgument, 0, 0},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.as_user == nullptr ? "root itself" : c.as_user);
    Json::Value data = Data(query);
    Json::Value suggest = Data(R"({"field": "CORVMDTextContent", "text": "zan"})");
    if (c.as_user != nullptr) data["as_user"] = suggest["as_user"] = c.as_user;
    const Json::Value answer = Run("search", data);
    const Json::Value suggested = Run("suggest", suggest);
    if (c.code != 0) {
      EXPECT_EQ(answer["error"]["code"].asInt(), c.code);
      continue;
    }
    EXPECT_EQ(answer["data"]["total"].asInt(), c.total) << answer;
    EXPECT_EQ(suggested["data"]["suggestions"].size(), c.suggestions) << suggested;
    if (c.total == 3) {
      EXPECT_EQ(answer["data"]["hits"], direct["data"]["hits"]);
    }
  }
}

}  // namespace
}  // namespace elasticd_test
}  // namespace corvlumex

namespace corvlumex {
namespace elasticd_test {
namespace {

class PerUserLimitTest : public DaemonTest {
 protected:
  std::vector<std::string> ExtraArgs() override { return {"--max-clients-per-user", "2"}; }
};

TEST_F(PerUserLimitTest, OneUserCannotTakeEveryConnectionNorSendHugeCompounds) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to run a client as another user";
  const struct passwd* nobody = getpwnam("nobody");
  ASSERT_NE(nobody, nullptr);
  chmod(root_.path().c_str(), 0755);
  const std::string socket = daemon_->socket_path();
  const std::string out = AsUser(*nobody, [&]() -> std::string {
    try {
      const Json::Value list = Data(R"({"command": "index_list"})");
      // Two connections held open, each known to be served; the daemon counts
      // a closed one out only once it has seen the close, so refusals of the
      // first tries are tried again.
      std::vector<int> held;
      for (int attempt = 0; held.size() < 2 && attempt < 500; ++attempt) {
        const int fd = ConnectTo(socket);
        if (Exchange(fd, list)["success"].asBool()) {
          held.push_back(fd);
        } else {
          close(fd);
        }
      }
      const Json::Value refused = Send(socket, list);
      std::string result = std::to_string(held.size()) + " " + refused["error"]["code"].asString() + " " +
                           refused["error"]["msg"].asString();
      for (const int fd : held) close(fd);
      // Nor carry a million searches in one compound request.
      Json::Value compound;
      for (int i = 0; i < 65; ++i) compound["compound"].append(list);
      // The held connections count until the daemon has seen them close.
      Json::Value too_many = Send(socket, compound);
      for (int attempt = 0; attempt < 500 && too_many["error"]["code"].asInt() == 1400; ++attempt) {
        usleep(10000);
        too_many = Send(socket, compound);
      }
      return result + "\n" + too_many["error"]["code"].asString() + " " + too_many["error"]["msg"].asString();
    } catch (const std::exception& error) {
      return error.what();
    }
  });
  EXPECT_EQ(out.substr(0, 7), "2 1400 ") << out;
  EXPECT_NE(out.find("Too many connections from user"), std::string::npos) << out;
  EXPECT_NE(out.find("\n2000 A compound request may hold at most 64 requests"), std::string::npos) << out;
  // Root, the library's user, is not counted.
  EXPECT_TRUE(Run("index_list")["success"].asBool());
}

}  // namespace
}  // namespace elasticd_test
}  // namespace corvlumex
