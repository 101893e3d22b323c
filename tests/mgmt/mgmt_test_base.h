// The fixture of the management tests: a sandbox, what was sent since the
// last mark, and the check that a refused request changed nothing.
#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "tests/mgmt/mgmt_sandbox.h"
#include "tests/mgmt/test_platform.h"

namespace corvlumex {
namespace testing_support {

// A JSON array of the items.
Json::Value JsonList(const std::vector<Json::Value>& items);

class MgmtTest : public ::testing::Test {
 protected:
  // Forgets what was sent so far, and empties the queues of `shares`, so a
  // test sees only what its own operation does.
  void Mark(const std::vector<std::string>& shares = {});
  std::vector<std::string> NewSearchCommands() const;
  std::vector<Json::Value> NewDaemonCommands() const;
  // "<type> <share_name>" of each new daemon command.
  std::vector<std::string> NewDaemonSummaries() const;
  std::vector<std::string> NewServiceRequests() const;
  // `action` throws `code` (with `reason` unless empty), logs "Failed
  // [<condition>]" (", reason: <reason>") once unless the condition is
  // empty, and nothing outside the process changed.
  void ExpectRefused(const std::function<void()>& action, ErrorCode code, const std::string& condition,
                     const std::string& reason = "");

  MgmtSandbox sandbox_;

 private:
  size_t search_mark_ = 0;
  size_t daemon_mark_ = 0;
  size_t services_mark_ = 0;
};

}  // namespace testing_support
}  // namespace corvlumex

namespace corvlumex {
namespace fileindex {
// The management helpers, by their short names (the state ones come with state_sandbox.h).
using testing_support::FolderJson;
using testing_support::JsonList;
using testing_support::MgmtSandbox;
using testing_support::ScopedTestPlatform;
using ::testing::ElementsAre;
}  // namespace fileindex
}  // namespace corvlumex
