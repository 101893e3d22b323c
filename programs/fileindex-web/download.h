// Opening a file for download on behalf of a signed-in user.
//
// The path must be absolute, without "." or ".." components, inside an
// indexed folder of a share. The file is opened by a short-lived child
// process that has taken the user's uid, gid and groups (setgroups,
// setresgid, setresuid), so the kernel decides with modes, owners, ACLs and
// search permission on every parent, exactly as for a login of that user;
// the daemon's own identity is never changed. The child passes the open
// descriptor back over a socket pair. The daemon then reads where the
// descriptor really points (/proc/self/fd) and refuses anything that is not
// a regular file inside the share's own directory: a symbolic link leaving
// the share, or one swapped in between the checks, cannot reach further.
#pragma once

#include <string>

#include "programs/fileindex-web/accounts.h"

namespace corvlumex {
namespace web {

struct OpenedFile {
  int fd = -1;            // owned by the caller
  std::string real_path;  // where the descriptor points
  long long size = 0;
};

// Throws ApiError: 400 for a malformed path, 404 for a path outside every
// indexed folder or missing, 403 when the user may not read it.
OpenedFile OpenForDownload(const std::string& path, const Account& account);

}  // namespace web
}  // namespace corvlumex
