// A sandbox root laid out like an installed system for the management
// operations: two volumes, a share registry the tests can change (rename,
// move), fake fileindexd and corvelasticd recording what they receive, and
// a snapshot of everything a management operation may touch.
#pragma once

#include <json/json.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tests/elastic/fake_search_daemon.h"
#include "tests/state/fake_daemon.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace testing_support {

// Everything outside the process that a management operation may change.
struct SystemSnapshot {
  std::string folders;                           // fileindex.folders bytes ("<absent>" when missing)
  std::string status;                            // fileindex.status bytes
  std::map<std::string, std::string> monitor;    // monitor.d file name -> content
  std::string service_requests;                  // recorded service requests
  std::string spotlight;                         // the Spotlight switch file
  std::map<std::string, std::string> queues;     // queue file -> content, every share
  size_t daemon_frames = 0;
  size_t search_requests = 0;

  bool operator==(const SystemSnapshot& other) const;
};
std::ostream& operator<<(std::ostream& out, const SystemSnapshot& snapshot);

struct ShareFlags {
  bool readonly = false;
  bool encrypted = false;
  bool recycle_bin = false;
};

class MgmtSandbox {
 public:
  MgmtSandbox();
  ~MgmtSandbox();

  const std::string& root() const { return root_.path(); }
  // <root>/<volume>; "volume1" and "volume2" exist.
  std::string Volume(const std::string& volume = "volume1") const { return root_.path() + "/" + volume; }
  // Creates <root>/<volume>/<name> with its @eaDir and registers it.
  std::string AddShare(const std::string& name, const std::string& volume = "volume1", ShareFlags flags = {});
  // Renames the share's directory and its registry entry.
  std::string RenameShare(const std::string& from, const std::string& to);
  // Moves the share's directory to another volume and updates the registry.
  std::string MoveShare(const std::string& name, const std::string& volume);
  // Drops the share from the registry (its directory stays).
  void RemoveShare(const std::string& name);
  void SetRecycleBin(const std::string& name, bool enabled);
  std::string MakeDir(const std::string& relative) const { return root_.MakeDir(relative); }

  std::string FoldersFile() const;
  std::string StatusFile() const;
  bool HasShare(const std::string& name) const;
  std::string QueueFile(const std::string& share) const;  // of a registered share
  // The monitor configuration of a share, parsed; null when there is none.
  Json::Value MonitorCfg(const std::string& share) const;
  std::vector<std::string> ServiceRequests() const;
  // Frames received by the fake fileindexd, parsed.
  std::vector<Json::Value> DaemonCommands() const;
  // Queue lines of a share, parsed.
  std::vector<Json::Value> QueueEvents(const std::string& share) const;
  FakeSearchDaemon& search() { return *search_; }
  std::vector<Json::Value> SearchRequests() const { return search_->Requests(); }
  // The "command" of each search request, with the index "id".
  std::vector<std::string> SearchCommands() const;

  SystemSnapshot Snapshot() const;
  static std::string Read(const std::string& path);

 private:
  void SaveRegistry() const;
  Json::Value* FindShare(const std::string& name);

  SandboxRoot root_;
  SleepRecorder sleeps_;
  Json::Value shares_{Json::arrayValue};
  std::unique_ptr<FakeDaemon> daemon_;
  std::unique_ptr<FakeSearchDaemon> search_;
};

// Folder object in the stored form.
Json::Value FolderJson(const std::string& path, bool document = true, bool audio = true, bool video = true,
                       bool photo = true);

}  // namespace testing_support
}  // namespace corvlumex
