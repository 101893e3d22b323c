#include "programs/fileindex-web/web_context.h"

#include "common/json_util.h"
#include "programs/fileindex-web/api_error.h"

namespace corvlumex {
namespace web {

std::string SessionCookie(const httplib::Request& request) {
  const std::string header = request.get_header_value("Cookie");
  const std::string name = std::string(kSessionCookie) + "=";
  size_t start = 0;
  while (start < header.size()) {
    while (start < header.size() && (header[start] == ' ' || header[start] == ';')) ++start;
    const size_t end = std::min(header.find(';', start), header.size());
    if (header.compare(start, name.size(), name) == 0) return header.substr(start + name.size(), end - start - name.size());
    start = end;
  }
  return "";
}

Session RequireSession(const httplib::Request& request, WebContext& context) {
  const std::string id = SessionCookie(request);
  std::optional<Session> session;
  if (!id.empty()) session = context.sessions.Find(id, SessionStore::Clock::now());
  if (!session) throw ApiError(401, "you are not signed in, or your session has ended", "sign in again");
  return *session;
}

Session RequireAdmin(const httplib::Request& request, WebContext& context) {
  Session session = RequireSession(request, context);
  if (!session.admin) {
    throw ApiError(403, "only administrators may manage indexing",
                   "ask an administrator (root or a member of the group \"" + context.options.admin_group + "\")");
  }
  return session;
}

std::string SessionCookieHeader(const WebContext& context, const std::string& id) {
  std::string cookie = std::string(kSessionCookie) + "=" + id + "; Path=/; HttpOnly; SameSite=Strict";
  if (context.options.https()) cookie += "; Secure";
  cookie += id.empty() ? "; Max-Age=0" : "; Max-Age=" + std::to_string(context.options.lifetime_hours * 3600);
  return cookie;
}

void ReplyJson(httplib::Response& response, const Json::Value& data) {
  Json::Value answer(Json::objectValue);
  answer["success"] = true;
  answer["data"] = data;
  response.set_content(JsonToString(answer), "application/json");
}

void ReplyError(httplib::Response& response, int status, int code, const std::string& reason, const std::string& what_to_do) {
  Json::Value answer(Json::objectValue);
  answer["success"] = false;
  answer["error"]["code"] = code;
  answer["error"]["reason"] = reason;
  answer["error"]["what_to_do"] = what_to_do;
  response.status = status;
  response.set_content(JsonToString(answer), "application/json");
}

}  // namespace web
}  // namespace corvlumex
