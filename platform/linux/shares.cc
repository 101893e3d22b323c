// Share questions of the Linux platform, answered from the share registry.
#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

#include "common/file_util.h"
#include "common/path_below.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/share_registry.h"

namespace corvlumex {
namespace platform {
namespace {

constexpr char kHomesShare[] = "homes";
constexpr char kRecycleBin[] = "#recycle";
// Where a share keeps its index files: the metadata folder the notifier never watches.
constexpr char kQueueFile[] = "/@eaDir/fileindex.queue";
constexpr char kDatabaseDir[] = "/@eaDir/fileindex.db";
constexpr char kIndexPrefix[] = "fileindex_";

int CopyOut(const std::string& value, char* buffer, size_t size, const char* what) {
  if (buffer == nullptr || value.size() + 1 > size) {
    CORV_PLATFORM_ERROR(kPlatformErrBufferTooSmall, std::string(what) + " does not fit its buffer: " + value);
    return -1;
  }
  memcpy(buffer, value.c_str(), value.size() + 1);
  return 0;
}

int FlagOut(bool flag, int* value) {
  if (value == nullptr) {
    CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "no place for the flag");
    return -1;
  }
  *value = flag ? 1 : 0;
  return 0;
}

// The part of `full_path` below its share's directory ("" or "/..."), after
// finding the share; false (last error set) when no share holds the path.
bool SplitByShare(const std::string& full_path, ShareInfo* share, std::string* rest) {
  std::vector<ShareInfo> shares;
  if (!LoadShareRegistry(&shares)) return false;
  const ShareInfo* found = FindShareByFullPath(shares, full_path);
  if (found == nullptr) {
    CORV_PLATFORM_ERROR(kPlatformErrShareNotFound, "no share holds " + full_path);
    return false;
  }
  *share = *found;
  *rest = full_path.substr(found->path.size());
  return true;
}

// Composes `share_path` + `suffix`; the share path must be absolute.
int ComposeSharePath(const char* share_path, const char* suffix, char* path, size_t size) {
  std::string base = share_path ? share_path : "";
  while (base.size() > 1 && base.back() == '/') base.pop_back();
  if (base.empty() || base[0] != '/' || base == "/") {
    CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "not a share directory: \"" + base + "\"");
    return -1;
  }
  return CopyOut(base + suffix, path, size, "path");
}

// Read, write and search bits of `user` on `st` from its mode, owner and groups.
SharePrivilege PrivilegeFromMode(const struct stat& st, const UserRecord& user) {
  if (user.uid == 0) return kSharePrivReadWrite;
  mode_t bits = st.st_mode & S_IRWXO;
  if (st.st_uid == user.uid) {
    bits = (st.st_mode & S_IRWXU) >> 6;
  } else {
    int count = 32;
    std::vector<gid_t> groups(count);
    while (getgrouplist(user.name.c_str(), user.gid, groups.data(), &count) < 0) groups.resize(count);
    groups.resize(count);
    for (gid_t gid : groups) {
      if (gid == st.st_gid) {
        bits = (st.st_mode & S_IRWXG) >> 3;
        break;
      }
    }
  }
  if ((bits & 05) != 05) return kSharePrivNone;
  return (bits & 02) ? kSharePrivReadWrite : kSharePrivReadOnly;
}

}  // namespace

int LinuxPlatform::ShareGet(const std::string& name, std::unique_ptr<ShareInfo>* info) {
  std::vector<ShareInfo> shares;
  if (!LoadShareRegistry(&shares)) return -1;
  for (ShareInfo& share : shares) {
    if (share.name == name) {
      *info = std::make_unique<ShareInfo>(std::move(share));
      return 0;
    }
  }
  CORV_PLATFORM_ERROR(kPlatformErrShareNotFound, "no share named \"" + name + "\"");
  return -1;
}

std::unique_ptr<StringList> LinuxPlatform::StringListAlloc(size_t capacity) {
  try {
    // The capacity is a hint: the list grows as shares are added.
    auto list = std::make_unique<StringList>();
    list->reserve(std::min<size_t>(capacity, 64));
    return list;
  } catch (const std::bad_alloc&) {
    CORV_PLATFORM_ERROR(kPlatformErrSystem, "cannot allocate a list of " + std::to_string(capacity));
    return nullptr;
  }
}

