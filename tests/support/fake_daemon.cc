#include "tests/support/fake_daemon.h"

#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <stdexcept>

#include "tests/support/child_process.h"
#include "tests/support/frame_client.h"

namespace corvlumex {
namespace testing_support {
namespace {

// Plain full reads and writes: the fake must not depend on the code it tests.
bool ReadAll(int fd, void* buffer, size_t size) {
  char* out = static_cast<char*>(buffer);
  while (size > 0) {
    const ssize_t n = read(fd, out, size);
    if (n <= 0) return false;
    out += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

bool WriteAll(int fd, const void* buffer, size_t size) {
  const char* in = static_cast<const char*>(buffer);
  while (size > 0) {
    const ssize_t n = send(fd, in, size, MSG_NOSIGNAL);
    if (n <= 0) return false;
    in += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

}  // namespace

FakeDaemon::FakeDaemon(const std::string& socket_path, std::string reply_body)
    : reply_body_(std::move(reply_body)) {
  std::filesystem::create_directories(std::filesystem::path(socket_path).parent_path());
  unlink(socket_path.c_str());
  listen_fd_ = BindSocket(socket_path, true);
  if (listen_fd_ < 0) throw std::runtime_error("fake daemon cannot listen on " + socket_path);
  thread_ = std::thread([this] { Serve(); });
}

FakeDaemon::~FakeDaemon() {
  shutdown(listen_fd_, SHUT_RDWR);  // wakes accept()
  thread_.join();
  close(listen_fd_);
}

void FakeDaemon::Serve() {
  for (;;) {
    const int client = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC);
    if (client < 0) return;
    // A client that never sends nor closes (the fault a test looks for) must
    // not keep this thread, and the test that joins it, waiting forever.
    const timeval read_limit{10, 0};
    setsockopt(client, SOL_SOCKET, SO_RCVTIMEO, &read_limit, sizeof(read_limit));
    ReceivedFrame frame;
    if (ReadAll(client, &frame.length, sizeof(frame.length))) {
      frame.body.resize(frame.length);
      if (frame.length == 0 || ReadAll(client, &frame.body[0], frame.length)) {
        {
          std::lock_guard<std::mutex> guard(mutex_);
          frames_.push_back(frame);
        }
        const uint32_t reply_length = static_cast<uint32_t>(reply_body_.size());
        WriteAll(client, &reply_length, sizeof(reply_length));
        WriteAll(client, reply_body_.data(), reply_body_.size());
      }
    }
    close(client);
    std::lock_guard<std::mutex> guard(mutex_);
    ++closed_connections_;
  }
}

std::vector<ReceivedFrame> FakeDaemon::Frames() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return frames_;
}

bool FakeDaemon::WaitForClosedConnections(size_t count) const {
  return PollUntil(
      [&] {
        std::lock_guard<std::mutex> guard(mutex_);
        return closed_connections_ >= count;
      },
      std::chrono::seconds(5));
}

}  // namespace testing_support
}  // namespace corvlumex
