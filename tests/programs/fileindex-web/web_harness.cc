#include "tests/programs/fileindex-web/web_harness.h"

#include <netinet/in.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include "common/json_util.h"

namespace corvlumex {
namespace testing_support {
namespace {

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

}  // namespace

WebSandbox::WebSandbox(const std::vector<std::string>& web_args) {
  StartAll();
  const std::string link = root() + "/var/run/fileindex-web.sign-in";
  for (int attempt = 0; attempt < 5 && !web_; ++attempt) {
    port_ = FreePort();
    std::vector<std::string> args = {"--port", std::to_string(port_), "--web-root", std::string(FILEINDEX_SOURCE_DIR) + "/web",
                                     "--sign-in-link-file", link};
    args.insert(args.end(), web_args.begin(), web_args.end());
    web_ = std::make_unique<ChildProcess>(ProgramPath("fileindex-web"), args, root() + "/fileindex-web.log");
    // The link is written once the port is bound; a lost race for the port ends the daemon.
    if (!PollUntil([&] { return access(link.c_str(), F_OK) == 0 || !web_->Running(); }, std::chrono::seconds(20)) ||
        !web_->Running()) {
      web_.reset();
    }
  }
}

std::string WebSandbox::SignInLink() {
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

std::string Reply::header(const std::string& name) const {
  const auto found = headers.find(name);
  return found == headers.end() ? "" : found->second;
}

Reply WebClient::Finish(const httplib::Result& result) {
  Reply reply;
  if (!result) return reply;
  reply.status = result->status;
  reply.body = result->body;
  reply.headers = result->headers;
  JsonFromString(reply.json, result->body);
  const std::string set_cookie = result->get_header_value("Set-Cookie");
  const std::string name = "fileindex_session=";
  if (set_cookie.compare(0, name.size(), name) == 0) cookie = set_cookie.substr(name.size(), set_cookie.find(';') - name.size());
  if (reply.json["data"].isObject() && reply.json["data"]["csrf_token"].isString()) {
    csrf_token = reply.json["data"]["csrf_token"].asString();
  }
  return reply;
}

httplib::Client WebClient::Connect() const {
  httplib::Client client((https_ ? "https://127.0.0.1:" : "http://127.0.0.1:") + std::to_string(port_));
  client.enable_server_certificate_verification(false);  // the test's own certificate
  return client;
}

Reply WebClient::Get(const std::string& path_and_query) {
  httplib::Client client = Connect();
  httplib::Headers headers;
  if (!cookie.empty()) headers.emplace("Cookie", "fileindex_session=" + cookie);
  return Finish(client.Get(path_and_query.c_str(), headers));
}

Reply WebClient::PostRaw(const std::string& path, const std::string& body, const std::string& content_type,
                         const httplib::Headers& extra) {
  httplib::Client client = Connect();
  httplib::Headers headers = extra;
  if (!cookie.empty()) headers.emplace("Cookie", "fileindex_session=" + cookie);
  return Finish(client.Post(path.c_str(), headers, body, content_type.c_str()));
}

Reply WebClient::Post(const std::string& path, const std::string& body) {
  return PostRaw(path, body, "application/json", {{"X-CSRF-Token", csrf_token}});
}

bool WebClient::UseLink(const std::string& url) {
  const size_t path_start = url.find('/', url.find("://") + 3);
  if (path_start == std::string::npos || Get(url.substr(path_start)).status != 303) return false;
  return Get("/api/session").status == 200;
}

Reply WebClient::SignIn(const std::string& user, const std::string& password) {
  Json::Value body;
  body["user"] = user;
  body["password"] = password;
  return PostRaw("/api/sign-in", JsonToString(body), "application/json", {});
}

std::string Escape(const std::string& value) { return httplib::detail::encode_query_param(value); }

}  // namespace testing_support
}  // namespace corvlumex
