// The web API against the real system in a sandbox: sessions and CSRF,
// bad requests, administrators only for management, and each user seeing
// only the files they can read. The user tests make real accounts (root
// only) and sign them in through PAM.
#include <gtest/gtest.h>
#include <httplib.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>

#include "common/json_util.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "tests/system/system_harness.h"

namespace corvlumex {
namespace testing_support {
namespace {

namespace fs = std::filesystem;

int FreePort() {
  const int fd = socket(AF_INET, SOCK_STREAM, 0);
  struct sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t length = sizeof(address);
  bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address));
  getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length);
  close(fd);
  return ntohs(address.sin_port);
}

// The whole system (SystemSandbox: the real corvelasticd, corvnotifyd and
// fileindexd) and fileindex-web on a free loopback port.
class WebSandbox : public SystemSandbox {
 public:
  explicit WebSandbox(const std::vector<std::string>& web_args) {
    StartAll();
    const std::string link = root() + "/var/run/fileindex-web.sign-in";
    for (int attempt = 0; attempt < 5 && !web_; ++attempt) {
      port_ = FreePort();
      std::vector<std::string> args = {"--port", std::to_string(port_), "--sign-in-link-file", link,
                                       "--web-root", std::string(FILEINDEX_SOURCE_DIR) + "/web"};
      args.insert(args.end(), web_args.begin(), web_args.end());
      web_ = std::make_unique<ChildProcess>(ProgramPath("fileindex-web"), args,
                                            root() + "/fileindex-web.log");
      // The link is written once the port is bound; a lost race for the port ends the daemon.
      const auto written = [&] { return access(link.c_str(), F_OK) == 0 || !web_->Running(); };
      if (!PollUntil(written, std::chrono::seconds(20)) || !web_->Running()) {
        web_.reset();
      }
    }
  }
  int port() const { return port_; }
  // A fresh one-time link for the daemon's own user (each works once).
  std::string SignInLink() {
    const auto read = [this] {
      std::string text = ReadFileText(root() + "/var/run/fileindex-web.sign-in");
      while (!text.empty() && text.back() == '\n') text.pop_back();
      return text;
    };
    if (!last_link_.empty()) {
      // The daemon writes a new link on SIGHUP.
      web_->Signal(SIGHUP);
      PollUntil([&] { return read() != last_link_; }, std::chrono::seconds(20));
    }
    last_link_ = read();
    return last_link_;
  }
  bool WebRunning() { return web_ && web_->Running(); }
  std::string WebLog() const { return web_ ? web_->Log() : "fileindex-web did not start"; }

 private:
  int port_ = 0;
  std::unique_ptr<ChildProcess> web_;
  std::string last_link_;
};

struct Reply {
  int status = 0;  // 0: no answer
  Json::Value json;
  std::string body;
  httplib::Headers headers;
  std::string header(const std::string& name) const {
    const auto found = headers.find(name);
    return found == headers.end() ? "" : found->second;
  }
};

// A browser-like client: signed in through the one-time link or PAM, with
// the session cookie and CSRF token it was given.
class WebClient {
 public:
  explicit WebClient(int port, bool https = false) : port_(port), https_(https) {}
  Reply Get(const std::string& path_and_query) {
    httplib::Headers headers;
    if (!cookie.empty()) headers.emplace("Cookie", "fileindex_session=" + cookie);
    return Finish(Connect().Get(path_and_query.c_str(), headers));
  }
  // POST of `body` as JSON with the session's CSRF token.
  Reply Post(const std::string& path, const std::string& body) {
    return PostRaw(path, body, "application/json", {{"X-CSRF-Token", csrf_token}});
  }
  Reply PostRaw(const std::string& path, const std::string& body, const std::string& content_type,
                const httplib::Headers& extra) {
    httplib::Headers headers = extra;
    if (!cookie.empty()) headers.emplace("Cookie", "fileindex_session=" + cookie);
    return Finish(Connect().Post(path.c_str(), headers, body, content_type.c_str()));
  }
  // Follows a one-time link; true when it signed in.
  bool UseLink(const std::string& url) {
    const size_t path_start = url.find('/', url.find("://") + 3);
    if (path_start == std::string::npos || Get(url.substr(path_start)).status != 303) return false;
    return Get("/api/session").status == 200;
  }
  Reply SignIn(const std::string& user, const std::string& password) {
    Json::Value body;
    body["user"] = user;
    body["password"] = password;
    return PostRaw("/api/sign-in", JsonToString(body), "application/json", {});
  }
  std::string cookie;  // the session id, as the browser keeps it
  std::string csrf_token;

