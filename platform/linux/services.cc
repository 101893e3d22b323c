// Services and the SMB Spotlight switch of the Linux platform.
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

#include "common/file_util.h"
#include "common/sys.h"
#include "platform/linux/config_files.h"
#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace platform {
namespace {

constexpr char kSystemctl[] = "/bin/systemctl";
constexpr char kSpotlightInclude[] = "/etc/samba/corvlumex-spotlight.conf";

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
  if (status != 0) {
    CORV_PLATFORM_ERROR(kPlatformErrService, command + " " + action + " " + UnitName(name) + " failed (" +
                                                 (status < 0 ? LastError().message : "status " + std::to_string(status)) +
                                                 ")");
    return -1;
  }
  return 0;
}

int CheckJobType(int type) {
  if (type == kServicectlUpstart) return 0;
  CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "unknown job type " + std::to_string(type));
  return -1;
}

}  // namespace

int LinuxPlatform::ServiceStart(const std::string& name, bool wait) { return RequestService(this, "start", name, wait); }

int LinuxPlatform::ServiceStop(const std::string& name, bool wait) { return RequestService(this, "stop", name, wait); }

int LinuxPlatform::ServiceRestart(const std::string& name) { return RequestService(this, "restart", name, true); }

int LinuxPlatform::ServicectlStart(const std::string& job, int type) {
  return CheckJobType(type) < 0 ? -1 : RequestService(this, "start", job, true);
}

int LinuxPlatform::ServicectlStop(const std::string& job, int type) {
  return CheckJobType(type) < 0 ? -1 : RequestService(this, "stop", job, true);
}

// The switch is a samba include file; smb.conf includes it at its end:
//   include = /etc/samba/corvlumex-spotlight.conf
int LinuxPlatform::SMBIsEnableSpotlight() {
  const std::string path = SysPath(kSpotlightInclude);
  if (!IsFileExist(path)) return 0;
  std::ifstream file(path);
  if (!file) {
    CORV_PLATFORM_ERROR(kPlatformErrConfig, "cannot read " + path);
    return -1;
  }
  std::string line;
  int enabled = 0;
  while (std::getline(file, line)) {
    std::string text;
    for (char c : line) {
      if (c != ' ' && c != '\t') text.push_back(static_cast<char>(tolower(static_cast<unsigned char>(c))));
    }
    if (text.compare(0, 10, "spotlight=") != 0) continue;
    const std::string value = text.substr(10);
    enabled = (value == "yes" || value == "true" || value == "on" || value == "1") ? 1 : 0;
  }
  return enabled;
}

int LinuxPlatform::SMBSetSpotlight(bool enable) {
  const std::string content = std::string(
                                  "# Written by CorvLumex: Spotlight search for SMB clients follows whether\n"
                                  "# anything is indexed. Include this file at the end of smb.conf.\n"
                                  "[global]\n"
                                  "\tspotlight = ") +
                              (enable ? "yes" : "no") + "\n";
  return WriteConfigFile(SysPath(kSpotlightInclude), content, 0644) ? 0 : -1;
}

}  // namespace platform
}  // namespace corvlumex
