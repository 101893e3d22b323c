#include "sdk/credentials.h"

#include <unistd.h>

#include "common/log.h"
#include "platform/platform.h"
#include "sdk/sdk_mutex.h"

namespace corvlumex {
namespace sdk {

SDKCredentials::SDKCredentials() : euid_(geteuid()), egid_(getegid()) {
  platform::UserRecord user_info;
  bool found;
  std::string error;
  {
    LockMutex guard(SDKMutex());
    found = platform::Current()->UserGetByUID(euid_, &user_info);
    if (!found) error = StringPrintf("0x%04X", static_cast<unsigned>(platform::LastError().code));
  }
  CORV_CHECK_THROW_TEXT(!found, "0 > CORVUserGetByUID(euid_, &user_info) || !user_info", kErrorSwitchUser,
                        "CORVUserGetByUID failed, err=" + error);
  username_ = user_info.name;
}

SDKCredentials::SDKCredentials(const std::string& name) : euid_(geteuid()), egid_(getegid()), username_(name) {
  AsUser(name);
}

void SDKCredentials::AsUser(const std::string& target_username) {
  bool switched;
  {
    LockMutex guard(SDKMutex());
    switched = platform::Current()->ResetCredentialsByName(target_username, true);
  }
  CORV_CHECK_THROW_TEXT(!switched, "!ResetCredentialsByName(target_username)", kErrorSwitchUser);
}

// A destructor may not throw: a failed restore ends the process here,
// deliberately, rather than let it run on as the wrong user.
SDKCredentials::~SDKCredentials() {
  bool restored = true;
  {
    LockMutex guard(SDKMutex());
    if (geteuid() == euid_ && getegid() == egid_) return;
    restored = platform::Current()->ResetCredentialsByName(username_, true);
  }
  CORV_CHECK_THROW_TEXT(!restored, "!ResetCredentialsByName(username_)", kErrorSwitchUser);
}

}  // namespace sdk

bool ChownCorvLumex(const std::string& path) {
  platform::UserRecord user;
  {
    LockMutex guard(sdk::SDKMutex());
    CORV_CHECK_THROW(!platform::Current()->UserGet("CorvLumex", &user), kErrorUserLookup);
  }
  return chown(path.c_str(), user.uid, user.gid) == 0;
}

}  // namespace corvlumex
