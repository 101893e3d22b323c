// corvspotlightd over real HTTP, as Samba's client (libcli/http) reads it:
// a reason phrase and a Content-Length on every answer, never a chunked
// body, keep-alive with paging; every other request a 4xx and the daemon
// still up; and, as root, a local user's connection refused.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <pwd.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <memory>
#include <regex>
#include <set>
#include <string>

#include "common/json_util.h"
#include "tests/system/system_harness.h"

namespace corvlumex {
namespace testing_support {
namespace {

struct HttpReply {
  std::string status_line;
  std::string headers;  // lower-cased
  std::string body;
  bool complete = false;
};

// A connection speaking HTTP/1.1 the way Samba's client does.
class SambaLikeClient {
 public:
  explicit SambaLikeClient(int port) : fd_(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(static_cast<uint16_t>(port));
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    connected_ = connect(fd_, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0;
  }
  ~SambaLikeClient() { close(fd_); }
  bool connected() const { return connected_; }

  HttpReply Send(const std::string& method, const std::string& uri, const std::string& body) {
    const std::string request = method + " " + uri +
                                " HTTP/1.1\r\nContent-Type: application/json\r\nAccept: application/json\r\n"
                                "User-Agent: Samba/mdssvc\r\nHost: fileserver\r\nContent-Length: " +
                                std::to_string(body.size()) + "\r\n\r\n" + body;
    for (size_t sent = 0; sent < request.size();) {
      const ssize_t n = send(fd_, request.data() + sent, request.size() - sent, MSG_NOSIGNAL);
      if (n <= 0) break;  // the daemon may answer (413) before the whole body is sent
      sent += static_cast<size_t>(n);
    }
    return Read();
  }

 private:
  HttpReply Read() {
    HttpReply reply;
    std::string data;
    size_t header_end;
    while ((header_end = data.find("\r\n\r\n")) == std::string::npos) {
      if (!ReadMore(&data)) return reply;
    }
    reply.status_line = data.substr(0, data.find("\r\n"));
    reply.headers = data.substr(0, header_end);
    for (char& c : reply.headers) c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
    std::smatch length;
    if (!std::regex_search(reply.headers, length, std::regex("\r\ncontent-length: *([0-9]+)"))) return reply;
    const size_t body_size = std::stoul(length[1]);
    while (data.size() < header_end + 4 + body_size) {
      if (!ReadMore(&data)) return reply;
    }
    reply.body = data.substr(header_end + 4, body_size);
    reply.complete = true;
    return reply;
  }

  bool ReadMore(std::string* data) {
    char buffer[65536];
    const ssize_t n = recv(fd_, buffer, sizeof(buffer), 0);
    if (n <= 0) return false;
    data->append(buffer, static_cast<size_t>(n));
    return true;
  }

  int fd_;
  bool connected_ = false;
};

std::string Search(const std::string& query, int from, int size) {
  Json::Value body(Json::objectValue);
  body["from"] = from;
  body["size"] = size;
  body["_source"].append("path.real");
  body["query"]["query_string"]["query"] = query;
  return JsonToString(body);
}

// What Samba's reader insists on (libcli/http/http.c).
void ExpectSambaCanRead(const HttpReply& reply, const std::string& what) {
  ASSERT_TRUE(reply.complete) << what << ": no complete answer with a Content-Length";
  EXPECT_TRUE(std::regex_match(reply.status_line, std::regex("HTTP/1\\.1 [0-9]{3} [A-Za-z].*"))) << what << ": "
                                                                                                   << reply.status_line;
  EXPECT_EQ(reply.headers.find("transfer-encoding"), std::string::npos) << what;
  EXPECT_EQ(reply.headers.find(": \r\n"), std::string::npos) << what << ": a header without a value";
  Json::Value body;
  EXPECT_TRUE(JsonFromString(body, reply.body)) << what << ": " << reply.body;
}

// The real system indexes five files named "Report <n>.txt"; corvspotlightd
// answers from that index on a free port.
class SpotlightHttpTest : public ::testing::Test {
 protected:
  void SetUp() override {
    for (int i = 0; i < 5; ++i) {
      WriteText(system_.Path("Report " + std::to_string(i) + ".txt"), "x");
    }
    system_.StartAll();
    system_.AddFolder("");
    ASSERT_EQ(system_.Converge(system_.DiskPaths("")), "") << system_.Logs();
    share_ = system_.share_dir();
    responder_ = std::make_unique<ChildProcess>(ProgramPath("corvspotlightd"),
                                                std::vector<std::string>{"--port", "0", "--log-stderr"},
                                                system_.root() + "/corvspotlightd.log");
    std::smatch port;
    ASSERT_TRUE(PollUntil(
        [&] {
          const std::string log = responder_->Log();
          return std::regex_search(log, port, std::regex("listening on 127\\.0\\.0\\.1 port ([0-9]+)"));
        },
        std::chrono::seconds(20)))
        << responder_->Log();
    port_ = std::stoi(port[1]);
  }

