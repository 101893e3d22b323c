// The state sandbox with what a management operation also reaches: a fake
// corvelasticd recording what it receives, and a snapshot of everything a
// management operation may touch.
#pragma once

#include <json/json.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tests/elastic/fake_search_daemon.h"
#include "tests/state/state_sandbox.h"

namespace corvlumex {
namespace testing_support {

// Everything outside the process that a management operation may change:
// file bytes ("<absent>" when missing) and counts of what the fakes received,
// by name.
using SystemSnapshot = std::map<std::string, std::string>;

class MgmtSandbox : public StateSandbox {
 public:
  MgmtSandbox();
  ~MgmtSandbox();

  std::string FoldersFile() const { return EtcFile("fileindex.folders"); }
  // The share paths of the folder file, in its order.
  std::vector<std::string> SavedPaths() const;
  // Paths of the files in the notifier's monitor.d folder.
  std::vector<std::string> MonitorFiles() const;
  // The monitor configuration of a share, parsed; null when there is none.
  Json::Value MonitorCfg(const std::string& share) const;
  std::vector<std::string> ServiceRequests() const;
  FakeSearchDaemon& search() { return *search_; }
  std::vector<Json::Value> SearchRequests() const { return search_->Requests(); }
  // The "command" of each search request, with the index "id".
  std::vector<std::string> SearchCommands() const;

  SystemSnapshot Snapshot() const;

 private:
  SleepRecorder sleeps_;
  std::unique_ptr<FakeSearchDaemon> search_;
};

// Folder object in the stored form.
Json::Value FolderJson(const std::string& path, bool document = true, bool audio = true, bool video = true,
                       bool photo = true);

}  // namespace testing_support
}  // namespace corvlumex
