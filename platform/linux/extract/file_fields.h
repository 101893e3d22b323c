// The file-system fields of a document, read from the file's status without
// opening it, so they are cheap and safe to take in the calling process.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

// The status of one directory entry (the entry itself, links not followed).
struct FileStatus {
  mode_t mode = 0;
  uid_t uid = 0;
  gid_t gid = 0;
  int64_t size = 0;
  int64_t blocks = 0;  // 512-byte units
  int64_t access_time = 0;
  int64_t change_time = 0;  // attributes
  int64_t modify_time = 0;  // content
  int64_t birth_time = 0;
  bool has_birth_time = false;  // the file system keeps creation times
  bool has_acl = false;         // a POSIX access ACL beyond the mode bits
};

// statx of `path` without following a final link; false with errno on failure.
bool ReadFileStatus(const std::string& path, FileStatus* status);

// The privilege string: the entry type and permission bits as `ls -l` shows
// them ("-rw-r-----", "drwxrws--T"), then "+" when an ACL adds rights.
std::string PrivilegeString(mode_t mode, bool has_acl);

// Sets every file-system field of `document` for `path`.
void FillFileFields(const std::string& path, const FileStatus& status, Json::Value& document);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
