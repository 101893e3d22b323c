// The daemon's command socket: one framed JSON request {"type", "data"} per
// connection, answered with one framed JSON object {"success": true,
// "data": ...} or {"success": false, "error": {"code", "msg"}}. Commands
// that change something are taken from root and the daemon's own user only.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>

#include "fileindex/unix_listener.h"

namespace corvlumex {
namespace fileindexd {

// What one client may cost the command socket.
struct CommandLimits {
  uint32_t max_request_bytes = 1u << 20;  // the commands carry a share name or a time
  int request_timeout_ms = 5000;          // to begin a request, and then to send it whole
  // Connections of users other than root and the daemon's own read at once,
  // in all and per user; more are answered "try again later".
  int max_connections = 32;
  int max_connections_per_user = 8;
};

class CommandServer {
 public:
  // `handler(type, data)` returns the answer's data or throws Error.
  using Handler = std::function<Json::Value(const std::string& type, const Json::Value& data)>;
  using ReadOnly = std::function<bool(const std::string& type)>;

  CommandServer(std::string socket_path, Handler handler, ReadOnly read_only, CommandLimits limits = {});
  ~CommandServer();

  // Binds the socket (a stale socket file is replaced; a live one, or a
  // file that is not a socket, is an Error: another daemon runs, or the path
  // is wrong). Mode 0666: any user may ask for status. The socket's folder
  // is made when missing.
  void Listen();
  // Serves until Stop(), then waits for the connections in progress. Each
  // connection's request is read on its own thread (so a client that sends
  // nothing, or half a frame, holds up nobody); the commands themselves are
  // run one at a time.
  void Run();
  // Async-signal-safe.
  void Stop();

  // The answer text for one request text from a peer with user id `uid`.
  std::string Answer(const std::string& request, uid_t uid);

 private:
  void Serve(int fd, uid_t uid);

  std::string socket_path_;
  Handler handler_;
  ReadOnly read_only_;
  CommandLimits limits_;
  std::unique_ptr<fileindex::UnixListener> listener_;
  int stop_pipe_[2] = {-1, -1};
  std::mutex handler_mutex_;
  // The connections being served. Shared with their threads, which touch it
  // last, so a server that has seen the set empty may be destroyed at once.
  struct Connections {
    std::mutex mutex;
    std::condition_variable all_closed;
    std::set<int> fds;
    int counted = 0;                 // of users other than root and the daemon's own
    std::map<uid_t, int> per_user;   // the counted ones, by user
  };
  std::shared_ptr<Connections> connections_ = std::make_shared<Connections>();
};

}  // namespace fileindexd
}  // namespace corvlumex
