#include "programs/fileindex-web/auth_routes.h"

#include <fcntl.h>
#include <unistd.h>

#include "common/file_util.h"
#include "common/log.h"
#include "programs/fileindex-web/accounts.h"
#include "programs/fileindex-web/api_error.h"
#include "programs/fileindex-web/pam_sign_in.h"
#include "programs/fileindex-web/request_body.h"

namespace corvlumex {
namespace web {
namespace {

Json::Value SessionInfo(const Session& session) {
  Json::Value info(Json::objectValue);
  info["user"] = session.user;
  info["admin"] = session.admin;
  info["csrf_token"] = session.csrf_token;
  return info;
}

void StartSession(WebContext& context, const Account& account, httplib::Response& response) {
  const Session session = context.sessions.Create(account.name, account.uid,
                                                  IsAdministrator(account, context.options.admin_group),
                                                  SessionStore::Clock::now());
  response.set_header("Set-Cookie", SessionCookieHeader(context, session.id));
  ReplyJson(response, SessionInfo(session));
}

}  // namespace

void AddAuthRoutes(httplib::Server& server, WebContext& context) {
  server.Post("/api/sign-in", [&context](const httplib::Request& request, httplib::Response& response) {
    const Json::Value body = ParseBody(request.body, {"user", "password"});
    const std::string user = RequiredString(body, "user");
    const std::string password = RequiredString(body, "password");
    const auto now = SignInThrottle::Clock::now();
    if (const long long wait = context.throttle.WaitSeconds(user, request.remote_addr, now); wait > 0) {
      response.set_header("Retry-After", std::to_string(wait));
      throw ApiError(429, "too many failed sign-ins", "wait " + std::to_string(wait) + " s and try again");
    }
    std::string why;
    const std::optional<Account> account = FindAccount(user);
    if (!account || !PamSignIn(context.options.pam_service, user, password, &why)) {
      // Counted from the answer, not the question: PAM itself delays a failure.
      context.throttle.Failed(user, request.remote_addr, SignInThrottle::Clock::now());
      CORV_LOG("web sign-in of \"%s\" from %s refused: %s", user.c_str(), request.remote_addr.c_str(),
               account ? why.c_str() : "no such user");
      throw ApiError(401, "wrong user name or password", "check both and sign in again");
    }
    context.throttle.Succeeded(user);
    StartSession(context, *account, response);
  });

  server.Post("/api/sign-out", [&context](const httplib::Request& request, httplib::Response& response) {
    ParseBody(request.body, {});
    context.sessions.End(RequireSession(request, context).id);
    response.set_header("Set-Cookie", SessionCookieHeader(context, ""));
    ReplyJson(response, Json::Value(Json::objectValue));
  });

  server.Get("/api/session", [&context](const httplib::Request& request, httplib::Response& response) {
    CheckParams(request.params, {});
    ReplyJson(response, SessionInfo(RequireSession(request, context)));
  });

  server.Get("/sign-in/once", [&context](const httplib::Request& request, httplib::Response& response) {
    CheckParams(request.params, {"token"});
    const std::optional<std::string> user = context.links.Redeem(Param(request.params, "token").value_or(""),
                                                                 OneTimeLinks::Clock::now());
    const std::optional<Account> account = user ? FindAccount(*user) : std::nullopt;
    if (!account) throw ApiError(401, "this sign-in link is used up or too old", "run scripts/run again for a new link");
    StartSession(context, *account, response);
    response.status = 303;
    response.set_header("Location", "/");
  });
}

void WriteSignInLink(WebContext& context) {
  if (context.options.sign_in_link_file.empty()) return;
  const std::optional<Account> self = FindAccount(geteuid());
  if (!self) return;
  const std::string token = context.links.Issue(self->name, OneTimeLinks::Clock::now());
  const std::string scheme = context.options.https() ? "https" : "http";
  const std::string host = context.options.address == "0.0.0.0" || context.options.address == "::" ? "127.0.0.1" : context.options.address;
  const std::string url = scheme + "://" + host + ":" + std::to_string(context.options.port) + "/sign-in/once?token=" + token;
  // Readable by the daemon's user only: the link is as good as a password.
  const std::string temporary = context.options.sign_in_link_file + ".tmp";
  const int fd = open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
  if (fd < 0) {
    CORV_LOG("cannot write the sign-in link to %s", temporary.c_str());
    return;
  }
  const std::string line = url + "\n";
  const bool written = write(fd, line.data(), line.size()) == static_cast<ssize_t>(line.size());
  close(fd);
  if (!written || rename(temporary.c_str(), context.options.sign_in_link_file.c_str()) != 0) {
    CORV_LOG("cannot write the sign-in link to %s", context.options.sign_in_link_file.c_str());
  }
}

}  // namespace web
}  // namespace corvlumex