 private:
  Reply Finish(const httplib::Result& result) {
    Reply reply;
    if (!result) return reply;
    reply.status = result->status;
    reply.body = result->body;
    reply.headers = result->headers;
    JsonFromString(reply.json, result->body);
    const std::string set_cookie = result->get_header_value("Set-Cookie");
    const std::string name = "fileindex_session=";
    if (set_cookie.compare(0, name.size(), name) == 0) {
      cookie = set_cookie.substr(name.size(), set_cookie.find(';') - name.size());
    }
    if (reply.json["data"].isObject() && reply.json["data"]["csrf_token"].isString()) {
      csrf_token = reply.json["data"]["csrf_token"].asString();
    }
    return reply;
  }
  httplib::Client Connect() const {
    httplib::Client client((https_ ? "https://127.0.0.1:" : "http://127.0.0.1:") +
                           std::to_string(port_));
    client.enable_server_certificate_verification(false);  // the test's own certificate
    return client;
  }
  int port_;
  bool https_;
};

// "a b" -> "a%20b": a query parameter value.
std::string Escape(const std::string& value) { return httplib::detail::encode_query_param(value); }

// Every management call, with a body that would change something.
const struct {
  const char* method;
  const char* path;
  const char* body;
} kManagementCalls[] = {
    {"GET", "/api/folders", ""},
    {"GET", "/api/folder?path=/share", ""},
    {"GET", "/api/status", ""},
    {"GET", "/api/browse?path=/share", ""},
    {"GET", "/api/failures", ""},
    {"POST", "/api/folders/add", R"({"path": "/share/new"})"},
    {"POST", "/api/folders/set", R"({"path": "/share", "document": false})"},
    {"POST", "/api/folders/delete", R"({"paths": ["/share"]})"},
    {"POST", "/api/folders/reindex", R"({"paths": ["/share"]})"},
    {"POST", "/api/pause", R"({"hours": 1})"},
    {"POST", "/api/resume", "{}"},
};

Reply Call(WebClient& client, const char* method, const std::string& path, const std::string& body) {
  return std::string(method) == "GET" ? client.Get(path) : client.Post(path, body);
}

// What the management calls above would change.
std::string ManagedState() {
  Json::Value folders;
  fileindex::FolderList(folders, 0, 0, "", "", Json::Value(Json::arrayValue));
  return JsonToString(folders) + " paused=" + std::to_string(fileindex::StatusMgr().GetPauseInfo());
}

