#include "programs/fileindex-web/web_server.h"

#include <openssl/crypto.h>

#include <chrono>
#include <cstring>

#include "common/error.h"
#include "common/log.h"
#include "programs/fileindex-web/admin_routes.h"
#include "programs/fileindex-web/api_error.h"
#include "programs/fileindex-web/auth_routes.h"
#include "programs/fileindex-web/search_routes.h"

namespace corvlumex {
namespace web {
namespace {

// When the request in this server thread began (the pre-routing handler and
// the post-routing handler of one request run on the same thread): sent back
// as Server-Timing so the time spent in the server can be told from the
// network's.
thread_local std::chrono::steady_clock::time_point request_start;

bool StartsWith(const std::string& text, const char* prefix) { return text.compare(0, strlen(prefix), prefix) == 0; }

// Library failures: the code and reason as the operation gave them, with an
// HTTP status that says whose fault it was.
int StatusOfLibraryCode(int code) {
  switch (code) {
    case kErrorBadArgument:
    case kErrorDuplicatedId:
    case kErrorPathCannotIndex:
    case kErrorTooManyFolders:
    case kErrorNoSpace:
      return 400;
    case kErrorShareNotFound:
    case kErrorFolderNotFound:
      return 404;
    default:
      return 500;
  }
}

std::string NextStepOfLibraryCode(int code) {
  switch (code) {
    case kErrorDuplicatedId: return "the folder is already indexed: change it instead";
    case kErrorPathCannotIndex: return "choose a folder on a local share, outside the recycle bin";
    case kErrorNoSpace: return "free space on the share's volume, then try again";
    case kErrorTooManyFolders: return "remove an indexed folder first";
    case kErrorShareNotFound:
    case kErrorFolderNotFound: return "reload the page and choose an existing folder";
    default: return "try again; if it persists, ask an administrator to read the system log";
  }
}

httplib::Server::HandlerResponse Gate(const httplib::Request& request, httplib::Response& response, WebContext& context) {
  if (!StartsWith(request.path, "/api/")) return httplib::Server::HandlerResponse::Unhandled;
  try {
    if (request.method == "POST") {
      const std::string type = request.get_header_value("Content-Type");
      if (!StartsWith(type, "application/json")) {
        throw ApiError(415, "the request body must be sent as application/json", "send JSON with Content-Type application/json");
      }
      if (request.path != "/api/sign-in") {
        const Session session = RequireSession(request, context);
        const std::string token = request.get_header_value(kCsrfHeader);
        if (token.size() != session.csrf_token.size() ||
            CRYPTO_memcmp(token.data(), session.csrf_token.data(), token.size()) != 0) {
          throw ApiError(403, "the request's CSRF token is missing or wrong", "reload the page and try again");
        }
      }
    } else if (request.method == "GET" || request.method == "HEAD") {
      if (request.path != "/api/session") RequireSession(request, context);
    } else {
      throw ApiError(405, "method " + request.method + " is not used here", "use GET to read and POST to change");
    }
  } catch (const ApiError& error) {
    ReplyError(response, error.status(), error.code(), error.what(), error.what_to_do());
    return httplib::Server::HandlerResponse::Handled;
  }
  return httplib::Server::HandlerResponse::Unhandled;
}

void ReplyException(const httplib::Request& request, httplib::Response& response, std::exception_ptr thrown) {
  try {
    std::rethrow_exception(thrown);
  } catch (const ApiError& error) {
    ReplyError(response, error.status(), error.code(), error.what(), error.what_to_do());
  } catch (const Error& error) {
    ReplyError(response, StatusOfLibraryCode(error.code), error.code, error.reason, NextStepOfLibraryCode(error.code));
  } catch (const std::exception& error) {
    CORV_LOG("web request %s %s failed: %s", request.method.c_str(), request.path.c_str(), error.what());
    ReplyError(response, 500, 500, std::string("internal error: ") + error.what(), "ask an administrator to read the system log");
  } catch (...) {
    ReplyError(response, 500, 500, "internal error", "ask an administrator to read the system log");
  }
}

}  // namespace

std::unique_ptr<httplib::Server> MakeServer(WebContext& context) {
  std::unique_ptr<httplib::Server> server;
  if (context.options.https()) {
    auto secure = std::make_unique<httplib::SSLServer>(context.options.certificate.c_str(), context.options.key.c_str());
    if (!secure->is_valid()) throw std::runtime_error("cannot use the certificate " + context.options.certificate + " with the key " + context.options.key);
    server = std::move(secure);
  } else {
    server = std::make_unique<httplib::Server>();
  }
  const int threads = context.options.threads;
  server->new_task_queue = [threads] { return new httplib::ThreadPool(static_cast<size_t>(threads)); };
  server->set_payload_max_length(kMaxBodyBytes);
  // Answers go out in a few writes: without this, delayed acknowledgements
  // hold each one back some 40 ms.
  server->set_tcp_nodelay(true);
  server->set_read_timeout(10, 0);
  server->set_write_timeout(30, 0);
  server->set_keep_alive_timeout(30);
  if (!server->set_mount_point("/", context.options.web_root)) {
    throw std::runtime_error("the web folder " + context.options.web_root + " cannot be read (--web-root)");
  }
  server->set_pre_routing_handler([&context](const httplib::Request& q, httplib::Response& r) {
    request_start = std::chrono::steady_clock::now();
    return Gate(q, r, context);
  });
  server->set_exception_handler(ReplyException);
  server->set_error_handler(httplib::Server::HandlerWithResponse([](const httplib::Request& request, httplib::Response& response) {
    if (!response.body.empty()) return httplib::Server::HandlerResponse::Unhandled;
    if (response.status == 413) {
      ReplyError(response, 413, 413, "the request body is larger than " + std::to_string(kMaxBodyBytes / 1024) + " KiB", "send less");
    } else if (response.status == 404) {
      ReplyError(response, 404, 404, "nothing here: " + request.path, "open the search page at /");
    } else {
      ReplyError(response, response.status, response.status, "the request was refused (" + std::to_string(response.status) + ")", "check the request");
    }
    return httplib::Server::HandlerResponse::Handled;
  }));
  server->set_post_routing_handler([](const httplib::Request& request, httplib::Response& response) {
    response.set_header("X-Content-Type-Options", "nosniff");
    response.set_header("Referrer-Policy", "no-referrer");
    response.set_header("Content-Security-Policy",
                        "default-src 'self'; img-src 'self' data:; object-src 'none'; base-uri 'none'; "
                        "form-action 'self'; frame-ancestors 'none'");
    if (StartsWith(request.path, "/api/")) response.set_header("Cache-Control", "no-store");
    const double ms = std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - request_start).count();
    response.set_header("Server-Timing", "app;dur=" + std::to_string(ms));
  });
  AddAuthRoutes(*server, context);
  AddSearchRoutes(*server, context);
  AddAdminRoutes(*server, context);
  return server;
}

}  // namespace web
}  // namespace corvlumex
