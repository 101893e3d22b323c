// Users of the Linux platform, from the system's user database, and the
// switch of the effective user and groups.
#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
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
  if (rc != 0 || found == nullptr) {
    errno = 0;  // "no such user" is an answer, not a system failure
    return false;
  }
  user->name = entry.pw_name;
  user->uid = entry.pw_uid;
  user->gid = entry.pw_gid;
  user->home = entry.pw_dir ? entry.pw_dir : "";
  return true;
}

bool CredentialsFailed(const std::string& step, const std::string& name) {
  CORV_PLATFORM_ERROR(kPlatformErrCredentials, step + " failed switching to \"" + name + "\": " + strerror(errno));
  return false;
}

}  // namespace

bool LinuxPlatform::UserGet(const std::string& name, UserRecord* user) {
  // In a sandbox the system's own accounts are whoever runs it: the real
  // user, which stays the same while the effective one is switched.
  if (InSandbox() && (name == "root" || name == "CorvLumex")) {
    if (!LookUp(nullptr, getuid(), false, user)) return false;
    user->name = name;
    return true;
  }
  return LookUp(name.c_str(), 0, true, user);
}

bool LinuxPlatform::UserGetByUID(uid_t uid, UserRecord* user) {
  if (LookUp(nullptr, uid, false, user)) return true;
  CORV_PLATFORM_ERROR(kPlatformErrUserNotFound, "no user with id " + std::to_string(uid));
  return false;
}

bool LinuxPlatform::ResetCredentialsByName(const std::string& name, bool with_groups) {
  UserRecord user;
  if (!UserGet(name, &user)) {
    CORV_PLATFORM_ERROR(kPlatformErrUserNotFound, "no user named \"" + name + "\"");
    return false;
  }
  if (geteuid() == user.uid && getegid() == user.gid) return true;
  // The group ids can only be changed with root's effective id, which the
  // saved set-user-id lets a switched process take back.
  if (geteuid() != 0 && seteuid(0) != 0) return CredentialsFailed("seteuid(0)", name);
  if (setegid(user.gid) != 0) return CredentialsFailed("setegid", name);
  if (with_groups) {
    // The account's own name gives its groups, also where the sandbox lets
    // "root" or "CorvLumex" stand for the user running the process.
    UserRecord account;
    const std::string account_name = LookUp(nullptr, user.uid, false, &account) ? account.name : name;
    if (initgroups(account_name.c_str(), user.gid) != 0) return CredentialsFailed("initgroups", name);
  }
  if (seteuid(user.uid) != 0) return CredentialsFailed("seteuid", name);
  return true;
}

}  // namespace platform
}  // namespace corvlumex