class WebApiTest : public ::testing::Test {
 protected:
  void SetUp() override {
    // OpenSSL writes without MSG_NOSIGNAL: a refusal answered before the
    // request body was read must not end the test.
    signal(SIGPIPE, SIG_IGN);
    sandbox_ = std::make_unique<WebSandbox>(WebArgs());
    ASSERT_TRUE(sandbox_->WebRunning()) << sandbox_->WebLog();
    fs::create_directories(sandbox_->Path("docs"));
    WriteText(sandbox_->Path("docs/public.txt"), "marmalade recipe for everyone");
    sandbox_->AddFolder("");
  }
  // With a certificate and key the daemon speaks HTTPS only (the users'
  // test runs it without).
  virtual bool Https() { return true; }
  virtual std::vector<std::string> WebArgs() {
    const std::string dir = testing::TempDir() + "/web-tls-" + std::to_string(getpid());
    fs::create_directories(dir);
    const std::string make =
        "openssl req -x509 -newkey rsa:2048 -nodes -subj /CN=127.0.0.1 -days 1 -keyout " + dir +
        "/key.pem -out " + dir + "/cert.pem 2>/dev/null";
    EXPECT_EQ(std::system(make.c_str()), 0);
    return {"--certificate", dir + "/cert.pem", "--key", dir + "/key.pem"};
  }
  void Indexed() {
    ASSERT_EQ(sandbox_->Converge(sandbox_->DiskPaths("")), "") << sandbox_->Logs();
  }
  WebClient Client() { return WebClient(sandbox_->port(), Https()); }
  WebClient Admin() {
    WebClient client = Client();
    EXPECT_TRUE(client.UseLink(sandbox_->SignInLink()));
    return client;
  }

  std::unique_ptr<WebSandbox> sandbox_;
};

