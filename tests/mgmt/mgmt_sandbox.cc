#include "tests/mgmt/mgmt_sandbox.h"

#include <filesystem>
#include <fstream>
#include <sstream>

#include "common/file_util.h"
#include "common/json_util.h"
#include "common/sys.h"

namespace corvlumex {
namespace testing_support {
namespace fs = std::filesystem;

MgmtSandbox::MgmtSandbox() : search_(std::make_unique<FakeSearchDaemon>()) {
  unsetenv("CORVLUMEX_SERVICE_COMMAND");
}

MgmtSandbox::~MgmtSandbox() = default;

std::vector<std::string> MgmtSandbox::SavedPaths() const {
  Json::Value saved;
  EXPECT_TRUE(JsonFromFile(saved, FoldersFile()));
  std::vector<std::string> paths;
  for (const Json::Value& folder : saved) paths.push_back(folder["path"].asString());
  return paths;
}

std::vector<std::string> MgmtSandbox::MonitorFiles() const {
  std::vector<std::string> files;
  const fs::path dir = root() + "/etc/corvlumex/monitor.d";
  if (fs::exists(dir)) {
    for (const auto& entry : fs::directory_iterator(dir)) files.push_back(entry.path().string());
  }
  return files;
}

Json::Value MgmtSandbox::MonitorCfg(const std::string& share) const {
  const std::string queue = QueueFile(share);
  for (const std::string& file : MonitorFiles()) {
    Json::Value value;
    if (JsonFromFile(value, file) && value["queue"].asString() == queue) return value;
  }
  return Json::Value();
}

std::vector<std::string> MgmtSandbox::ServiceRequests() const {
  std::vector<std::string> lines;
  std::istringstream input(ReadFileText(root() + "/var/log/corvlumex/service_requests.log"));
  for (std::string line; std::getline(input, line);) lines.push_back(line);
  return lines;
}

std::vector<std::string> MgmtSandbox::SearchCommands() const {
  std::vector<std::string> commands;
  for (const Json::Value& request : search_->Requests()) {
    const Json::Value& data = request["data"];
    std::string text = request["command"].asString() + " " + data["id"].asString();
    if (data.isMember("doc_id")) text += " " + data["doc_id"].asString();
    if (data.isMember("query")) text += " prefix=" + data["query"]["qsl"]["prefix"]["CORVMDPath"].asString();
    commands.push_back(text);
  }
  return commands;
}

SystemSnapshot MgmtSandbox::Snapshot() const {
  // A file that appears empty is a change too.
  const auto bytes = [](const std::string& path) { return IsFileExist(path) ? ReadFileText(path) : "<absent>"; };
  SystemSnapshot snapshot;
  snapshot["folders"] = bytes(FoldersFile());
  snapshot["status"] = bytes(EtcFile("fileindex.status"));
  for (const std::string& file : MonitorFiles()) snapshot[file] = bytes(file);
  snapshot["services"] = bytes(root() + "/var/log/corvlumex/service_requests.log");
  snapshot["spotlight"] = bytes(root() + "/etc/samba/corvlumex-spotlight.conf");
  for (const Json::Value& share : shares()) {
    const std::string queue = QueueFile(share["name"].asString());
    snapshot[queue] = bytes(queue);
  }
  snapshot["daemon frames"] = std::to_string(daemon()->Frames().size());
  snapshot["search requests"] = std::to_string(search_->Requests().size());
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

}  // namespace testing_support
}  // namespace corvlumex
