// What every route of the web daemon shares: the options, the sessions, the
// sign-in throttle and one-time links, and the helpers that read the caller's
// session and answer in JSON.
#pragma once

#include <httplib.h>
#include <json/json.h>

#include <string>

#include "programs/fileindex-web/one_time_links.h"
#include "programs/fileindex-web/session_store.h"
#include "programs/fileindex-web/sign_in_throttle.h"
#include "programs/fileindex-web/web_options.h"

namespace corvlumex {
namespace web {

constexpr char kSessionCookie[] = "fileindex_session";
constexpr char kCsrfHeader[] = "X-CSRF-Token";

struct WebContext {
  explicit WebContext(const WebOptions& options_in)
      : options(options_in),
        sessions(std::chrono::minutes(options_in.idle_minutes), std::chrono::hours(options_in.lifetime_hours)) {}
  WebOptions options;
  SessionStore sessions;
  SignInThrottle throttle;
  OneTimeLinks links;
};

// The session named by the request's cookie; ApiError 401 when there is none.
Session RequireSession(const httplib::Request& request, WebContext& context);
// The same, for administrators only (403 otherwise).
Session RequireAdmin(const httplib::Request& request, WebContext& context);
// The value of the session cookie ("" when absent).
std::string SessionCookie(const httplib::Request& request);
// The Set-Cookie value that carries `id` (empty id: one that removes it).
std::string SessionCookieHeader(const WebContext& context, const std::string& id);

// {"success": true, "data": data}
void ReplyJson(httplib::Response& response, const Json::Value& data);
// {"success": false, "error": {"code", "reason", "what_to_do"}}
void ReplyError(httplib::Response& response, int status, int code, const std::string& reason, const std::string& what_to_do);

}  // namespace web
}  // namespace corvlumex