int LinuxPlatform::ShareEnum(StringList* list, int filter) {
  if (list == nullptr) {
    CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "no list to fill");
    return -1;
  }
  std::vector<ShareInfo> shares;
  if (!LoadShareRegistry(&shares)) return -1;
  for (const ShareInfo& share : shares) {
    if ((filter & kShareEnumSkipReadOnly) && share.readonly) continue;
    if ((filter & kShareEnumSkipEncrypted) && share.encrypted) continue;
    list->push_back(share.name);
  }
  return static_cast<int>(list->size());
}

// Encryption is one flag on Linux: an encrypted share's directory is the
// mount of its decrypted view (fscrypt, gocryptfs...), and the platform does
// not index what it would have to decrypt.
int LinuxPlatform::ShareIsEncryptedGet(const ShareInfo& share, int* value) { return FlagOut(share.encrypted, value); }

int LinuxPlatform::ShareIsReadOnlyGet(const ShareInfo& share, int* value) { return FlagOut(share.readonly, value); }

int LinuxPlatform::ShareIsEncryptionGet(const ShareInfo& share, int* value) { return FlagOut(share.encrypted, value); }

int LinuxPlatform::ShareRecycleStatusGet(const ShareInfo& share, int* value) {
  return FlagOut(share.recycle_bin, value);
}

int LinuxPlatform::ShareHideUnreadableGet(const ShareInfo& share, int* value) {
  return FlagOut(share.hide_unreadable, value);
}

int LinuxPlatform::ShareUserPrivGet(const std::string& user_name, const ShareInfo& share) {
  UserRecord user;
  if (!UserGet(user_name, &user)) {
    CORV_PLATFORM_ERROR(kPlatformErrUserNotFound, "no user named \"" + user_name + "\"");
    return -1;
  }
  SharePrivilege privilege = kSharePrivNone;
  const auto listed = share.privileges.find(user_name);
  if (listed != share.privileges.end()) {
    privilege = listed->second;
  } else {
    struct stat st;
    if (stat(share.path.c_str(), &st) == 0) privilege = PrivilegeFromMode(st, user);
    errno = 0;
  }
  if (share.readonly && privilege == kSharePrivReadWrite) privilege = kSharePrivReadOnly;
  return privilege;
}

int LinuxPlatform::ShareNamePathGet(const char* full_path, char* name, size_t name_size, char* path,
                                    size_t path_size) {
  ShareInfo share;
  std::string rest;
  if (full_path == nullptr || !SplitByShare(full_path, &share, &rest)) return -1;
  if (CopyOut(share.name, name, name_size, "share name") < 0) return -1;
  return CopyOut(share.path, path, path_size, "share path");
}

int LinuxPlatform::ShareIsShareRecycle(const std::string& full_path) {
  ShareInfo share;
  std::string rest;
  if (!SplitByShare(full_path, &share, &rest)) return -1;
  // The bin is "#recycle" right under the share's directory, whether or not
  // the bin is switched on now: what it holds was deleted either way.
  return IsPathAtOrBelow(rest, std::string("/") + kRecycleBin) ? 1 : 0;
}

int LinuxPlatform::RecycleUserHomePathIsExist(const std::string& full_path, int) {
  ShareInfo share;
  std::string rest;
  if (!SplitByShare(full_path, &share, &rest)) return -1;
  if (share.name != kHomesShare) return 0;
  // /<user>/#recycle[/...] below the home folders.
  const size_t user_end = rest.find('/', 1);
  if (rest.size() < 2 || user_end == std::string::npos || user_end == 1) return 0;
  return IsPathAtOrBelow(rest.substr(user_end), std::string("/") + kRecycleBin) ? 1 : 0;
}

int LinuxPlatform::ServiceUserHomeIsEnabled() {
  std::unique_ptr<ShareInfo> homes;
  if (ShareGet(kHomesShare, &homes) == 0) return 1;
  return LastError().code == kPlatformErrShareNotFound ? 0 : -1;
}

int LinuxPlatform::QueuePathCompose(const char* share_path, char* path, size_t size) {
  return ComposeSharePath(share_path, kQueueFile, path, size);
}

int LinuxPlatform::DBPathCompose(const char* share_path, char* path, size_t size) {
  return ComposeSharePath(share_path, kDatabaseDir, path, size);
}

int LinuxPlatform::GetIndexID(const char* share_name, char* name, size_t size) {
  if (share_name == nullptr || *share_name == '\0') {
    CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "empty share name");
    return -1;
  }
  return CopyOut(std::string(kIndexPrefix) + share_name, name, size, "index name");
}

}  // namespace platform
}  // namespace corvlumex
