// Scoped switch of the process's effective user and groups.
//
//   SDKCredentials saved;          // remembers who we are now
//   saved.AsUser("alice");         // ...act as alice...
//                                  // destructor: back to the saved user
//
//   SDKCredentials as("alice");    // switches at once; its destructor
//                                  // re-applies alice, not the caller
//
// The ids are process-wide: while switched, every thread runs as that user.
// A restore that fails ends the process: running on with the wrong identity
// would be worse.
#pragma once

#include <sys/types.h>

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace sdk {

class SDKCredentials {
 public:
  // Saves the effective ids and the name of the effective user. Throws Error 503.
  SDKCredentials();
  // Saves the effective ids, keeps `name` as the user to restore, and
  // switches to it. Throws Error 503.
  explicit SDKCredentials(const std::string& name);
  // When the effective ids changed since construction, re-applies the kept
  // user by name; terminates the process when that fails.
  ~SDKCredentials();
  SDKCredentials(const SDKCredentials&) = delete;
  SDKCredentials& operator=(const SDKCredentials&) = delete;

  // Switches the effective user and groups to `target_username`. Throws Error 503.
  void AsUser(const std::string& target_username);

 private:
  uid_t euid_;
  gid_t egid_;
  std::string username_;
};

}  // namespace sdk

// Gives `path` to the package's service user (looked up under SDKMutex()).
bool ChownCorvLumex(const std::string& path);

}  // namespace corvlumex

CORVLUMEX_API_END
