// A client of the system's framed Unix sockets that sends whatever bytes a
// test (or a hostile-input benchmark) gives it, and reads the answer frame.
#pragma once

#include <chrono>
#include <string>

namespace corvlumex {
namespace testing_support {

// A connection to the socket (-1 when refused).
int ConnectTo(const std::string& socket);
// A socket bound on `path`, listening when asked (-1 when it cannot be): a
// daemon's own, or with `listening` false the file a crashed one leaves.
int BindSocket(const std::string& path, bool listening);
// Polls until `socket` takes connections: its file exists from bind(), before
// the daemon listens.
bool WaitUntilListening(const std::string& socket, std::chrono::milliseconds timeout = std::chrono::seconds(20));
// A frame of `text` (length with the trailing NUL, text, NUL).
std::string Frame(const std::string& text);
// Raw bytes in (then the sending side is shut), raw answer text out (""
// when the daemon closed without answering); waits at most `wait_ms` for
// the answer.
std::string SendRaw(const std::string& socket, const std::string& bytes, int wait_ms = 20000);

}  // namespace testing_support
}  // namespace corvlumex
