#include "tests/support/sandbox.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "common/json_util.h"
#include "common/sys.h"

namespace corvlumex {
namespace testing_support {
namespace fs = std::filesystem;

Json::Value JsonOf(const std::string& text) {
  Json::Value value;
  if (!JsonFromString(value, text)) throw std::runtime_error("not JSON: " + text);
  return value;
}

void ShareRegistry::Add(const std::string& name, const std::string& path, const Json::Value& flags) {
  Json::Value entry = flags.isObject() ? flags : Json::Value(Json::objectValue);
  entry["name"] = name;
  entry["path"] = path;
  entries_.append(entry);
  Save();
}

const Json::Value& ShareRegistry::Entry(const std::string& name) const {
  for (const Json::Value& entry : entries_) {
    if (entry["name"].asString() == name) return entry;
  }
  throw std::runtime_error("no share " + name);
}

void ShareRegistry::Set(const std::string& name, const std::string& member, const Json::Value& value) {
  const_cast<Json::Value&>(Entry(name))[member] = value;
  Save();
}

void ShareRegistry::Remove(const std::string& name) {
  Json::Value kept(Json::arrayValue);
  for (const Json::Value& entry : entries_) {
    if (entry["name"].asString() != name) kept.append(entry);
  }
  entries_ = kept;
  Save();
}

bool ShareRegistry::Has(const std::string& name) const {
  for (const Json::Value& entry : entries_) {
    if (entry["name"].asString() == name) return true;
  }
  return false;
}

// One entry a line, "name" and "path" first: the shape the run script's
// registry reader (scripts/lib/system.sh) expects too.
void ShareRegistry::Save() const {
  Json::StreamWriterBuilder compact;
  compact["indentation"] = "";
  std::string text = "[";
  for (const Json::Value& entry : entries_) {
    text += std::string(text.size() > 1 ? ",\n " : "") + "{\"name\": " + Json::writeString(compact, entry["name"]) +
            ", \"path\": " + Json::writeString(compact, entry["path"]);
    for (const std::string& member : entry.getMemberNames()) {
      if (member != "name" && member != "path") text += ", \"" + member + "\": " + Json::writeString(compact, entry[member]);
    }
    text += "}";
  }
  WriteText(text + "]\n");
}

void ShareRegistry::WriteText(const std::string& text) const {
  fs::create_directories(fs::path(file_).parent_path());
  std::ofstream(file_, std::ios::binary) << text;
}

namespace {
std::string MakeRoot() {
  std::string pattern = (fs::temp_directory_path() / "corvlumex-test-XXXXXX").string();
  if (mkdtemp(&pattern[0]) == nullptr) throw std::runtime_error("mkdtemp failed");
  return pattern;
}
}  // namespace

Sandbox::Sandbox(bool set_root, Layout layout) : path_(MakeRoot()), set_root_(set_root), registry_(path_) {
  if (set_root_) {
    if (const char* previous = getenv("CORVLUMEX_ROOT")) {
      had_previous_root_ = true;
      previous_root_ = previous;
    }
    setenv("CORVLUMEX_ROOT", path_.c_str(), 1);
  }
  if (layout == kBare) return;
  for (const char* dir : {"tmp", "var/packages/CorvLumex/etc", "volume1", "volume2"}) MakeDir(dir);
  registry_.WriteText("[]");
  if (layout == kFakeIndexer) daemon_ = std::make_unique<FakeDaemon>(SysPath("/var/run/fileindexd.sock"));
}

Sandbox::~Sandbox() {
  daemon_.reset();
  std::error_code ignored;
  if (!tmpfs_volume_.empty()) fs::remove_all(tmpfs_volume_, ignored);
  if (set_root_) {
    if (had_previous_root_) setenv("CORVLUMEX_ROOT", previous_root_.c_str(), 1);
    else unsetenv("CORVLUMEX_ROOT");
  }
  fs::permissions(path_, fs::perms::owner_all, ignored);
  fs::remove_all(path_, ignored);
}

std::string Sandbox::MakeDir(const std::string& path) const {
  const std::string full = !path.empty() && path[0] == '/' ? path : path_ + "/" + path;
  fs::create_directories(full);
  return full;
}

std::string Sandbox::WriteFile(const std::string& path, const std::string& content) const {
  const std::string full = !path.empty() && path[0] == '/' ? path : path_ + "/" + path;
  fs::create_directories(fs::path(full).parent_path());
  std::ofstream(full, std::ios::binary) << content;
  return full;
}

std::string Sandbox::Volume(const std::string& volume) const { return fs::canonical(MakeDir(volume)).string(); }

std::string Sandbox::TmpfsVolume() {
  if (!tmpfs_volume_.empty()) return tmpfs_volume_;
  std::string pattern = "/dev/shm/corvlumex-test-XXXXXX";
  if (access("/dev/shm", W_OK) == 0 && mkdtemp(&pattern[0]) != nullptr) return tmpfs_volume_ = pattern;
  return Volume();
}

void Sandbox::InstallNoticeTool(const std::string& log_path) const {
  const std::string tool = WriteFile("usr/corv/bin/corvvxmnotify", "#!/bin/sh\necho \"$*\" >> '" + log_path + "'\n");
  fs::permissions(tool, fs::perms::owner_all | fs::perms::group_read | fs::perms::group_exec |
                            fs::perms::others_read | fs::perms::others_exec);
}

std::string Sandbox::AddShare(const std::string& name, const Json::Value& flags, const std::string& volume) {
  const std::string dir = MakeDir(Volume(volume) + "/" + name);
  MakeDir(dir + "/@eaDir");
  registry_.Add(name, dir, flags);
  return dir;
}

std::string Sandbox::RenameShare(const std::string& from, const std::string& to) {
  const std::string old_path = registry_.Entry(from)["path"].asString();
  const std::string new_path = fs::path(old_path).parent_path().string() + "/" + to;
  fs::rename(old_path, new_path);
  registry_.Set(from, "path", new_path);
  registry_.Set(from, "name", to);
  return new_path;
}

std::string Sandbox::MoveShare(const std::string& name, const std::string& volume) {
  const std::string new_path = Volume(volume) + "/" + name;
  fs::rename(registry_.Entry(name)["path"].asString(), new_path);
  registry_.Set(name, "path", new_path);
  return new_path;
}

std::string Sandbox::QueueFile(const std::string& share) const {
  return registry_.Entry(share)["path"].asString() + "/@eaDir/fileindex.queue";
}

std::vector<Json::Value> Sandbox::QueueEvents(const std::string& share) const {
  std::vector<Json::Value> events;
  std::ifstream input(QueueFile(share));
  for (std::string line; std::getline(input, line);) {
    events.emplace_back();
    EXPECT_TRUE(JsonFromString(events.back(), line)) << line;
  }
  return events;
}

std::vector<Json::Value> Sandbox::DaemonCommands() const {
  std::vector<Json::Value> commands;
  for (const ReceivedFrame& frame : daemon_->Frames()) {
    // Every frame's length counts the NUL that ends its text.
    EXPECT_EQ(frame.body.back(), '\0');
    commands.emplace_back();
    EXPECT_TRUE(JsonFromString(commands.back(), frame.body.substr(0, frame.length - 1))) << frame.body;
  }
  return commands;
}

}  // namespace testing_support
}  // namespace corvlumex
