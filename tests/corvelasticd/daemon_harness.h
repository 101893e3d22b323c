// Runs the real corvelasticd on a private socket inside a sandbox root and
// talks to it the way the library does: one framed JSON request, one answer.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <string>
#include <vector>

namespace corvlumex {
namespace elasticd_test {

// The mappings the library sends at index creation (the fields the tests use).
Json::Value LibraryMappings();

// A document as the library's extraction would give it.
Json::Value FileDocument(const std::string& path, const std::string& text, long long size);

class Daemon {
 public:
  // `root` is the sandbox root (CORVLUMEX_ROOT of the daemon).
  explicit Daemon(const std::string& root, std::vector<std::string> extra_args = {});
  ~Daemon();

  void Start();
  void Kill9();
  // SIGTERM and wait; returns the exit status.
  int Terminate();
  const std::string& socket_path() const { return socket_; }
  std::string LogText() const;

 private:
  std::string root_;
  std::string socket_;
  std::string log_;
  std::vector<std::string> extra_args_;
  pid_t pid_ = -1;
};

// A connection to the socket (-1 when refused), and one request/answer on it.
int ConnectTo(const std::string& socket);
Json::Value Exchange(int fd, const Json::Value& request);

// One request on a fresh connection; the parsed answer.
Json::Value Send(const std::string& socket, const Json::Value& request);
// Raw bytes in, raw answer text out ("" when the daemon closed without answering).
std::string SendRaw(const std::string& socket, const std::string& bytes);
// {"command": command, "data": data}
Json::Value Command(const std::string& socket, const std::string& command, const Json::Value& data);
// A frame of `text` (length with the trailing NUL, text, NUL).
std::string Frame(const std::string& text);

// The doc_ids of a search answer, in order.
std::vector<std::string> HitIds(const Json::Value& answer);

}  // namespace elasticd_test
}  // namespace corvlumex
