#include "platform/file_ops.h"

#include "platform/platform.h"

namespace corvlumex {

bool CheckACLPerm(const std::string& path, int perm) {
  const int granted = platform::Current()->AclPermGet(path);
  if (granted < 0) return false;
  return (granted & perm) != 0;
}

bool IsMountPoint(const std::string& path) { return platform::Current()->DirIsMountPoint(path) > 0; }

namespace {

bool CopyFile(const std::string& src, const std::string& dst, bool move) {
  platform::CopyArgs args;
  args.keep_attributes = true;
  args.move = move;
  return platform::Current()->FileCopy(src, dst, args, 1) == 0;
}

}  // namespace

bool MVFile(const std::string& src, const std::string& dst) { return CopyFile(src, dst, true); }

bool CPFile(const std::string& src, const std::string& dst) { return CopyFile(src, dst, false); }

}  // namespace corvlumex
