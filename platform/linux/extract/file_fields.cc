#include "platform/linux/extract/file_fields.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include <cerrno>

#include "common/file_util.h"
#include "platform/linux/extract/document_fields.h"

namespace corvlumex {
namespace platform {
namespace extract {

bool ReadFileStatus(const std::string& path, FileStatus* status) {
  struct statx sx;
  const unsigned int wanted = STATX_BASIC_STATS | STATX_BTIME;
  if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, wanted, &sx) != 0) return false;
  status->mode = sx.stx_mode;
  status->uid = sx.stx_uid;
  status->gid = sx.stx_gid;
  status->size = static_cast<int64_t>(sx.stx_size);
  status->blocks = static_cast<int64_t>(sx.stx_blocks);
  status->access_time = sx.stx_atime.tv_sec;
  status->change_time = sx.stx_ctime.tv_sec;
  status->modify_time = sx.stx_mtime.tv_sec;
  status->has_birth_time = (sx.stx_mask & STATX_BTIME) != 0;
  status->birth_time = status->has_birth_time ? sx.stx_btime.tv_sec : 0;
  // Only the presence of the ACL matters here; a file system without
  // extended attributes simply has none.
  status->has_acl = lgetxattr(path.c_str(), "system.posix_acl_access", nullptr, 0) > 0;
  errno = 0;
  return true;
}

std::string PrivilegeString(mode_t mode, bool has_acl) {
  char type = '?';
  switch (mode & S_IFMT) {
    case S_IFREG: type = '-'; break;
    case S_IFDIR: type = 'd'; break;
    case S_IFLNK: type = 'l'; break;
    case S_IFIFO: type = 'p'; break;
    case S_IFSOCK: type = 's'; break;
    case S_IFCHR: type = 'c'; break;
    case S_IFBLK: type = 'b'; break;
  }
  // Execute position: the special bit shows lower case over x, upper case without it.
  auto exec_char = [mode](mode_t exec_bit, mode_t special_bit, char special) {
    const bool x = (mode & exec_bit) != 0;
    if (mode & special_bit) return x ? special : static_cast<char>(special - 'a' + 'A');
    return x ? 'x' : '-';
  };
  std::string text;
  text += type;
  text += (mode & S_IRUSR) ? 'r' : '-';
  text += (mode & S_IWUSR) ? 'w' : '-';
  text += exec_char(S_IXUSR, S_ISUID, 's');
  text += (mode & S_IRGRP) ? 'r' : '-';
  text += (mode & S_IWGRP) ? 'w' : '-';
  text += exec_char(S_IXGRP, S_ISGID, 's');
  text += (mode & S_IROTH) ? 'r' : '-';
  text += (mode & S_IWOTH) ? 'w' : '-';
  text += exec_char(S_IXOTH, S_ISVTX, 't');
  if (has_acl) text += '+';
  return text;
}

void FillFileFields(const std::string& path, const FileStatus& status, Json::Value& document) {
  const bool is_dir = S_ISDIR(status.mode);
  SetNameFields(path, document);
  document[kFieldIsDir] = is_dir;
  document[kFieldPrivilege] = PrivilegeString(status.mode, status.has_acl);
  document[kFieldOwnerUserID] = std::to_string(status.uid);
  document[kFieldOwnerGroupID] = std::to_string(status.gid);
  document[kFieldFSSize] = static_cast<Json::Int64>(status.size);
  document[kFieldLogicalSize] = static_cast<Json::Int64>(status.size);
  document[kFieldPhysicalSize] = static_cast<Json::Int64>(status.blocks * 512);
  document[kFieldContentChangeDate] = static_cast<Json::Int64>(status.modify_time);
  document[kFieldAttributeChangeDate] = static_cast<Json::Int64>(status.change_time);
  document[kFieldLastUsedDate] = static_cast<Json::Int64>(status.access_time);
  if (status.has_birth_time) document[kFieldCreationDate] = static_cast<Json::Int64>(status.birth_time);
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