// One administrator's visit over HTTPS: nothing without a live session, a
// sign-in link that works once, changes that need the session's own CSRF token,
// bad requests answered with a JSON error, then what the command line does
// and downloads inside shares. The details of each refusal are
// web_unit_test's; here, that the daemon wires each in.
TEST_F(WebApiTest, AnAdministratorsVisit) {
  WebClient signed_out = Admin();
  const std::string old_cookie = signed_out.cookie;
  ASSERT_EQ(signed_out.Post("/api/sign-out", "{}").status, 200);
  signed_out.cookie = old_cookie;  // a copy of the cookie kept after sign-out
  WebClient forged = Client();
  forged.cookie = std::string(64, 'a');
  forged.csrf_token = std::string(64, 'b');
  WebClient none = Client();
  const std::string before = ManagedState();
  for (WebClient* client : {&none, &forged, &signed_out}) {
    for (const auto& call : kManagementCalls) {
      const Reply reply = Call(*client, call.method, call.path, call.body);
      EXPECT_EQ(reply.status, 401) << call.path << " " << reply.body;
      EXPECT_FALSE(reply.json["error"]["reason"].asString().empty()) << call.path;
    }
    for (const char* read : {"/api/search?q=marmalade", "/api/suggest?q=ma", "/api/shares", "/api/session",
                             "/api/download?path=" }) {
      EXPECT_EQ(client->Get(read).status, 401) << read;
    }
  }
  EXPECT_EQ(ManagedState(), before);
  // The pages themselves load without a session (they show the sign-in form).
  EXPECT_EQ(none.Get("/sign-in.html").status, 200);
  EXPECT_EQ(none.Get("/").status, 200);

  // A sign-in link, over HTTPS only, gives a Secure cookie and works once;
  // changes need the session's own CSRF token.
  const std::string link = sandbox_->SignInLink();
  ASSERT_EQ(link.compare(0, 8, "https://"), 0) << link;
  EXPECT_EQ(WebClient(sandbox_->port()).Get("/api/session").status, 0);  // no answer to plain HTTP
  WebClient admin = Client(), reused = Client();
  const Reply redirect = admin.Get(link.substr(link.find("/sign-in")));
  EXPECT_EQ(redirect.status, 303);
  EXPECT_NE(redirect.header("Set-Cookie").find("; Secure"), std::string::npos)
      << redirect.header("Set-Cookie");
  EXPECT_NE(redirect.header("Set-Cookie").find("HttpOnly; SameSite=Strict"), std::string::npos);
  ASSERT_EQ(admin.Get("/api/session").status, 200);
  EXPECT_FALSE(reused.UseLink(link));
  EXPECT_EQ(reused.Get("/api/session").status, 401);
  WebClient other = Admin();
  const std::string token = admin.csrf_token;
  const struct {
    const char* what;
    std::string token;
    const char* content_type;
    int status;
  } csrf_cases[] = {
      {"no token", "", "application/json", 403},
      {"a wrong token", std::string(64, '0'), "application/json", 403},
      {"another session's token", other.csrf_token, "application/json", 403},
      {"a form post", token, "application/x-www-form-urlencoded", 415},
  };
  for (const auto& c : csrf_cases) {
    const Reply reply = admin.PostRaw("/api/pause", R"({"hours": 1})", c.content_type, {{"X-CSRF-Token", c.token}});
    EXPECT_EQ(reply.status, c.status) << c.what << ": " << reply.body;
  }
  EXPECT_EQ(ManagedState(), before);
  EXPECT_EQ(admin.Post("/api/pause", R"({"hours": 1})").status, 200);
  EXPECT_GT(fileindex::StatusMgr().GetPauseInfo(), 0);

  // Bad requests get a JSON error and the daemon stays up.
  const std::string unchanged = ManagedState();
  const struct {
    const char* path;
    std::string body;
    int status;
  } bad_requests[] = {
      {"/api/folders/add", "{\"path\": ", 400},
      {"/api/folders/add", R"({"path": "/share/../etc"})", 400},
      {"/api/folders/delete", R"({"paths": "/share"})", 400},
      {"/api/folders/delete", R"({"paths": []})", 400},
      {"/api/pause", std::string(100000, ' '), 413},
      {"/api/sign-in", R"({"user": "root"})", 400},
      {"/api/nothing-here", "{}", 404},
  };
  for (const auto& c : bad_requests) {
    const Reply reply = admin.Post(c.path, c.body);
    EXPECT_EQ(reply.status, c.status) << c.path << " " << c.body.substr(0, 60) << ": " << reply.body;
    EXPECT_FALSE(reply.json["success"].asBool());
    EXPECT_FALSE(reply.json["error"]["reason"].asString().empty()) << reply.body;
    EXPECT_FALSE(reply.json["error"]["what_to_do"].asString().empty()) << reply.body;
  }
  for (const char* read : {"/api/search?q=%22unclosed", "/api/search?size=100000",
                           "/api/search?category=spreadsheet", "/api/folders?sort=colour"}) {
    const Reply reply = admin.Get(read);
    EXPECT_EQ(reply.status, 400) << read << ": " << reply.body;
    EXPECT_FALSE(reply.json["error"]["reason"].asString().empty()) << read;
  }
  EXPECT_EQ(ManagedState(), unchanged);
  EXPECT_TRUE(sandbox_->WebRunning());
  EXPECT_EQ(admin.Get("/api/session").status, 200);

  // What the command line does, and downloads inside shares only.
  Indexed();
  fs::create_symlink("/etc/hostname", sandbox_->Path("docs/escape.txt"));
  fs::create_symlink(sandbox_->Path("docs/public.txt"), sandbox_->Path("docs/inside.txt"));
  const std::string share = sandbox_->share_dir();
  const struct {
    std::string path;
    int status;
  } downloads[] = {
      {share + "/docs/public.txt", 200},
      {share + "/docs/inside.txt", 200},
      {share + "/docs/escape.txt", 403},
      {share + "/docs/../docs/public.txt", 400},
      {"/etc/hostname", 404},
      {share + "/docs/missing.txt", 404},
      {share + "/docs", 403},
      {"docs/public.txt", 400},
  };
  for (const auto& c : downloads) {
    const Reply reply = admin.Get("/api/download?path=" + Escape(c.path));
    EXPECT_EQ(reply.status, c.status) << c.path << ": " << reply.body.substr(0, 200);
    if (c.status == 200) {
      EXPECT_EQ(reply.body, "marmalade recipe for everyone");
    }
  }
  fs::create_directories(sandbox_->Path("more/deeper"));
  WriteText(sandbox_->Path("more/deeper/note.txt"), "lighthouse keeper");
  // Each management call once, in a row that a person could make; the rules
  // behind each are the management library's own tests.
  const struct {
    const char* method;
    const char* path;
    const char* body;
    int status;
    std::vector<std::string> holds;  // parts of the answer's "data" (or "error")
  } steps[] = {
      {"GET", "/api/browse?path=/share", "", 200, {"\"/share/more\""}},
      {"POST", "/api/folders/delete", R"({"paths": ["/share"]})", 200, {}},
      {"POST", "/api/folders/add",
       R"({"path": "/share/more", "name": "More", "video": false})", 200, {}},
      {"POST", "/api/folders/add", R"({"path": "/share/more"})", 400, {"\"code\":901"}},
      {"GET", "/api/folder?path=/share/more", "", 200,
       {"\"name\":\"More\"", "\"video\":false", "\"document\":true"}},
      {"POST", "/api/folders/set", R"({"path": "/share/more", "photo": false})", 200, {}},
      {"GET", "/api/folder?path=/share/more", "", 200, {"\"photo\":false"}},
      {"POST", "/api/folders/reindex", R"({"paths": ["/share/more"]})", 200, {}},
      {"GET", "/api/folders", "", 200, {"\"total\":1}"}},
      {"GET", "/api/status", "", 200, {"\"shares\":{\"share\":{", "\"documents\":"}},
      {"POST", "/api/pause", R"({"hours": 0})", 200, {}},
      {"GET", "/api/status", "", 200, {"\"resume_time\":0,"}},
      {"POST", "/api/resume", "{}", 200, {}},
      {"GET", "/api/status", "", 200, {"\"resume_time\":-1,"}},
      {"POST", "/api/folders/delete", R"({"paths": ["/share/nowhere"]})", 404, {"\"code\":902"}},
  };
  for (const auto& step : steps) {
    SCOPED_TRACE(std::string(step.method) + " " + step.path + " " + step.body);
    const Reply reply = Call(admin, step.method, step.path, step.body);
    EXPECT_EQ(reply.status, step.status) << reply.body;
    const std::string data = JsonToString(reply.json[reply.status == 200 ? "data" : "error"]);
    for (const std::string& part : step.holds) {
      EXPECT_NE(data.find(part), std::string::npos) << data;
    }
  }
  // The re-added folder is indexed and searched.
  EXPECT_TRUE(PollUntil([&] { return admin.Get("/api/search?q=lighthouse").json["data"]["total"].asInt() == 1; },
                        std::chrono::seconds(30)));
}

