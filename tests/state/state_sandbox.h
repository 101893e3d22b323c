// A sandbox root laid out like an installed system: the package's etc
// folder, /tmp for lock files, two volumes, a share registry the tests can
// change, and a fake fileindexd on the sandbox's command socket.
#pragma once

#include <json/json.h>

#include <memory>
#include <string>
#include <vector>

#include "tests/state/fake_daemon.h"
#include "tests/support/child_process.h"
#include "tests/support/expect_error.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace testing_support {

struct ShareFlags {
  bool readonly = false;
  bool encrypted = false;
  bool recycle_bin = false;
};

class StateSandbox {
 public:
  // With `daemon`, a FakeDaemon listens on the command socket.
  explicit StateSandbox(bool daemon = true);

  const std::string& root() const { return root_.path(); }
  std::string EtcFile(const std::string& name) const;  // sandboxed package etc path
  // <root>/<volume>; "volume1" and "volume2" exist.
  std::string Volume(const std::string& volume = "volume1") const { return root_.path() + "/" + volume; }
  // Creates <root>/<volume>/<name> with its @eaDir and registers it; returns its directory.
  std::string AddShare(const std::string& name, const std::string& volume = "volume1", ShareFlags flags = {});
  // Renames the share's directory and its registry entry; returns the new directory.
  std::string RenameShare(const std::string& from, const std::string& to);
  // Moves the share's directory to another volume; returns the new directory.
  std::string MoveShare(const std::string& name, const std::string& volume);
  // Drops the share from the registry (its directory stays).
  void RemoveShare(const std::string& name);
  void SetRecycleBin(const std::string& name, bool enabled);
  bool HasShare(const std::string& name) const;
  std::string QueueFile(const std::string& share) const;  // of a registered share
  // Queue lines of a share, parsed.
  std::vector<Json::Value> QueueEvents(const std::string& share) const;

  std::string Write(const std::string& relative, const std::string& content) const {
    return root_.WriteFile(relative, content);
  }
  std::string MakeDir(const std::string& relative) const { return root_.MakeDir(relative); }
  FakeDaemon* daemon() const { return daemon_.get(); }
  // The commands the fake fileindexd received, parsed.
  std::vector<Json::Value> DaemonCommands() const;

 protected:
  const Json::Value& shares() const { return shares_; }

 private:
  Json::ArrayIndex IndexOf(const std::string& name) const;  // throws for an unknown share
  void SaveRegistry() const;

  SandboxRoot root_;
  Json::Value shares_{Json::arrayValue};
  std::unique_ptr<FakeDaemon> daemon_;
};

}  // namespace testing_support
}  // namespace corvlumex

namespace corvlumex {
namespace fileindex {
// The helpers the library's tests use, by their short names.
using testing_support::ErrorOf;
using testing_support::ExpectError;
using testing_support::LogCapture;
using testing_support::ReadFileText;
using testing_support::SleepRecorder;
using testing_support::StateSandbox;
}  // namespace fileindex
}  // namespace corvlumex
