#include "programs/corvspotlightd/http_listener.h"

#include <httplib.h>

#include <limits>

#include "common/log.h"
#include "programs/corvspotlightd/answer_writer.h"

namespace corvlumex {
namespace spotlightd {
namespace {

constexpr char kSearchRoute[] = R"(/([^/]+)/_search)";
constexpr char kJson[] = "application/json";

// "/<index>/_search", the one path served.
bool IsSearchPath(const std::string& path) {
  const size_t slash = path.find('/', 1);
  return path.size() > 1 && path[0] == '/' && slash != std::string::npos && slash > 1 &&
         path.compare(slash, std::string::npos, "/_search") == 0;
}

void Answer(httplib::Response& response, int status, const std::string& type, const std::string& reason) {
  response.status = status;
  response.set_content(WriteErrorAnswer(status, type, reason), kJson);
}

}  // namespace

HttpListener::HttpListener(ListenerOptions options, const SearchHandler& handler)
    : options_(std::move(options)), gate_(options_.allowed_uids), handler_(handler), server_(std::make_unique<httplib::Server>()) {
  httplib::Server& server = *server_;
  const size_t threads = options_.max_connections;
  server.new_task_queue = [threads] { return new httplib::ThreadPool(threads); };
  server.set_keep_alive_max_count(std::numeric_limits<size_t>::max());
  server.set_keep_alive_timeout(options_.idle_timeout.count());
  server.set_read_timeout(options_.read_timeout.count(), 0);
  server.set_write_timeout(options_.read_timeout.count(), 0);
  server.set_payload_max_length(options_.max_body_bytes);

  server.set_pre_routing_handler([this](const httplib::Request& request, httplib::Response& response) {
    if (gate_.Allowed(TcpConnection{request.local_addr, request.local_port, request.remote_addr, request.remote_port})) {
      return httplib::Server::HandlerResponse::Unhandled;
    }
    Answer(response, 403, "security_exception", "only Samba may search here (root or the service user)");
    response.set_header("Connection", "close");
    return httplib::Server::HandlerResponse::Handled;
  });
  server.Post(kSearchRoute, [this](const httplib::Request& request, httplib::Response& response) {
    const HttpAnswer answer = handler_.Search(request.matches[1], request.body);
    response.status = answer.status;
    response.set_content(answer.body, kJson);
  });
  const auto refuse = [](const httplib::Request& request, httplib::Response& response) {
    if (IsSearchPath(request.path)) {
      Answer(response, 405, "method_not_allowed", request.method + " " + request.path + ": only POST searches here");
      response.set_header("Allow", "POST");
    } else {
      Answer(response, 404, "not_found", request.method + " " + request.path + ": only POST /<index>/_search is served");
    }
  };
  server.Get(".*", refuse);
  server.Put(".*", refuse);
  server.Delete(".*", refuse);
  server.Patch(".*", refuse);
  server.Options(".*", refuse);
  server.Post(".*", refuse);
  // Faults httplib answers itself (400 unreadable request, 413 too large...)
  // get a body saying so; our own answers already have one.
  server.set_error_handler([](const httplib::Request& request, httplib::Response& response) {
    if (!response.body.empty()) return;
    Answer(response, response.status, "http_error",
           "HTTP " + std::to_string(response.status) + " for " + request.method + " " + request.path +
               (response.status == 413 ? ": the body is too large" : ""));
  });
  server.set_exception_handler([](const httplib::Request&, httplib::Response& response, std::exception_ptr error) {
    std::string what = "unexpected failure";
    try {
      std::rethrow_exception(error);
    } catch (const std::exception& e) {
      what = e.what();
    } catch (...) {
    }
    CORV_LOG("request failed: %s", what.c_str());
    Answer(response, 500, "internal_error", what);
  });
}

HttpListener::~HttpListener() = default;

int HttpListener::Bind() {
  const int port = options_.port == 0 ? server_->bind_to_any_port(options_.address)
                                      : (server_->bind_to_port(options_.address, options_.port) ? options_.port : -1);
  if (port < 0) CORV_LOG("cannot listen on %s port %d", options_.address.c_str(), options_.port);
  return port;
}

bool HttpListener::Serve() { return server_->listen_after_bind(); }

void HttpListener::Stop() { server_->stop(); }

}  // namespace spotlightd
}  // namespace corvlumex
