#include "programs/corvelasticd/server.h"

#include <fcntl.h>
#include <malloc.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <stdexcept>
#include <system_error>
#include <new>
#include <thread>

#include "common/error.h"
#include "common/frame.h"
#include "common/frame_reader.h"
#include "common/log.h"
#include "common/sys.h"
#include "programs/corvelasticd/daemon_error.h"

namespace corvlumex {
namespace elasticd {
namespace {

// Workers started with the server, and the most that stay waiting after a burst.
constexpr int kStartWorkers = 2;
constexpr int kMaxIdleWorkers = 4;
// A request at least this large gives its memory back to the system once answered.
constexpr size_t kTrimAfterBytes = 1u << 20;

void SendAnswer(int fd, const std::string& answer) {
  try {
    WriteFrame(fd, answer);
  } catch (const Error&) {
    // The client went away; there is nobody left to tell.
  }
}

}  // namespace

Server::Server(ServerOptions options, Dispatcher& dispatcher) : options_(std::move(options)), dispatcher_(dispatcher) {
  if (pipe2(wake_pipe_, O_CLOEXEC | O_NONBLOCK) != 0) throw std::runtime_error(std::string("pipe: ") + strerror(errno));
}

Server::~Server() {
  listener_.reset();
  close(wake_pipe_[0]);
  close(wake_pipe_[1]);
}

void Server::Listen() {
  fileindex::UnixListenerOptions listen_options;
  listen_options.mode = options_.socket_mode;
  listen_options.group = options_.socket_group;
  try {
    listener_ = std::make_unique<fileindex::UnixListener>(options_.socket_path, listen_options);
  } catch (const Error& error) {
    throw std::runtime_error(error.reason);
  }
}

void Server::Stop() {
  const char byte = 1;
  if (write(wake_pipe_[1], &byte, 1) < 0) {
    // The pipe is full: a wake-up is already pending.
  }
}

void Server::Run() {
  {
    std::lock_guard<std::mutex> guard(mutex_);
    for (int i = 0; i < kStartWorkers; ++i) StartWorker();
  }
  for (;;) {
    struct pollfd poller = {wake_pipe_[0], POLLIN, 0};
    if (poll(&poller, 1, -1) > 0) break;
    if (errno != EINTR) {
      CORV_LOG_FAILED("poll(wake pipe)");
      break;
    }
  }
  // Connections finish the request they are in; no new request is read.
  std::unique_lock<std::mutex> lock(mutex_);
  stopping_ = true;
  for (const int fd : open_fds_) shutdown(fd, SHUT_RD);
  all_done_.wait(lock, [this] { return workers_ == 0; });
}

void Server::StartWorker() {
  ++workers_;
  ++waiting_;
  try {
    std::thread([this] { WorkerLoop(); }).detach();
  } catch (const std::system_error& error) {
    // No thread to be had now (a flood of connections): the running
    // workers serve on; the next connection tries again.
    --workers_;
    --waiting_;
    CORV_LOG("cannot start a connection worker: %s", error.what());
  }
}

int Server::Accept(int poll_fd, fileindex::PeerCredentials* peer) {
  for (;;) {
    struct epoll_event event;
    const int ready = epoll_wait(poll_fd, &event, 1, -1);
    if (ready < 0 && errno != EINTR) {
      CORV_LOG_FAILED("epoll_wait(listen socket)");
      return -1;
    }
    if (ready <= 0) continue;
    if (event.data.fd == wake_pipe_[0]) return -1;
    const int fd = listener_->Accept(peer);
    if (fd >= 0) return fd;
    if (errno == EMFILE || errno == ENFILE || errno == ENOBUFS || errno == ENOMEM) {
      // Out of descriptors or memory: let the connections in progress end.
      SleepFor(std::chrono::milliseconds(10));
    }
    errno = 0;  // another worker took it, or the client gave up (or hid who it is)
  }
}

void Server::WorkerLoop() {
  // Each worker waits on its own epoll set; EPOLLEXCLUSIVE wakes one waiting
  // worker per connection, while a stop wakes them all.
  const int poll_fd = epoll_create1(EPOLL_CLOEXEC);
  const int listen_fd = listener_->fd();
  struct epoll_event listen_event = {EPOLLIN | EPOLLEXCLUSIVE, {}};
  listen_event.data.fd = listen_fd;
  struct epoll_event wake_event = {EPOLLIN, {}};
  wake_event.data.fd = wake_pipe_[0];
  if (poll_fd < 0 || epoll_ctl(poll_fd, EPOLL_CTL_ADD, listen_fd, &listen_event) != 0 ||
      epoll_ctl(poll_fd, EPOLL_CTL_ADD, wake_pipe_[0], &wake_event) != 0) {
    CORV_LOG_FAILED("epoll(listen socket)");
  }
  std::unique_lock<std::mutex> lock(mutex_);
  while (!stopping_) {
    lock.unlock();
    fileindex::PeerCredentials credentials;
    const int fd = poll_fd >= 0 ? Accept(poll_fd, &credentials) : -1;
    lock.lock();
    --waiting_;
    if (fd < 0 || stopping_) {
      if (fd >= 0) close(fd);
      break;
    }
    if (serving_ >= options_.max_clients) {
      lock.unlock();
      SendAnswer(fd, Dispatcher::ErrorAnswer(kCodeBusy, "Too many clients; try again later"));
      close(fd);
      lock.lock();
      ++waiting_;
      continue;
    }
    const PeerIdentity peer = ReadPeerIdentity(fd, credentials);
    const bool counted = peer.uid != 0 && std::find(options_.trusted_uids.begin(), options_.trusted_uids.end(), peer.uid) ==
                                              options_.trusted_uids.end();
    if (counted && per_user_[peer.uid] >= options_.max_clients_per_user) {
      lock.unlock();
      SendAnswer(fd, Dispatcher::ErrorAnswer(kCodeBusy, "Too many connections from user " + std::to_string(peer.uid) +
                                                            "; close some or try again later"));
      close(fd);
      lock.lock();
      ++waiting_;
      continue;
    }
    if (counted) ++per_user_[peer.uid];
    ++serving_;
    open_fds_.insert(fd);
    // Someone must be waiting for the next client (or to tell it the server is full).
    if (waiting_ == 0 && workers_ <= options_.max_clients) StartWorker();
    lock.unlock();
    const struct timeval send_timeout = {options_.stall_ms / 1000, (options_.stall_ms % 1000) * 1000};
    setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &send_timeout, sizeof(send_timeout));
    Serve(fd, peer);
    lock.lock();
    open_fds_.erase(fd);
    close(fd);
    --serving_;
    if (counted && --per_user_[peer.uid] == 0) per_user_.erase(peer.uid);
    if (waiting_ >= kMaxIdleWorkers) break;
    ++waiting_;
  }
  if (poll_fd >= 0) close(poll_fd);
  if (--workers_ == 0) all_done_.notify_all();
}

void Server::Serve(int fd, const PeerIdentity& peer) {
  std::string request;
  for (;;) {
    const FrameStatus status =
        ReadFrameBounded(fd, options_.max_frame_bytes, options_.idle_ms, options_.stall_ms, &request, options_.frame_ms);
    if (status == FrameStatus::kTooLarge) {
      // The rest of the frame is not read, so the connection cannot go on.
      SendAnswer(fd, Dispatcher::ErrorAnswer(kCodeFrameTooLarge, "The request is larger than " +
                                                                     std::to_string(options_.max_frame_bytes) + " bytes"));
      return;
    }
    if (status == FrameStatus::kTimeout) {
      SendAnswer(fd, Dispatcher::ErrorAnswer(kCodeBadRequest, "The request did not arrive in time"));
      return;
    }
    if (status != FrameStatus::kOk) return;
    const size_t request_bytes = request.size();
    // Handed over whole: the request's text is let go once it is parsed.
    SendAnswer(fd, AnswerTo(std::move(request), peer));
    if (request_bytes >= kTrimAfterBytes) {
      // A large document passes through several copies (frame, JSON, tokens)
      // on whichever connection thread served it; each thread's heap would
      // keep that peak for good. Handing it back costs little beside the
      // request itself.
      std::string().swap(request);
      malloc_trim(0);
    }
  }
}

std::string Server::AnswerTo(std::string request, const PeerIdentity& peer) {
  // Whatever one request throws ends that request, never the daemon: an
  // exception leaving a worker thread would abort every search.
  const size_t request_bytes = request.size();
  try {
    return dispatcher_.Handle(std::move(request), peer);
  } catch (const std::bad_alloc&) {
    CORV_LOG("a request of %zu bytes ran out of memory", request_bytes);
    return Dispatcher::ErrorAnswer(kCodeInternal, "The daemon ran out of memory for this request");
  } catch (const std::exception& error) {
    CORV_LOG("a request failed unexpectedly: %s", error.what());
    return Dispatcher::ErrorAnswer(kCodeInternal, std::string("Internal error: ") + error.what());
  } catch (...) {
    CORV_LOG("a request failed unexpectedly");
    return Dispatcher::ErrorAnswer(kCodeInternal, "Internal error");
  }
}

}  // namespace elasticd
}  // namespace corvlumex