// Real accounts: alice administers (a member of the test's admin group),
// bob does not; each signs in with a password through PAM.
class WebUsersTest : public WebApiTest {
 protected:
  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "needs root to create users and sign them in through PAM";
    const std::string suffix = std::to_string(getpid());
    alice_ = "cwa" + suffix;
    bob_ = "cwb" + suffix;
    group_ = "cwg" + suffix;
    const std::string script = "groupadd " + group_ + " && useradd -M -N -s /usr/sbin/nologin -G " + group_ + " " + alice_ +
                               " && useradd -M -N -s /usr/sbin/nologin " + bob_ + " && printf '%s:%s\\n%s:%s\\n' " + alice_ +
                               " " + kPassword + " " + bob_ + " " + kPassword + " | chpasswd";
    ASSERT_EQ(std::system(script.c_str()), 0) << script;
    made_users_ = true;
    WebApiTest::SetUp();
    for (const std::string& dir : {sandbox_->share_dir(), fs::path(sandbox_->share_dir()).parent_path().string(),
                                   sandbox_->Path("docs")}) {
      chmod(dir.c_str(), 0755);
    }
    const std::string secret = sandbox_->Path("docs/alice-only-zanzibar.txt");
    WriteText(secret, "marmalade zanzibar secret");
    ASSERT_EQ(std::system(("chown " + alice_ + " " + secret + " && chmod 0600 " + secret).c_str()), 0);
    Indexed();
    fileindex::UpdateTermSuggestion();
  }
  void TearDown() override {
    if (!made_users_) return;
    sandbox_.reset();
    std::system(("userdel " + alice_ + "; userdel " + bob_ + "; groupdel " + group_).c_str());
  }
  bool Https() override { return false; }
  std::vector<std::string> WebArgs() override { return {"--admin-group", "cwg" + std::to_string(getpid())}; }
  WebClient User(const std::string& name) {
    WebClient client(sandbox_->port());
    const Reply reply = client.SignIn(name, kPassword);
    EXPECT_EQ(reply.status, 200) << name << ": " << reply.body << sandbox_->WebLog();
    return client;
  }

  static constexpr const char* kPassword = "Corv-Test-Pass-42";
  std::string alice_, bob_, group_;
  bool made_users_ = false;
};

