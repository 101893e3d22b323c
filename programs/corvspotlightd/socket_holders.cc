#include "programs/corvspotlightd/socket_holders.h"

#include <dirent.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>

namespace corvlumex {
namespace spotlightd {
namespace {

bool IsNumber(const char* name) {
  if (*name == '\0') return false;
  for (; *name != '\0'; ++name) {
    if (*name < '0' || *name > '9') return false;
  }
  return true;
}

bool HoldsSocket(const std::string& fd_dir, const std::string& wanted) {
  DIR* fds = opendir(fd_dir.c_str());
  if (fds == nullptr) return false;
  bool found = false;
  char target[64];
  while (!found) {
    const dirent* entry = readdir(fds);
    if (entry == nullptr) break;
    if (!IsNumber(entry->d_name)) continue;
    const ssize_t length = readlink((fd_dir + "/" + entry->d_name).c_str(), target, sizeof(target) - 1);
    if (length <= 0) continue;
    target[length] = '\0';
    found = wanted == target;
  }
  closedir(fds);
  return found;
}

}  // namespace

std::vector<pid_t> ProcessesHoldingSocket(uint64_t inode) {
  std::vector<pid_t> holders;
  DIR* proc = opendir("/proc");
  if (proc == nullptr) return holders;
  const std::string wanted = "socket:[" + std::to_string(inode) + "]";
  while (const dirent* entry = readdir(proc)) {
    if (!IsNumber(entry->d_name)) continue;
    if (HoldsSocket(std::string("/proc/") + entry->d_name + "/fd", wanted)) {
      holders.push_back(static_cast<pid_t>(atol(entry->d_name)));
    }
  }
  closedir(proc);
  return holders;
}

bool ProcessMayActAs(pid_t pid, const std::set<uid_t>& users) {
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  std::string line;
  while (std::getline(status, line)) {
    if (line.compare(0, 4, "Uid:") != 0) continue;
    std::istringstream ids(line.substr(4));
    uid_t real, effective, saved;
    if (!(ids >> real >> effective >> saved)) return false;
    return users.count(real) > 0 || users.count(effective) > 0 || users.count(saved) > 0;
  }
  return false;
}

}  // namespace spotlightd
}  // namespace corvlumex
