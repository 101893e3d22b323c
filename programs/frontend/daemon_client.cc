#include "programs/frontend/daemon_client.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/json_util.h"
#include "common/sys.h"
#include "fileindex/communication.h"
#include "fileindex/constants.h"

namespace corvlumex {
namespace frontend {

Json::Value AskDaemon(const std::string& type, const Json::Value& data) {
  const std::string path = SysPath(fileindex::kFileIndexDaemonSocketPath);
  struct sockaddr_un address;
  memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof(address.sun_path)) throw Error(kErrorSystem, "socket path too long: " + path);
  memcpy(address.sun_path, path.c_str(), path.size());
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) throw Error(kErrorSystem, std::string("socket failed: ") + strerror(errno));
  struct Closer {
    int fd;
    ~Closer() { close(fd); }
  } closer{fd};
  if (connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0) {
    const std::string why = strerror(errno);
    errno = 0;
    throw Error(kErrorSystem, "fileindexd is not running (" + path + ": " + why + ")");
  }
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

}  // namespace frontend
}  // namespace corvlumex
