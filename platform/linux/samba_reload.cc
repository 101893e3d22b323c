#include "platform/linux/samba_reload.h"

#include <dirent.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <iterator>

#include "common/file_util.h"

namespace corvlumex {
namespace platform {
namespace {

// A process's arguments, or nothing when it has ended or is a kernel thread.
std::vector<std::string> CommandLine(pid_t pid) {
  std::ifstream file("/proc/" + std::to_string(pid) + "/cmdline", std::ios::binary);
  const std::string text((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
  std::vector<std::string> args;
  size_t start = 0;
  while (start < text.size()) {
    const size_t end = text.find('\0', start);
    args.push_back(text.substr(start, end == std::string::npos ? std::string::npos : end - start));
    if (end == std::string::npos) break;
    start = end + 1;
  }
  return args;
}

// The program a process runs, as the kernel knows it (not its own argv[0]).
std::string Program(pid_t pid) {
  char target[4096];
  const ssize_t length = readlink(("/proc/" + std::to_string(pid) + "/exe").c_str(), target, sizeof(target) - 1);
  if (length <= 0) return std::string();
  return std::string(target, static_cast<size_t>(length));
}

// Whether a process has its own SIGHUP handler. A worker installs it early
// in its start, after reading the configuration; one caught before that would
// be ended by the signal (and it is reading the new configuration anyway).
bool CatchesHangup(pid_t pid) {
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  std::string line;
  while (std::getline(status, line)) {
    if (line.rfind("SigCgt:", 0) != 0) continue;
    const unsigned long long caught = strtoull(line.c_str() + 7, nullptr, 16);
    return (caught >> (SIGHUP - 1)) & 1;
  }
  return false;
}

bool IsSambaRpcWorker(pid_t pid, const std::string& config_file) {
  const std::string program = Program(pid);
  if (Basename(program).rfind("rpcd_", 0) != 0) return false;
  if (access((Dirname(program) + "/samba-dcerpcd").c_str(), X_OK) != 0) return false;
  const std::vector<std::string> args = CommandLine(pid);
  if (config_file.empty()) {
    // The machine's own Samba: a worker started with another configuration
    // belongs to a private smbd (a test's, an administrator's experiment).
    return std::none_of(args.begin(), args.end(), [](const std::string& arg) {
      return arg.rfind("--configfile=", 0) == 0 && arg != "--configfile=/etc/samba/smb.conf";
    });
  }
  return std::find(args.begin(), args.end(), "--configfile=" + config_file) != args.end();
}

}  // namespace

std::vector<pid_t> SambaRpcWorkers(const std::string& config_file) {
  std::vector<pid_t> workers;
  DIR* proc = opendir("/proc");
  if (proc == nullptr) return workers;
  while (const dirent* entry = readdir(proc)) {
    char* end = nullptr;
    const long pid = strtol(entry->d_name, &end, 10);
    if (end == entry->d_name || *end != '\0' || pid <= 1) continue;
    if (IsSambaRpcWorker(static_cast<pid_t>(pid), config_file)) workers.push_back(static_cast<pid_t>(pid));
  }
  closedir(proc);
  std::sort(workers.begin(), workers.end());
  return workers;
}

size_t ReloadSambaRpcWorkers(const std::string& config_file) {
  size_t signalled = 0;
  for (const pid_t worker : SambaRpcWorkers(config_file)) {
    if (CatchesHangup(worker) && kill(worker, SIGHUP) == 0) ++signalled;
  }
  errno = 0;  // a worker that ended meanwhile is no failure
  return signalled;
}

int ReloadSamba(Platform* platform, const std::string& config_file) {
  std::vector<std::string> args;
  if (!config_file.empty()) args.push_back("--configfile=" + config_file);
  args.push_back("smbd");
  args.push_back("reload-config");
  // Its words ("Can't find pid ...") would land on whatever terminal started
  // the daemon; the failure is recorded with its status instead.
  const int status =
      platform->Exec("smbcontrol", args, kExecDefault | kExecSearchPath | kExecNullStdout | kExecNullStderr);
  if (status != 0) {
    CORV_PLATFORM_ERROR(kPlatformErrService,
                        "smbcontrol smbd reload-config failed (" +
                            (status < 0 ? LastError().message : "status " + std::to_string(status)) + ")");
    return -1;
  }
  ReloadSambaRpcWorkers(config_file);
  return 0;
}

}  // namespace platform
}  // namespace corvlumex
