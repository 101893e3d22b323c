// A stand-in for fileindexd's command socket: accepts connections on a
// private path, records every request frame byte for byte and answers each
// with a chosen reply frame.
#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace corvlumex {
namespace testing_support {

struct ReceivedFrame {
  uint32_t length = 0;  // the 4-byte prefix as sent
  std::string body;     // exactly `length` bytes
};

class FakeDaemon {
 public:
  // Binds and listens on `socket_path` (parents created) at once.
  explicit FakeDaemon(const std::string& socket_path, std::string reply_body = "{}");
  ~FakeDaemon();
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

  std::vector<ReceivedFrame> Frames() const;
  // Waits (really, briefly) until `count` connections were served and closed on this side.
  bool WaitForClosedConnections(size_t count) const;

 private:
  void Serve();

  int listen_fd_ = -1;
  std::string reply_body_;
  mutable std::mutex mutex_;
  std::vector<ReceivedFrame> frames_;
  size_t closed_connections_ = 0;
  std::thread thread_;
};

}  // namespace testing_support
}  // namespace corvlumex
