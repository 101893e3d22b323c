#include "programs/frontend/daemon_client.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "common/error.h"
#include "common/frame.h"
#include "common/json_util.h"
#include "common/sys.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/state/constants.h"
#include "platform/linux/notifier_presence.h"

namespace corvlumex {
namespace frontend {
namespace {

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
    // A notifier whose presence cannot be probed is not reported down.
    case Daemon::kNotifier:
      return platform::ProbeNotifier(platform::NotifierConfigDir()) != platform::NotifierState::kNotRunning;
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
  WriteFrame(fd, JsonToString(request));
  Json::Value answer;
  if (!JsonFromString(answer, ReadFrame(fd)) || !answer.isObject() || !answer["success"].isBool()) {
    throw Error(kErrorSystem, "fileindexd gave an unreadable answer");
  }
  if (!answer["success"].asBool()) {
    const Json::Value& error = answer["error"];
    throw Error(static_cast<ErrorCode>(error["code"].asInt()), error["msg"].asString());
  }
  return answer["data"];
}

}  // namespace frontend
}  // namespace corvlumex
