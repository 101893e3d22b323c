// Test helpers for the platform: a sandbox root holding a share registry of
// real directories, and a scope that installs a test platform.
#pragma once

#include <json/json.h>

#include <memory>
#include <string>

#include "platform/linux/linux_platform.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace testing_support {

// CORVLUMEX_ROOT set to a fresh directory; shares live in <root>/volume1.
class ShareSandbox {
 public:
  ShareSandbox();
  const std::string& root() const { return sandbox_.path(); }
  // The canonical volume directory (no symbolic link on the way).
  const std::string& volume() const { return volume_; }
  // Creates <volume>/<name>, adds the share with `extra` members (flags...)
  // to the registry and rewrites it. Returns the share's directory.
  std::string AddShare(const std::string& name, const Json::Value& extra = Json::Value(Json::objectValue));
  // Replaces the registry file with `text` as it stands.
  void WriteRegistryText(const std::string& text) const;
  // Creates a directory (and parents) and returns its full path.
  std::string MakeDir(const std::string& full_path) const;

 private:
  SandboxRoot sandbox_;
  std::string volume_;
  Json::Value entries_{Json::arrayValue};
};

// Installs `platform` while alive; the default platform afterwards.
class ScopedPlatform {
 public:
  explicit ScopedPlatform(std::shared_ptr<platform::Platform> installed);
  ~ScopedPlatform();
};

}  // namespace testing_support
}  // namespace corvlumex