  SystemSandbox system_;
  std::string share_;
  std::unique_ptr<ChildProcess> responder_;
  int port_ = 0;
};

// One scenario on one responder: pages of a kept-alive connection, every
// other request a readable 4xx with the daemon still up, and (as root) a
// local user's connection refused while root itself is let in.
TEST_F(SpotlightHttpTest, AnswersSambaCanReadToRootOnly) {
  SambaLikeClient client(port_);
  ASSERT_TRUE(client.connected());
  std::set<std::string> paths;
  const std::string scoped = "(port*) AND path.real.fulltext:\"" + share_ + "\"";
  for (int from = 0; from < 5; from += 2) {
    const HttpReply reply =
        client.Send("POST", "/fileindex_share/_search", Search(scoped, from, 2));
    ExpectSambaCanRead(reply, "page from " + std::to_string(from));
    EXPECT_EQ(reply.status_line, "HTTP/1.1 200 OK");
    Json::Value answer;
    ASSERT_TRUE(JsonFromString(answer, reply.body));
    EXPECT_EQ(answer["hits"]["total"]["value"].asInt(), 5);
    EXPECT_EQ(answer["hits"]["hits"].size(), from == 4 ? 1u : 2u);
    for (const Json::Value& hit : answer["hits"]["hits"]) paths.insert(hit["_source"]["path"]["real"].asString());
  }
  EXPECT_EQ(paths.size(), 5u);
  // "/_all" searches every share the scope names.
  EXPECT_EQ(client.Send("POST", "/_all/_search", Search(scoped, 0, 50)).status_line,
            "HTTP/1.1 200 OK");

  const std::string good = Search("port*", 0, 50);
  const struct {
    std::string method, uri, body;
    int status;
  } cases[] = {
      {"GET", "/fileindex_share/_search", "", 405},
      {"PUT", "/fileindex_share/_search", good, 405},
      {"POST", "/fileindex_share/_doc", good, 404},
      {"POST", "/", good, 404},
      {"POST", "/fileindex_nosuchshare/_search", good, 404},
      {"POST", "/_all/_search", good, 400},
      {"POST", "/fileindex_share/_search", std::string(100000, '['), 400},
      {"POST", "/fileindex_share/_search", std::string(2 * 1024 * 1024, ' '), 413},
      {"POST", "/fileindex_share/_search", Search("CORVMDFSName:(a", 0, 50), 400},
      {"POST", "/fileindex_share/_search", Search("port* AND path.real.fulltext:\"/elsewhere\"", 0, 50), 400},
  };
  for (const auto& test : cases) {
    const HttpReply reply = SambaLikeClient(port_).Send(test.method, test.uri, test.body);
    const std::string what = test.method + " " + test.uri + " " + test.body.substr(0, 40);
    ExpectSambaCanRead(reply, what);
    EXPECT_EQ(reply.status_line.substr(9, 3), std::to_string(test.status)) << what << ": " << reply.body;
  }
  EXPECT_TRUE(responder_->Running());

  if (geteuid() != 0) GTEST_SKIP() << "needs root to connect as the user nobody";
  const passwd* nobody = getpwnam("nobody");
  ASSERT_NE(nobody, nullptr);
  const pid_t child = fork();
  if (child == 0) {
    if (setgid(nobody->pw_gid) != 0 || setuid(nobody->pw_uid) != 0) _exit(2);
    const HttpReply reply = SambaLikeClient(port_).Send("POST", "/fileindex_share/_search", good);
    _exit(reply.status_line == "HTTP/1.1 403 Forbidden" && reply.body.find("Report") == std::string::npos ? 0 : 1);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << responder_->Log();
  EXPECT_NE(responder_->Log().find("refused a search"), std::string::npos);
  EXPECT_EQ(SambaLikeClient(port_).Send("POST", "/fileindex_share/_search", good).status_line,
            "HTTP/1.1 200 OK");
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
