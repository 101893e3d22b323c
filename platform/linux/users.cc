// User lookups of the Linux platform, from the system's user database.
#include <pwd.h>
#include <unistd.h>

#include <vector>

#include "common/sys.h"
#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace platform {
namespace {

bool LookUp(const char* name, uid_t uid, bool by_name, UserRecord* user) {
  struct passwd entry;
  struct passwd* found = nullptr;
  std::vector<char> buffer(16384);
  const int rc = by_name ? getpwnam_r(name, &entry, buffer.data(), buffer.size(), &found)
                         : getpwuid_r(uid, &entry, buffer.data(), buffer.size(), &found);
  if (rc != 0 || found == nullptr) return false;
  user->name = entry.pw_name;
  user->uid = entry.pw_uid;
  user->gid = entry.pw_gid;
  user->home = entry.pw_dir ? entry.pw_dir : "";
  return true;
}

}  // namespace

bool LinuxPlatform::UserGet(const std::string& name, UserRecord* user) {
  // In a sandbox the system's own accounts are whoever runs it.
  if (InSandbox() && (name == "root" || name == "CorvLumex")) {
    if (!LookUp(nullptr, geteuid(), false, user)) return false;
    user->name = name;
    return true;
  }
  return LookUp(name.c_str(), 0, true, user);
}

}  // namespace platform
}  // namespace corvlumex
