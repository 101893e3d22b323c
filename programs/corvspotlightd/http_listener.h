// The HTTP side of the responder: cpp-httplib on a loopback address.
//
// What Samba's HTTP client needs (libcli/http): HTTP/1.1 answers with a
// reason phrase, a Content-Length on every answer and never a chunked body;
// one persistent connection per Spotlight client and share, with one
// request at a time and no notice when we close it (its next search would
// fail), so idle connections are kept for `idle_timeout`, and each connection
// holds one thread of a pool of `max_connections`.
//
// Every request's peer is checked first (peer_gate.h): anyone but root, the
// service user and Samba acting for an SMB user gets 403 and the connection
// is closed. Routes:
//   POST /<index>/_search[?...]   the search (search_handler.h)
//   any other method there        405
//   anything else                 404
// Bodies over `max_body_bytes` are 413; a request that stalls half-way is
// dropped after `read_timeout`.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <memory>
#include <set>
#include <string>

#include "platform/platform.h"
#include "programs/corvspotlightd/peer_gate.h"
#include "programs/corvspotlightd/search_handler.h"

namespace httplib {
class Server;
}

namespace corvlumex {
namespace spotlightd {

constexpr int kDefaultPort = platform::kSpotlightResponderPort;

struct ListenerOptions {
  std::string address = "127.0.0.1";
  int port = kDefaultPort;  // 0: any free port
  std::set<uid_t> allowed_uids = {0};
  size_t max_connections = 128;
  std::chrono::seconds idle_timeout{24 * 3600};
  std::chrono::seconds read_timeout{10};
  size_t max_body_bytes = 1024 * 1024;
};

class HttpListener {
 public:
  HttpListener(ListenerOptions options, const SearchHandler& handler);
  ~HttpListener();
  HttpListener(const HttpListener&) = delete;
  HttpListener& operator=(const HttpListener&) = delete;

  // Binds the address; the port bound (the free one chosen for port 0), or
  // -1 with the reason logged.
  int Bind();
  // Serves until Stop(); false when serving failed.
  bool Serve();
  // Callable from any thread (a signal thread).
  void Stop();

 private:
  ListenerOptions options_;
  PeerGate gate_;
  const SearchHandler& handler_;
  std::unique_ptr<httplib::Server> server_;
};

}  // namespace spotlightd
}  // namespace corvlumex