// Each user sees only the files they can read, only administrators reach
// management calls, and wrong passwords slow the next sign-in of that
// account down (last: bob cannot sign in again for a while).
TEST_F(WebUsersTest, EachUserSeesTheirOwnFilesAndOnlyAdministratorsManage) {
  WebClient alice = User(alice_);
  WebClient bob = User(bob_);
  const std::string secret = sandbox_->Path("docs/alice-only-zanzibar.txt");
  const struct {
    WebClient* who;
    int marmalade_total;
    int zanzibar_total;
    int download_status;
  } cases[] = {{&alice, 2, 1, 200}, {&bob, 1, 0, 403}};
  for (const auto& c : cases) {
    Reply reply = c.who->Get("/api/search?q=marmalade&size=1");
    ASSERT_EQ(reply.status, 200) << reply.body;
    EXPECT_EQ(reply.json["data"]["total"].asInt(), c.marmalade_total) << reply.body;
    reply = c.who->Get("/api/search?q=marmalade&size=100");
    const std::string text = JsonToString(reply.json["data"]);
    EXPECT_EQ(text.find("zanzibar") != std::string::npos, c.zanzibar_total > 0) << text;
    reply = c.who->Get("/api/search?q=zanzibar");
    EXPECT_EQ(reply.json["data"]["total"].asInt(), c.zanzibar_total) << reply.body;
    reply = c.who->Get("/api/suggest?q=zanz");
    ASSERT_EQ(reply.status, 200) << reply.body;
    EXPECT_EQ(reply.json["data"].size() > 0, c.zanzibar_total > 0) << reply.body;
    reply = c.who->Get("/api/download?path=" + Escape(secret));
    EXPECT_EQ(reply.status, c.download_status) << reply.body.substr(0, 200);
    EXPECT_EQ(reply.body.find("secret") != std::string::npos && c.download_status == 200, c.download_status == 200);
  }

  EXPECT_TRUE(alice.Get("/api/session").json["data"]["admin"].asBool());
  EXPECT_FALSE(bob.Get("/api/session").json["data"]["admin"].asBool());
  const std::string before = ManagedState();
  for (const auto& call : kManagementCalls) {
    const Reply reply = Call(bob, call.method, call.path, call.body);
    EXPECT_EQ(reply.status, 403) << call.path << ": " << reply.body;
  }
  EXPECT_EQ(ManagedState(), before);
  EXPECT_EQ(alice.Get("/api/status").status, 200);
  EXPECT_EQ(alice.Post("/api/pause", R"({"hours": 1})").status, 200);
  EXPECT_EQ(bob.Get("/api/search?q=marmalade").status, 200);

  WebClient client(sandbox_->port());
  for (int i = 0; i < 3; ++i) EXPECT_EQ(client.SignIn(bob_, "wrong").status, 401);
  const Reply slowed = client.SignIn(bob_, kPassword);
  EXPECT_EQ(slowed.status, 429) << slowed.body;
  EXPECT_FALSE(slowed.header("Retry-After").empty());
  EXPECT_EQ(client.Get("/api/session").status, 401);
  // Another account is not slowed by bob's failures.
  EXPECT_EQ(WebClient(sandbox_->port()).SignIn(alice_, kPassword).status, 200);
  EXPECT_EQ(WebClient(sandbox_->port()).SignIn("no-such-user-here", kPassword).status, 401);
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
