// The daemon's command socket: one framed JSON request {"type", "data"} per
// connection, answered with one framed JSON object {"success": true,
// "data": ...} or {"success": false, "error": {"code", "msg"}}. Commands
// that change something are taken from root and the daemon's own user only.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <functional>
#include <string>

namespace corvlumex {
namespace fileindexd {

class CommandServer {
 public:
  // `handler(type, data)` returns the answer's data or throws Error.
  using Handler = std::function<Json::Value(const std::string& type, const Json::Value& data)>;
  using ReadOnly = std::function<bool(const std::string& type)>;

  CommandServer(std::string socket_path, Handler handler, ReadOnly read_only);
  ~CommandServer();

  // Binds the socket (a stale socket file is replaced; a live one is an
  // Error: another daemon runs). Mode 0666: any user may ask for status.
  void Listen();
  // Serves until Stop(); one request at a time.
  void Run();
  // Async-signal-safe.
  void Stop();

  // The answer text for one request text from a peer with user id `uid`.
  std::string Answer(const std::string& request, uid_t uid);

 private:
  void Serve(int fd);

  std::string socket_path_;
  Handler handler_;
  ReadOnly read_only_;
  int listen_fd_ = -1;
  int stop_pipe_[2] = {-1, -1};
};

}  // namespace fileindexd
}  // namespace corvlumex
