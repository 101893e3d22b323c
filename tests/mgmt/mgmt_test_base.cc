#include "tests/mgmt/mgmt_test_base.h"

#include <filesystem>

#include "tests/support/log_capture.h"

namespace corvlumex {
namespace testing_support {

Json::Value JsonList(const std::vector<Json::Value>& items) {
  Json::Value list(Json::arrayValue);
  for (const Json::Value& item : items) list.append(item);
  return list;
}

void MgmtTest::Mark(const std::vector<std::string>& shares) {
  search_mark_ = sandbox_.SearchRequests().size();
  daemon_mark_ = sandbox_.DaemonCommands().size();
  services_mark_ = sandbox_.ServiceRequests().size();
  for (const std::string& share : shares) {
    if (sandbox_.HasShare(share)) std::filesystem::remove(sandbox_.QueueFile(share));
  }
}

namespace {
template <typename T>
std::vector<T> Since(const std::vector<T>& all, size_t mark) {
  return std::vector<T>(all.begin() + mark, all.end());
}
}  // namespace

std::vector<std::string> MgmtTest::NewSearchCommands() const { return Since(sandbox_.SearchCommands(), search_mark_); }

std::vector<Json::Value> MgmtTest::NewDaemonCommands() const { return Since(sandbox_.DaemonCommands(), daemon_mark_); }

std::vector<std::string> MgmtTest::NewDaemonSummaries() const {
  std::vector<std::string> out;
  for (const Json::Value& command : NewDaemonCommands()) {
    out.push_back(command["type"].asString() + " " + command["data"]["share_name"].asString());
  }
  return out;
}

std::vector<std::string> MgmtTest::NewServiceRequests() const {
  return Since(sandbox_.ServiceRequests(), services_mark_);
}

void MgmtTest::ExpectRefused(const std::function<void()>& action, ErrorCode code, const std::string& condition,
                             const std::string& reason) {
  const SystemSnapshot before = sandbox_.Snapshot();
  LogCapture log;
  const Error error = ErrorOf(action);
  EXPECT_EQ(error.code, code);
  if (!reason.empty()) {
    EXPECT_EQ(error.reason, reason);
  }
  if (!condition.empty()) {
    const std::string needle = "Failed [" + condition + "]" + (reason.empty() ? "" : ", reason: " + reason);
    EXPECT_EQ(log.Matching(needle).size(), 1u) << ::testing::PrintToString(log.Lines());
  }
  EXPECT_EQ(sandbox_.Snapshot(), before);
}

}  // namespace testing_support
}  // namespace corvlumex
