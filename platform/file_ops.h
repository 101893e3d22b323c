// File helpers that ask the platform: ACL permission bits, mount points, and
// copies that keep a file's attributes. Beside the platform interface rather
// than in common/file_util.h, because they need it.
#pragma once

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// True when any bit of `perm` is granted to the caller on `path`.
bool CheckACLPerm(const std::string& path, int perm);
bool IsMountPoint(const std::string& path);
// Move / copy keeping the attributes, through the platform's file copy.
bool MVFile(const std::string& src, const std::string& dst);
bool CPFile(const std::string& src, const std::string& dst);

}  // namespace corvlumex

CORVLUMEX_API_END
