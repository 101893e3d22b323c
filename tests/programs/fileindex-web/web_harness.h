// The whole system and the web daemon in a sandbox root, and a browser-like
// client: the real corvelasticd, corvnotifyd and fileindexd (SystemSandbox)
// plus fileindex-web on a free loopback port, signed in through its one-time
// link or PAM, with the session cookie and CSRF token kept per client.
#pragma once

#include <httplib.h>
#include <json/json.h>

#include <memory>
#include <string>
#include <vector>

#include "tests/system/system_harness.h"

namespace corvlumex {
namespace testing_support {

class WebSandbox : public SystemSandbox {
 public:
  // Starts the three daemons and fileindex-web with `web_args` added.
  explicit WebSandbox(const std::vector<std::string>& web_args = {});
  int port() const { return port_; }
  // A fresh one-time link for the daemon's own user (each works once).
  std::string SignInLink();
  bool WebRunning() { return web_->Running(); }
  std::string WebLog() const { return web_->Log(); }

 private:
  int port_ = 0;
  std::unique_ptr<ChildProcess> web_;
  std::string last_link_;
};

struct Reply {
  int status = 0;  // 0: no answer
  Json::Value json;
  std::string body;
  std::string header(const std::string& name) const;
  httplib::Headers headers;
};

class WebClient {
 public:
  explicit WebClient(int port, bool https = false) : port_(port), https_(https) {}
  Reply Get(const std::string& path_and_query);
  // POST of `body` as JSON with the session's CSRF token.
  Reply Post(const std::string& path, const std::string& body);
  Reply PostRaw(const std::string& path, const std::string& body, const std::string& content_type,
                const httplib::Headers& headers);
  // Follows a one-time link; true when it signed in.
  bool UseLink(const std::string& url);
  Reply SignIn(const std::string& user, const std::string& password);
  std::string cookie;      // the session id, as the browser keeps it
  std::string csrf_token;

 private:
  Reply Finish(const httplib::Result& result);
  httplib::Client Connect() const;
  int port_;
  bool https_;
};

// "a b" -> "a%20b": a query parameter value.
std::string Escape(const std::string& value);

}  // namespace testing_support
}  // namespace corvlumex
