#include "tests/mgmt/mgmt_sandbox.h"

#include <filesystem>
#include <fstream>
#include <ostream>
#include <sstream>

#include "common/json_util.h"
#include "common/sys.h"

namespace corvlumex {
namespace testing_support {
namespace fs = std::filesystem;

bool SystemSnapshot::operator==(const SystemSnapshot& other) const {
  return folders == other.folders && status == other.status && monitor == other.monitor &&
         service_requests == other.service_requests && spotlight == other.spotlight && queues == other.queues &&
         daemon_frames == other.daemon_frames && search_requests == other.search_requests;
}

std::ostream& operator<<(std::ostream& out, const SystemSnapshot& snapshot) {
  out << "folders=" << snapshot.folders << " status=" << snapshot.status << " monitor files="
      << snapshot.monitor.size() << " services=[" << snapshot.service_requests << "] spotlight=["
      << snapshot.spotlight << "] queues=" << snapshot.queues.size() << " daemon frames=" << snapshot.daemon_frames
      << " search requests=" << snapshot.search_requests;
  return out;
}

MgmtSandbox::MgmtSandbox() {
  unsetenv("CORVLUMEX_SERVICE_COMMAND");
  root_.MakeDir("tmp");
  root_.MakeDir("var/packages/CorvLumex/etc");
  root_.MakeDir("volume1");
  root_.MakeDir("volume2");
  SaveRegistry();
  daemon_ = std::make_unique<FakeDaemon>(SysPath("/var/run/fileindexd.sock"));
  search_ = std::make_unique<FakeSearchDaemon>();
}

MgmtSandbox::~MgmtSandbox() = default;

std::string MgmtSandbox::AddShare(const std::string& name, const std::string& volume, ShareFlags flags) {
  const std::string path = root_.MakeDir(volume + "/" + name);
  root_.MakeDir(volume + "/" + name + "/@eaDir");
  Json::Value share(Json::objectValue);
  share["name"] = name;
  share["path"] = path;
  share["readonly"] = flags.readonly;
  share["encrypted"] = flags.encrypted;
  share["recycle_bin"] = flags.recycle_bin;
  shares_.append(share);
  SaveRegistry();
  return path;
}

Json::Value* MgmtSandbox::FindShare(const std::string& name) {
  for (Json::Value& share : shares_) {
    if (share["name"].asString() == name) return &share;
  }
  throw std::runtime_error("no share " + name);
}

std::string MgmtSandbox::RenameShare(const std::string& from, const std::string& to) {
  Json::Value* share = FindShare(from);
  const std::string old_path = (*share)["path"].asString();
  const std::string new_path = fs::path(old_path).parent_path().string() + "/" + to;
  fs::rename(old_path, new_path);
  (*share)["name"] = to;
  (*share)["path"] = new_path;
  SaveRegistry();
  return new_path;
}

std::string MgmtSandbox::MoveShare(const std::string& name, const std::string& volume) {
  Json::Value* share = FindShare(name);
  const std::string new_path = Volume(volume) + "/" + name;
  fs::rename((*share)["path"].asString(), new_path);
  (*share)["path"] = new_path;
  SaveRegistry();
  return new_path;
}

void MgmtSandbox::RemoveShare(const std::string& name) {
  Json::Value kept(Json::arrayValue);
  for (const Json::Value& share : shares_) {
    if (share["name"].asString() != name) kept.append(share);
  }
  shares_ = kept;
  SaveRegistry();
}

void MgmtSandbox::SetRecycleBin(const std::string& name, bool enabled) {
  (*FindShare(name))["recycle_bin"] = enabled;
  SaveRegistry();
}

void MgmtSandbox::SaveRegistry() const { root_.WriteFile("etc/corvlumex/shares.json", JsonToString(shares_)); }

std::string MgmtSandbox::FoldersFile() const { return root_.path() + "/var/packages/CorvLumex/etc/fileindex.folders"; }

std::string MgmtSandbox::StatusFile() const { return root_.path() + "/var/packages/CorvLumex/etc/fileindex.status"; }

bool MgmtSandbox::HasShare(const std::string& name) const {
  for (const Json::Value& entry : shares_) {
    if (entry["name"].asString() == name) return true;
  }
  return false;
}

std::string MgmtSandbox::QueueFile(const std::string& share) const {
  for (const Json::Value& entry : shares_) {
    if (entry["name"].asString() == share) return entry["path"].asString() + "/@eaDir/fileindex.queue";
  }
  throw std::runtime_error("no share " + share);
}

std::string MgmtSandbox::Read(const std::string& path) {
  std::ifstream input(path, std::ios::binary);
  if (!input) return "<absent>";
  std::ostringstream content;
  content << input.rdbuf();
  return content.str();
}

Json::Value MgmtSandbox::MonitorCfg(const std::string& share) const {
  const std::string queue = QueueFile(share);
  const fs::path dir = root_.path() + "/etc/corvlumex/monitor.d";
  if (!fs::exists(dir)) return Json::Value();
  for (const auto& entry : fs::directory_iterator(dir)) {
    Json::Value value;
    if (JsonFromFile(value, entry.path().string()) && value["queue"].asString() == queue) return value;
  }
  return Json::Value();
}

std::vector<std::string> MgmtSandbox::ServiceRequests() const {
  std::vector<std::string> lines;
  std::istringstream input(Read(root_.path() + "/var/log/corvlumex/service_requests.log"));
  std::string line;
  while (std::getline(input, line)) {
    if (line != "<absent>") lines.push_back(line);
  }
  return lines;
}

std::vector<Json::Value> MgmtSandbox::DaemonCommands() const {
  std::vector<Json::Value> commands;
  for (const ReceivedFrame& frame : daemon_->Frames()) {
    commands.push_back(JsonOf(std::string(frame.body.c_str())));
  }
  return commands;
}

std::vector<Json::Value> MgmtSandbox::QueueEvents(const std::string& share) const {
  std::vector<Json::Value> events;
  std::ifstream input(QueueFile(share));
  std::string line;
  while (std::getline(input, line)) events.push_back(JsonOf(line));
  return events;
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
  SystemSnapshot snapshot;
  snapshot.folders = Read(FoldersFile());
  snapshot.status = Read(StatusFile());
  const fs::path dir = root_.path() + "/etc/corvlumex/monitor.d";
  if (fs::exists(dir)) {
    for (const auto& entry : fs::directory_iterator(dir)) {
      snapshot.monitor[entry.path().filename().string()] = Read(entry.path().string());
    }
  }
  snapshot.service_requests = Read(root_.path() + "/var/log/corvlumex/service_requests.log");
  snapshot.spotlight = Read(root_.path() + "/etc/samba/corvlumex-spotlight.conf");
  for (const Json::Value& share : shares_) {
    const std::string queue = share["path"].asString() + "/@eaDir/fileindex.queue";
    snapshot.queues[queue] = Read(queue);
  }
  snapshot.daemon_frames = daemon_->Frames().size();
  snapshot.search_requests = search_->Requests().size();
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
