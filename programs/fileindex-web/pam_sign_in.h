// Checks a user name and password with the server's own accounts through
// PAM (service "fileindex-web", /etc/pam.d/fileindex-web): authentication
// and the account check (expired or locked accounts are refused).
#pragma once

#include <string>

namespace corvlumex {
namespace web {

// True when PAM accepts the pair; `why` gets PAM's reason otherwise.
bool PamSignIn(const std::string& service, const std::string& user, const std::string& password, std::string* why);

}  // namespace web
}  // namespace corvlumex
