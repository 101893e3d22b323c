#include "programs/fileindex/daemon_client.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "common/error.h"
#include "common/json_util.h"
#include "common/sys.h"
#include "fileindex/communication.h"
#include "fileindex/constants.h"
#include "fileindex/elastic/comm.h"

namespace corvlumex {
namespace cli {
namespace {

// The notifier's configuration folder, which it keeps locked while it runs.
constexpr char kNotifierConfigDir[] = "/etc/corvlumex/monitor.d";

// A connected socket to `path`, or -1 with errno set.
int Connect(const std::string& path) {
  struct sockaddr_un address;
  memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof(address.sun_path)) {
    errno = ENAMETOOLONG;
    return -1;
  }
  memcpy(address.sun_path, path.c_str(), path.size());
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return -1;
  if (connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0) {
    const int saved = errno;
    close(fd);
    errno = saved;
    return -1;
  }
  return fd;
}

bool Answers(const std::string& socket_path) {
  const int fd = Connect(socket_path);
  if (fd < 0) return false;
  close(fd);
  return true;
}

// Read from /proc/locks, so that asking never takes the lock itself (a
// notifier starting at that moment would find it taken and give up).
bool SomeoneLocks(const std::string& path) {
  struct stat info;
  if (stat(path.c_str(), &info) != 0) return false;
  std::ostringstream id;
  id << std::hex;
  id.width(2);
  id.fill('0');
  id << major(info.st_dev) << ":";
  id.width(2);
  id << minor(info.st_dev) << ":" << std::dec << info.st_ino;
  std::ifstream locks("/proc/locks");
  std::string line;
  while (std::getline(locks, line)) {
    std::istringstream words(line);
    std::string word;
    while (words >> word) {
      if (word == id.str()) return true;
    }
  }
  return false;
}

// The sandbox root a process runs under ("" for none); false when its
// environment cannot be read (another user's process).
bool RootOfProcess(const std::string& pid, std::string& root) {
  std::ifstream environ("/proc/" + pid + "/environ", std::ios::binary);
  if (!environ) return false;
  std::string entry;
  root.clear();
  while (std::getline(environ, entry, '\0')) {
    if (entry.compare(0, 15, "CORVLUMEX_ROOT=") == 0) root = entry.substr(15);
  }
  return true;
}

// A process named `name` that runs under this command line's sandbox root
// (or may: one whose environment cannot be read counts).
bool ProcessRuns(const std::string& name) {
  const char* own = getenv("CORVLUMEX_ROOT");
  const std::string own_root = own == nullptr ? "" : own;
  std::error_code error;
  for (const auto& entry : std::filesystem::directory_iterator("/proc", error)) {
    const std::string pid = entry.path().filename().string();
    if (pid.find_first_not_of("0123456789") != std::string::npos) continue;
    std::ifstream comm("/proc/" + pid + "/comm");
    std::string command;
    if (!std::getline(comm, command) || command != name) continue;
    std::string root;
    if (!RootOfProcess(pid, root) || root == own_root) return true;
  }
  return false;
}

const char* UnitName(Daemon daemon) {
  switch (daemon) {
    case Daemon::kIndexer: return "pkg-CorvLumex-fileindexd";
    case Daemon::kSearch: return "corvelasticd";
    case Daemon::kNotifier: return "corvnotifyd";
  }
  return "";
}

}  // namespace

const char* DaemonName(Daemon daemon) {
  switch (daemon) {
    case Daemon::kIndexer: return "fileindexd";
    case Daemon::kSearch: return "corvelasticd";
    case Daemon::kNotifier: return "corvnotifyd";
  }
  return "";
}

bool DaemonRunning(Daemon daemon) {
  switch (daemon) {
    case Daemon::kIndexer: return Answers(SysPath(fileindex::kFileIndexDaemonSocketPath));
    case Daemon::kSearch: return Answers(ElasticSocketPath());
    // The notifier locks its configuration folder only when the folder
    // existed at its start; before the first folder is added it does not.
    case Daemon::kNotifier: return SomeoneLocks(SysPath(kNotifierConfigDir)) || ProcessRuns("corvnotifyd");
  }
  return false;
}

std::string StartCommand(Daemon daemon) {
  const char* configured = getenv("FILEINDEX_START_COMMAND");
  if (configured != nullptr && configured[0] != '\0') return configured;
  return std::string("systemctl start ") + UnitName(daemon);
}

std::string NotRunningText(Daemon daemon) {
  return std::string(DaemonName(daemon)) + " is not running: start it with " + StartCommand(daemon);
}

void RequireRunning(Daemon daemon, const std::string& consequence) {
  if (DaemonRunning(daemon)) return;
  // The library's code for a search daemon that cannot be reached; 502 for the others.
  const ErrorCode code = daemon == Daemon::kSearch ? kErrorSearchRequest : kErrorSystem;
  throw Error(code, NotRunningText(daemon) + (consequence.empty() ? "" : " (" + consequence + ")"));
}

Json::Value AskDaemon(const std::string& type, const Json::Value& data) {
  const int fd = Connect(SysPath(fileindex::kFileIndexDaemonSocketPath));
  if (fd < 0) throw Error(kErrorSystem, NotRunningText(Daemon::kIndexer));
  struct Closer {
    int fd;
    ~Closer() { close(fd); }
  } closer{fd};
  struct timeval timeout = {30, 0};
  setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof(timeout));
  Json::Value request(Json::objectValue);
  request["type"] = type;
  request["data"] = data;
  fileindex::WriteFrame(fd, JsonToString(request));
  Json::Value answer;
  if (!JsonFromString(answer, fileindex::ReadFrame(fd)) || !answer.isObject() || !answer["success"].isBool()) {
    throw Error(kErrorSystem, "fileindexd gave an unreadable answer");
  }
  if (!answer["success"].asBool()) {
    const Json::Value& error = answer["error"];
    throw Error(static_cast<ErrorCode>(error["code"].asInt()), error["msg"].asString());
  }
  return answer["data"];
}

}  // namespace cli
}  // namespace corvlumex
