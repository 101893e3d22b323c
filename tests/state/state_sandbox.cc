#include "tests/state/state_sandbox.h"

#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "common/json_util.h"
#include "common/sys.h"

namespace corvlumex {
namespace testing_support {
namespace fs = std::filesystem;

StateSandbox::StateSandbox(bool daemon) {
  for (const char* dir : {"tmp", "var/packages/CorvLumex/etc", "volume1", "volume2"}) root_.MakeDir(dir);
  SaveRegistry();
  if (daemon) daemon_ = std::make_unique<FakeDaemon>(SysPath("/var/run/fileindexd.sock"));
}

std::string StateSandbox::EtcFile(const std::string& name) const {
  return root_.path() + "/var/packages/CorvLumex/etc/" + name;
}

std::string StateSandbox::AddShare(const std::string& name, const std::string& volume, ShareFlags flags) {
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

Json::ArrayIndex StateSandbox::IndexOf(const std::string& name) const {
  for (Json::ArrayIndex index = 0; index < shares_.size(); ++index) {
    if (shares_[index]["name"].asString() == name) return index;
  }
  throw std::runtime_error("no share " + name);
}

std::string StateSandbox::RenameShare(const std::string& from, const std::string& to) {
  Json::Value& share = shares_[IndexOf(from)];
  const std::string new_path = fs::path(share["path"].asString()).parent_path().string() + "/" + to;
  fs::rename(share["path"].asString(), new_path);
  share["name"] = to;
  share["path"] = new_path;
  SaveRegistry();
  return new_path;
}

std::string StateSandbox::MoveShare(const std::string& name, const std::string& volume) {
  Json::Value& share = shares_[IndexOf(name)];
  const std::string new_path = Volume(volume) + "/" + name;
  fs::rename(share["path"].asString(), new_path);
  share["path"] = new_path;
  SaveRegistry();
  return new_path;
}

void StateSandbox::RemoveShare(const std::string& name) {
  Json::Value kept(Json::arrayValue);
  for (const Json::Value& share : shares_) {
    if (share["name"].asString() != name) kept.append(share);
  }
  shares_ = kept;
  SaveRegistry();
}

void StateSandbox::SetRecycleBin(const std::string& name, bool enabled) {
  shares_[IndexOf(name)]["recycle_bin"] = enabled;
  SaveRegistry();
}

bool StateSandbox::HasShare(const std::string& name) const {
  for (const Json::Value& share : shares_) {
    if (share["name"].asString() == name) return true;
  }
  return false;
}

std::string StateSandbox::QueueFile(const std::string& share) const {
  return shares_[IndexOf(share)]["path"].asString() + "/@eaDir/fileindex.queue";
}

std::vector<Json::Value> StateSandbox::QueueEvents(const std::string& share) const {
  std::vector<Json::Value> events;
  std::ifstream input(QueueFile(share));
  for (std::string line; std::getline(input, line);) {
    events.emplace_back();
    EXPECT_TRUE(JsonFromString(events.back(), line)) << line;
  }
  return events;
}

std::vector<Json::Value> StateSandbox::DaemonCommands() const {
  std::vector<Json::Value> commands;
  for (const ReceivedFrame& frame : daemon_->Frames()) {
    // Every frame's length counts the NUL that ends its text.
    EXPECT_EQ(frame.body.back(), '\0');
    commands.emplace_back();
    EXPECT_TRUE(JsonFromString(commands.back(), frame.body.substr(0, frame.length - 1))) << frame.body;
  }
  return commands;
}

void StateSandbox::SaveRegistry() const {
  root_.WriteFile("etc/corvlumex/shares.json", JsonToString(shares_));
}

}  // namespace testing_support
}  // namespace corvlumex
