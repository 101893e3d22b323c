// The fixture of the management tests: a sandbox root with a fake fileindexd
// and a fake corvelasticd recording what they receive, what was sent since
// the last mark, and the check that a refused request changed nothing.
#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>

#include <functional>
#include <map>
#include <string>
#include <vector>

#include "tests/fileindex/elastic/fake_search_daemon.h"
#include "tests/support/fake_platform.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace testing_support {

// A JSON array of the items.
Json::Value JsonList(const std::vector<Json::Value>& items);
// Folder object in the stored form.
Json::Value FolderJson(const std::string& path, bool document = true, bool audio = true, bool video = true,
                       bool photo = true);

// Everything outside the process that a management operation may change:
// file bytes ("<absent>" when missing) and counts of what the fakes received,
// by name.
using SystemSnapshot = std::map<std::string, std::string>;

class MgmtTest : public ::testing::Test {
 protected:
  MgmtTest() { unsetenv("CORVLUMEX_SERVICE_COMMAND"); }

  std::string FoldersFile() const { return sandbox_.EtcFile("fileindex.folders"); }
  // The share paths of the folder file, in its order.
  std::vector<std::string> SavedPaths() const;
  // Paths of the files in the notifier's monitor.d folder.
  std::vector<std::string> MonitorFiles() const;
  // The monitor configuration of a share, parsed; null when there is none.
  Json::Value MonitorCfg(const std::string& share) const;
  std::vector<std::string> ServiceRequests() const;
  std::vector<Json::Value> SearchRequests() const { return search_.Requests(); }
  // The "command" of each search request, with the index "id".
  std::vector<std::string> SearchCommands() const;
  SystemSnapshot Snapshot() const;

  // Forgets what was sent so far, and empties the queues of `shares`, so a
  // test sees only what its own operation does.
  void Mark(const std::vector<std::string>& shares = {});
  std::vector<std::string> NewSearchCommands() const;
  std::vector<Json::Value> NewDaemonCommands() const;
  // "<type> <share_name>" of each new daemon command.
  std::vector<std::string> NewDaemonSummaries() const;
  // "<event> <path>" of each line of the share's queue.
  std::vector<std::string> QueueSummaries(const std::string& share) const;
  std::vector<std::string> NewServiceRequests() const;
  // `action` throws `code` (with `reason` unless empty), logs "(<function>)
  // Failed [<condition>]" (", reason: <reason>"; the function part only when
  // given) once unless the condition is empty, and nothing outside the
  // process changed.
  void ExpectRefused(const std::function<void()>& action, ErrorCode code, const std::string& condition,
                     const std::string& reason = "", const std::string& function = "");

  Sandbox sandbox_{true, Sandbox::kFakeIndexer};
  SleepRecorder sleeps_;
  FakeSearchDaemon search_;

 private:
  size_t search_mark_ = 0;
  size_t daemon_mark_ = 0;
  size_t services_mark_ = 0;
};

}  // namespace testing_support
}  // namespace corvlumex

namespace corvlumex {
namespace fileindex {
// The management helpers, by their short names (the state ones come with sandbox.h).
using testing_support::FakePlatform;
using testing_support::FolderJson;
using testing_support::JsonList;
using testing_support::JsonOf;
using testing_support::ScopedFakePlatform;
using ::testing::ElementsAre;
}  // namespace fileindex
}  // namespace corvlumex
