// The one sandbox of the tests: a fresh directory set as CORVLUMEX_ROOT
// while alive (unless told not to) and removed afterwards, its share
// registry, and, laid out as an installed system, the package's etc folder,
// /tmp for lock files, two volumes and a fake fileindexd on its command
// socket.
#pragma once

#include <json/json.h>

#include <memory>
#include <string>
#include <vector>

#include "tests/support/child_process.h"
#include "tests/support/expect_error.h"
#include "tests/support/fake_daemon.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace testing_support {

// <root>/etc/corvlumex/shares.json: the only writer of the share registry
// in the tests. Each change rewrites the whole file.
class ShareRegistry {
 public:
  explicit ShareRegistry(std::string root) : file_(std::move(root) + "/etc/corvlumex/shares.json") {}
  // Adds the share with the members of `flags` ("readonly": true, ...).
  void Add(const std::string& name, const std::string& path, const Json::Value& flags = Json::Value());
  // Sets one member of a share's entry ("name", "path", "recycle_bin", ...).
  void Set(const std::string& name, const std::string& member, const Json::Value& value);
  void Remove(const std::string& name);
  bool Has(const std::string& name) const;
  const Json::Value& Entry(const std::string& name) const;  // throws for an unknown share
  const Json::Value& entries() const { return entries_; }
  // Replaces the file with `text` as it stands (the parser's tests).
  void WriteText(const std::string& text) const;

 private:
  void Save() const;

  std::string file_;
  Json::Value entries_{Json::arrayValue};
};

// The value of a JSON text (std::runtime_error when it is not JSON).
Json::Value JsonOf(const std::string& text);

class Sandbox {
 public:
  enum Layout { kBare, kInstalled, kFakeIndexer /* installed, with a fake fileindexd */ };
  explicit Sandbox(bool set_root = true, Layout layout = kBare);
  ~Sandbox();
  Sandbox(const Sandbox&) = delete;
  Sandbox& operator=(const Sandbox&) = delete;

  const std::string& path() const { return path_; }
  const std::string& root() const { return path_; }
  // Creates a folder (and parents): `path` is absolute or relative to the root. Returns the full path.
  std::string MakeDir(const std::string& path) const;
  // Writes `content` to `path` (absolute or relative to the root), parents created.
  std::string WriteFile(const std::string& path, const std::string& content) const;
  std::string Write(const std::string& path, const std::string& content) const { return WriteFile(path, content); }
  std::string EtcFile(const std::string& name) const { return path_ + "/var/packages/CorvLumex/etc/" + name; }
  // <root>/<volume>, created, with no symbolic link on the way.
  std::string Volume(const std::string& volume = "volume1") const;
  std::string volume() const { return Volume(); }
  // A volume on tmpfs when there is one (bursts of file changes are quick
  // there), else <root>/volume1; removed with the sandbox.
  std::string TmpfsVolume();
  // A stand-in for the administrators' notice tool: appends its arguments
  // as one line to `log_path`.
  void InstallNoticeTool(const std::string& log_path) const;

  // Creates <volume>/<name> with its @eaDir and registers it; returns its directory.
  std::string AddShare(const std::string& name, const Json::Value& flags = Json::Value(),
                       const std::string& volume = "volume1");
  // Renames the share's directory and its entry; returns the new directory.
  std::string RenameShare(const std::string& from, const std::string& to);
  // Moves the share's directory to another volume; returns the new directory.
  std::string MoveShare(const std::string& name, const std::string& volume);
  // Drops the share from the registry (its directory stays).
  void RemoveShare(const std::string& name) { registry_.Remove(name); }
  bool HasShare(const std::string& name) const { return registry_.Has(name); }
  ShareRegistry& registry() { return registry_; }
  const ShareRegistry& registry() const { return registry_; }
  void WriteRegistryText(const std::string& text) const { registry_.WriteText(text); }
  // The queue file of a registered share, and its lines parsed.
  std::string QueueFile(const std::string& share) const;
  std::vector<Json::Value> QueueEvents(const std::string& share) const;

  FakeDaemon* daemon() const { return daemon_.get(); }  // kFakeIndexer only
  // The commands the fake fileindexd received, parsed.
  std::vector<Json::Value> DaemonCommands() const;

 private:
  std::string path_;
  bool set_root_;
  std::string previous_root_;
  bool had_previous_root_ = false;
  ShareRegistry registry_;
  std::unique_ptr<FakeDaemon> daemon_;
  std::string tmpfs_volume_;
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
using testing_support::Sandbox;
using testing_support::SleepRecorder;
}  // namespace fileindex
}  // namespace corvlumex
