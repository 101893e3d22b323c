// The daemon's Unix socket: accepts clients, one thread per connection, each
// connection reading request frames and answering each with one frame until
// the client closes it.
#pragma once

#include <sys/types.h>

#include <atomic>
#include <condition_variable>
#include <mutex>
#include <set>
#include <string>

#include "programs/corvelasticd/dispatcher.h"

namespace corvlumex {
namespace elasticd {

struct ServerOptions {
  std::string socket_path;
  mode_t socket_mode = 0666;           // searches are for every local user; changes are checked per command
  gid_t socket_group = static_cast<gid_t>(-1);
  size_t max_frame_bytes = 64u << 20;
  int max_clients = 256;
  int idle_ms = 60000;                 // a kept-open connection with no new request
  int stall_ms = 10000;                // a frame that stops arriving half way
};

class Server {
 public:
  Server(ServerOptions options, Dispatcher& dispatcher);
  ~Server();

  // Binds the socket (replacing a stale one; refusing when another daemon
  // answers on it). Throws std::runtime_error with the reason.
  void Listen();
  // Serves until Stop(); then waits for the open connections to finish.
  void Run();
  // Safe from a signal handler.
  void Stop();

 private:
  void Serve(int fd);

  ServerOptions options_;
  Dispatcher& dispatcher_;
  int listen_fd_ = -1;
  int wake_pipe_[2] = {-1, -1};
  std::mutex mutex_;
  std::condition_variable idle_;
  int active_ = 0;
  std::set<int> open_fds_;
};

}  // namespace elasticd
}  // namespace corvlumex
