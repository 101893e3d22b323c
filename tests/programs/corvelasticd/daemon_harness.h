// Runs the real corvelasticd on a private socket inside a sandbox root and
// talks to it the way the library does: one framed JSON request, one answer.
#pragma once

#include <gtest/gtest.h>
#include <json/json.h>

#include <memory>
#include <string>
#include <vector>

#include "tests/support/child_process.h"
#include "tests/support/frame_client.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace elasticd_test {

constexpr const char* kIndex = "fileindex_share";

// The mappings the library sends at index creation.
Json::Value LibraryMappings();

// A document as the library's extraction would give it.
Json::Value FileDocument(const std::string& path, const std::string& text, long long size);

// The value of a JSON text (the test fails when it is not JSON).
Json::Value Data(const std::string& text);

class Daemon {
 public:
  // `root` is the sandbox root (CORVLUMEX_ROOT of the daemon).
  explicit Daemon(const std::string& root, std::vector<std::string> extra_args = {});

  // Starts the daemon and waits until its socket answers (again after a stop).
  void Start();
  void Kill9() { process_.reset(); }
  // SIGTERM and wait; returns the exit status.
  int Terminate();
  const std::string& socket_path() const { return socket_; }
  std::string LogText() const { return testing_support::ReadFileText(log_); }

 private:
  std::string root_;
  std::string socket_;
  std::string log_;
  std::vector<std::string> extra_args_;
  std::unique_ptr<testing_support::ChildProcess> process_;
};

using testing_support::ConnectTo;
using testing_support::Frame;
using testing_support::SendRaw;

// One request/answer on a connection.
Json::Value Exchange(int fd, const Json::Value& request);

// One request on a fresh connection; the parsed answer.
Json::Value Send(const std::string& socket, const Json::Value& request);
// {"command": command, "data": data}
Json::Value Command(const std::string& socket, const std::string& command, const Json::Value& data);

// The doc_ids of a search answer, in order.
std::vector<std::string> HitIds(const Json::Value& answer);

// A started daemon with the index kIndex created at
// <root>/volume1/share/@eaDir/index, naming HandlerPath() as its event handler.
class DaemonTest : public ::testing::Test {
 protected:
  void SetUp() override;
  virtual std::vector<std::string> ExtraArgs() { return {}; }
  // The event handler the index names (none installed by default).
  virtual std::string HandlerPath() { return root_.path() + "/no/such/handler.so"; }

  // The command with "id": kIndex added to `data` (unless a search names its own).
  Json::Value Run(const std::string& command, Json::Value data = Json::Value(Json::objectValue));
  Json::Value Run(const std::string& command, const std::string& data) { return Run(command, Data(data)); }
  Json::Value Run(const std::string& command, const char* data) { return Run(command, Data(data)); }
  void Upsert(const std::string& path, const std::string& text = "", long long size = 1);
  void Commit();
  // A search of `qsl` with the other members of `extra`.
  Json::Value Search(const std::string& qsl, const std::string& extra = "{}");

  testing_support::Sandbox root_;
  std::unique_ptr<Daemon> daemon_;
};

}  // namespace elasticd_test
}  // namespace corvlumex
