// The daemon's Unix socket. A pool of worker threads takes the connections:
// each worker accepts one, reads its request frames and answers each with
// one frame until the client closes it, then accepts the next. The pool
// grows while every worker is busy (up to --max-clients, plus one that
// answers "busy" beyond that) and shrinks back to a few idle workers, so a
// request costs no thread start and no hand-over between threads.
#pragma once

#include <sys/types.h>

#include <atomic>
#include <condition_variable>
#include <mutex>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "fileindex/unix_listener.h"
#include "programs/corvelasticd/dispatcher.h"

namespace corvlumex {
namespace elasticd {

struct ServerOptions {
  std::string socket_path;
  mode_t socket_mode = 0666;           // searches are for every local user; changes are checked per command
  gid_t socket_group = static_cast<gid_t>(-1);
  size_t max_frame_bytes = 64u << 20;
  int max_clients = 256;
  // Connections one user may hold, so that nobody can take every connection
  // (and with them search and indexing) for himself; root and `trusted_uids`
  // (the library's users) are not counted.
  int max_clients_per_user = 64;
  std::vector<uid_t> trusted_uids;
  int idle_ms = 60000;                 // a kept-open connection with no new request
  int stall_ms = 10000;                // a frame that stops arriving half way
  int frame_ms = 60000;                // a whole frame, from its first byte (a client trickling bytes)
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
  void Serve(int fd, const PeerIdentity& peer);
  // The answer to one request text; never throws.
  std::string AnswerTo(std::string request, const PeerIdentity& peer);
  // With mutex_ held.
  void StartWorker();
  void WorkerLoop();
  // The next connection and its peer, or -1 when the server stops.
  int Accept(int poll_fd, fileindex::PeerCredentials* peer);

  ServerOptions options_;
  Dispatcher& dispatcher_;
  std::unique_ptr<fileindex::UnixListener> listener_;
  int wake_pipe_[2] = {-1, -1};
  std::mutex mutex_;
  std::condition_variable all_done_;
  bool stopping_ = false;
  int workers_ = 0;   // threads alive
  int waiting_ = 0;   // workers waiting for a connection
  int serving_ = 0;   // connections being served
  std::set<int> open_fds_;
  std::map<uid_t, int> per_user_;  // connections served, by user (the counted ones)
};

}  // namespace elasticd
}  // namespace corvlumex
