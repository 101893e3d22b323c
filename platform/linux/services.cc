// Services of the Linux platform.
//
// Every service request is one run of the service command with the
// arguments [--no-block] <start|stop|restart> <unit>. The command is, first
// found: $CORVLUMEX_SERVICE_COMMAND; the first line of
// SysPath("/etc/corvlumex/service_command"); in a sandbox, none (the request
// is only recorded, one line per request, in
// SysPath("/var/log/corvlumex/service_requests.log")); else /bin/systemctl.
#include <cstdlib>
#include <fstream>
#include <map>
#include <string>
#include <vector>

#include "common/file_util.h"
#include "common/sys.h"
#include "platform/linux/config_files.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/samba_reload.h"

namespace corvlumex {
namespace platform {
namespace {

constexpr char kSystemctl[] = "/bin/systemctl";
constexpr char kSambaUnit[] = "smbd.service";

std::string Trim(const std::string& text) {
  const size_t begin = text.find_first_not_of(" \t\r\n");
  if (begin == std::string::npos) return std::string();
  return text.substr(begin, text.find_last_not_of(" \t\r\n") - begin + 1);
}

// The program that carries service requests; empty means "record only".
std::string ServiceCommand() {
  const char* from_env = std::getenv("CORVLUMEX_SERVICE_COMMAND");
  if (from_env != nullptr && *from_env != '\0') return from_env;
  std::ifstream file(SysPath("/etc/corvlumex/service_command"));
  std::string line;
  if (file && std::getline(file, line) && !Trim(line).empty()) return Trim(line);
  return InSandbox() ? std::string() : kSystemctl;
}

// The system's unit for a service name: Debian names the SMB server "smbd".
std::string UnitName(const std::string& name) {
  static const std::map<std::string, std::string> aliases = {{"samba", "smbd"}};
  const auto alias = aliases.find(name);
  const std::string unit = alias == aliases.end() ? name : alias->second;
  return unit.find('.') == std::string::npos ? unit + ".service" : unit;
}

// 0 for a service command that exited 0; else the failure recorded.
int ServiceResult(int status, const std::string& what) {
  if (status == 0) return 0;
  CORV_PLATFORM_ERROR(kPlatformErrService,
                      what + " failed (" + (status < 0 ? LastError().message : "status " + std::to_string(status)) + ")");
  return -1;
}

int RequestService(LinuxPlatform* platform, const std::string& action, const std::string& name, bool wait) {
  if (name.empty() || name.find('/') != std::string::npos) {
    CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "not a service name: \"" + name + "\"");
    return -1;
  }
  std::vector<std::string> args;
  if (!wait) args.push_back("--no-block");
  args.push_back(action);
  args.push_back(UnitName(name));
  const std::string command = ServiceCommand();
  if (command.empty()) {
    std::string line;
    for (const std::string& arg : args) line += (line.empty() ? "" : " ") + arg;
    if (!AppendConfigLine(SysPath("/var/log/corvlumex/service_requests.log"), line)) return -1;
    return 0;
  }
  const int status = platform->Exec(command, args, kExecWait | kExecNullStdin | kExecCloseFds);
  return ServiceResult(status, command + " " + action + " " + UnitName(name));
}

int CheckJobType(int type) {
  if (type == kServicectlUpstart) return 0;
  CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "unknown job type " + std::to_string(type));
  return -1;
}

}  // namespace

int LinuxPlatform::ServiceStart(const std::string& name, bool wait) { return RequestService(this, "start", name, wait); }

int LinuxPlatform::ServiceStop(const std::string& name, bool wait) { return RequestService(this, "stop", name, wait); }

// Samba reads a changed configuration on a reload; a restart would drop
// every connected SMB client. systemd's reload of smbd only signals the
// parent process, so on a plain host smbcontrol tells every smbd process;
// either way Samba's RPC workers are told too (samba_reload.h).
int LinuxPlatform::ServiceRestart(const std::string& name) {
  if (UnitName(name) != kSambaUnit) return RequestService(this, "restart", name, true);
  const std::string command = ServiceCommand();
  if (command == kSystemctl) return ReloadSamba(this, std::string());
  if (RequestService(this, "reload", name, true) < 0) return -1;
  // Recorded only (a sandbox): no real Samba to tell.
  if (!command.empty()) ReloadSambaRpcWorkers(std::string());
  return 0;
}

int LinuxPlatform::ServicectlStart(const std::string& job, int type) {
  return CheckJobType(type) < 0 ? -1 : RequestService(this, "start", job, true);
}

int LinuxPlatform::ServicectlStop(const std::string& job, int type) {
  return CheckJobType(type) < 0 ? -1 : RequestService(this, "stop", job, true);
}

}  // namespace platform
}  // namespace corvlumex
