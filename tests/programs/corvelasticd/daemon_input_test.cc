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
// fault, and the daemon serves on. What each refusal says in detail, and
// every limit of a query or a search, is checked in-process (query_test,
// search_test, index_store_test); here, that the daemon gives one of each
// kind back over the socket.
TEST_F(DaemonInputTest, EveryBadOrHostileRequestIsAnsweredWithItsCodeAndTheDaemonServesOn) {
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
      {upsert + R"("doc_id": "/a", "data": {"CORVMDFSSize": "big"}}})", elasticd::kCodeBadDocument,
       "CORVMDFSSize"},
      {R"({"command": "commit", "data": {"id": "nope"}})", elasticd::kCodeIndexNotFound, ""},
      {create + R"("path": "/tmp/x", "mappings": {"property_id": "P", "properties": {}}}})",
       elasticd::kCodeBadMappings, ""},
      {create + R"("path": "relative",
          "mappings": {"property_id": "P", "properties": {"P": {"analyzer": "keyword"}}}}})",
       elasticd::kCodeIndexPath, ""},
      // Queries.
      {search + R"({"match": {"NoSuchField": "x"}}}}})", elasticd::kCodeBadQuery, "NoSuchField"},
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
// phrases across a gap, exact keys. Paging, sorting, loaded fields, ranking
// and highlights are search_test's and index_store_test's.
TEST_F(DaemonInputTest, TheSearchLanguage) {
  Upsert("/v/share/Reports/Quarterly Report 2023.pdf", "Revenue grew in the north region");
  Upsert("/v/share/Reports/summary.TXT", "Short summary of the quarterly revenue");
  // The name as a client with decomposed accents writes it.
  Upsert(std::string("/v/share/Photos/") + kDecomposedName);
  Upsert("/v/share/Music/東京タワー.mp3", "東京の夜景");
  Upsert("/v/share/Code/ac-3_decoder.c", "decoder for AC-3 audio");
  Commit();
  const auto names = [&](const std::string& qsl, const std::string& extra) {
    const Json::Value answer = Search(qsl, extra);
    EXPECT_TRUE(answer["success"].asBool()) << qsl << " " << JsonToString(answer);
    Names out;
    for (const Json::Value& hit : answer["data"]["hits"]) out.push_back(hit["fields"]["CORVMDFSName"].asString());
    return out;
  };
  const std::string report = "Quarterly Report 2023.pdf", summary = "summary.TXT",
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
  };
  for (const auto& c : cases) EXPECT_EQ(names(c.qsl, c.extra), c.expected) << c.qsl;
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

// Two connections held open, each known to be served (it has been
// answered). The daemon counts a closed connection out only once it has
// seen the close, so refusals of the first tries are tried again.
std::vector<int> HoldTwoServedConnections(const std::string& socket) {
  const Json::Value list = Data(R"({"command": "index_list"})");
  std::vector<int> held;
  for (int attempt = 0; held.size() < 2 && attempt < 500; ++attempt) {
    const int fd = ConnectTo(socket);
    if (fd >= 0 && Exchange(fd, list)["success"].asBool()) {
      held.push_back(fd);
    } else if (fd >= 0) {
      close(fd);
    }
  }
  return held;
}

class ClientLimitDaemonTest : public DaemonTest {
  std::vector<std::string> ExtraArgs() override { return {"--max-clients", "2"}; }
};

TEST_F(ClientLimitDaemonTest, ClientsOverTheLimitAnswer1400AndTheOthersGoOn) {
  const Json::Value list = Data(R"({"command": "index_list"})");
  const std::vector<int> held = HoldTwoServedConnections(daemon_->socket_path());
  ASSERT_EQ(held.size(), 2u);
  const Json::Value refused = Send(daemon_->socket_path(), list);
  EXPECT_EQ(refused["error"]["code"].asInt(), elasticd::kCodeBusy) << JsonToString(refused);
  for (const int fd : held) {
    EXPECT_TRUE(Exchange(fd, list)["success"].asBool());
    close(fd);
  }
}

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
      const std::vector<int> held = HoldTwoServedConnections(socket);
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
