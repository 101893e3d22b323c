// A sandbox root laid out like an installed system for the state tests:
// the package's etc folder, /tmp for lock files, a share registry and a
// fake fileindexd on the sandbox's command socket.
#pragma once

#include <gtest/gtest.h>
#include <json/json.h>

#include <memory>
#include <string>

#include "common/error.h"
#include "tests/state/fake_daemon.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace testing_support {

// The Error that `fn` throws; a test failure (and a 9999 stand-in) when none.
template <typename Fn>
Error ErrorOf(Fn fn) {
  try {
    fn();
  } catch (const Error& error) {
    return error;
  }
  ADD_FAILURE() << "no throw";
  return Error(kErrorUnexpected, "no throw");
}

class StateSandbox {
 public:
  // With `daemon`, a FakeDaemon listens on the command socket.
  explicit StateSandbox(bool daemon = true);

  const std::string& root() const { return root_.path(); }
  std::string EtcFile(const std::string& name) const;  // sandboxed package etc path
  // Creates a share directory <root>/volume1/<name> (with its @eaDir) and
  // registers it; returns the share's directory.
  std::string AddShare(const std::string& name, bool readonly = false, bool encrypted = false);
  // Writes a raw file under the sandbox root.
  std::string Write(const std::string& relative, const std::string& content) const;
  std::string Read(const std::string& absolute) const;
  FakeDaemon* daemon() { return daemon_.get(); }
  // The sandbox's /volume1 directory.
  std::string Volume() const { return root_.path() + "/volume1"; }

 private:
  void SaveRegistry() const;

  SandboxRoot root_;
  Json::Value shares_{Json::arrayValue};
  std::unique_ptr<FakeDaemon> daemon_;
};

}  // namespace testing_support
}  // namespace corvlumex
