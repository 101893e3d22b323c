#include "tests/fileindex/mgmt/mgmt_test_base.h"

#include <filesystem>
#include <sstream>

#include "common/file_util.h"
#include "common/json_util.h"

namespace corvlumex {
namespace testing_support {
namespace fs = std::filesystem;

Json::Value JsonList(const std::vector<Json::Value>& items) {
  Json::Value list(Json::arrayValue);
  for (const Json::Value& item : items) list.append(item);
  return list;
}

std::vector<std::string> MgmtTest::SavedPaths() const {
  Json::Value saved;
  EXPECT_TRUE(JsonFromFile(saved, FoldersFile()));
  std::vector<std::string> paths;
  for (const Json::Value& folder : saved) paths.push_back(folder["path"].asString());
  return paths;
}

std::vector<std::string> MgmtTest::MonitorFiles() const {
  std::vector<std::string> files;
  const fs::path dir = sandbox_.root() + "/etc/corvlumex/monitor.d";
  if (fs::exists(dir)) {
    for (const auto& entry : fs::directory_iterator(dir)) files.push_back(entry.path().string());
  }
  return files;
}

Json::Value MgmtTest::MonitorCfg(const std::string& share) const {
  const std::string queue = sandbox_.QueueFile(share);
  for (const std::string& file : MonitorFiles()) {
    Json::Value value;
    if (JsonFromFile(value, file) && value["queue"].asString() == queue) return value;
  }
  return Json::Value();
}

std::vector<std::string> MgmtTest::ServiceRequests() const {
  std::vector<std::string> lines;
  std::istringstream input(ReadFileText(sandbox_.root() + "/var/log/corvlumex/service_requests.log"));
  for (std::string line; std::getline(input, line);) lines.push_back(line);
  return lines;
}

std::vector<std::string> MgmtTest::SearchCommands() const {
  std::vector<std::string> commands;
  for (const Json::Value& request : search_.Requests()) {
    const Json::Value& data = request["data"];
    std::string text = request["command"].asString() + " " + data["id"].asString();
    if (data.isMember("doc_id")) text += " " + data["doc_id"].asString();
    if (data.isMember("query")) text += " prefix=" + data["query"]["qsl"]["prefix"]["CORVMDPath"].asString();
    commands.push_back(text);
  }
  return commands;
}

SystemSnapshot MgmtTest::Snapshot() const {
  // A file that appears empty is a change too.
  const auto bytes = [](const std::string& path) { return IsFileExist(path) ? ReadFileText(path) : "<absent>"; };
  SystemSnapshot snapshot;
  snapshot["folders"] = bytes(FoldersFile());
  snapshot["status"] = bytes(sandbox_.EtcFile("fileindex.status"));
  for (const std::string& file : MonitorFiles()) snapshot[file] = bytes(file);
  snapshot["services"] = bytes(sandbox_.root() + "/var/log/corvlumex/service_requests.log");
  snapshot["spotlight"] = bytes(sandbox_.root() + "/etc/samba/corvlumex-spotlight.conf");
  for (const Json::Value& share : sandbox_.registry().entries()) {
    const std::string queue = sandbox_.QueueFile(share["name"].asString());
    snapshot[queue] = bytes(queue);
  }
  snapshot["daemon frames"] = std::to_string(sandbox_.daemon()->Frames().size());
  snapshot["search requests"] = std::to_string(search_.Requests().size());
  return snapshot;
}

Json::Value FolderJson(const std::string& path, bool document, bool audio, bool video, bool photo) {
  Json::Value folder(Json::objectValue);
  folder["path"] = path;
  folder["name"] = path.substr(path.rfind('/') + 1);
  folder["document"] = document;
  folder["audio"] = audio;
  folder["video"] = video;
  folder["photo"] = photo;
  return folder;
}

void MgmtTest::Mark(const std::vector<std::string>& shares) {
  search_mark_ = SearchRequests().size();
  daemon_mark_ = sandbox_.DaemonCommands().size();
  services_mark_ = ServiceRequests().size();
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

std::vector<std::string> MgmtTest::NewSearchCommands() const { return Since(SearchCommands(), search_mark_); }

std::vector<Json::Value> MgmtTest::NewDaemonCommands() const { return Since(sandbox_.DaemonCommands(), daemon_mark_); }

std::vector<std::string> MgmtTest::NewDaemonSummaries() const {
  std::vector<std::string> out;
  for (const Json::Value& command : NewDaemonCommands()) {
    out.push_back(command["type"].asString() + " " + command["data"]["share_name"].asString());
  }
  return out;
}

std::vector<std::string> MgmtTest::QueueSummaries(const std::string& share) const {
  std::vector<std::string> out;
  for (const Json::Value& event : sandbox_.QueueEvents(share)) {
    out.push_back(event["event"].asString() + " " + event["path"].asString());
  }
  return out;
}

std::vector<std::string> MgmtTest::NewServiceRequests() const {
  return Since(ServiceRequests(), services_mark_);
}

void MgmtTest::ExpectRefused(const std::function<void()>& action, ErrorCode code, const std::string& condition,
                             const std::string& reason, const std::string& function) {
  const SystemSnapshot before = Snapshot();
  LogCapture log;
  const Error error = ErrorOf(action);
  EXPECT_EQ(error.code, code);
  if (!reason.empty()) {
    EXPECT_EQ(error.reason, reason);
  }
  if (!condition.empty()) {
    const std::string needle = (function.empty() ? "" : "(" + function + ") ") + "Failed [" + condition + "]" +
                               (reason.empty() ? "" : ", reason: " + reason);
    EXPECT_EQ(log.Matching(needle).size(), 1u) << ::testing::PrintToString(log.Lines());
  }
  EXPECT_EQ(Snapshot(), before);
}

}  // namespace testing_support
}  // namespace corvlumex
