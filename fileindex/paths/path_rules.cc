#include "fileindex/paths/path_rules.h"

#include <cstring>
#include <set>

#include "common/file_util.h"
#include "common/log.h"
#include "platform/platform.h"
#include "sdk/sdk_mutex.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {
namespace {

// Names the indexer leaves alone whatever the platform says: folders and
// files that desktop clients create for their own bookkeeping.
const std::set<std::string> kPreservedNames = {".TemporaryItems", ".CORVPPSDB", ".DS_Store"};

constexpr char kHomesShare[] = "homes";
// Passed through to the platform's home recycle-bin question.
constexpr int kHomeRecycleFlags = 11;

}  // namespace

void GetShareNameByPath(std::string& share_name, const std::string& share_path) {
  CORV_CHECK_THROW(1 > share_path.size() || '/' != share_path.at(0), kErrorBadArgument, share_path);
  const size_t slash = share_path.find('/', 1);
  share_name = slash == std::string::npos ? share_path.substr(1) : share_path.substr(1, slash - 1);
}

void GetFullPath(std::string& full_path, const std::string& share_path) {
  std::string share_name;
  GetShareNameByPath(share_name, share_path);
  const sdk::SDKShare share(share_name);
  // The volume is the share's directory without its last component; the
  // share path brings the share's name back.
  const std::string& share_dir = share.GetPath();
  const size_t last_slash = share_dir.rfind('/');
  full_path = (last_slash == std::string::npos ? std::string() : share_dir.substr(0, last_slash)) + share_path;
}

void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path, const std::string& full_path) {
  char szShareName[platform::kShareNameMax];
  char szSharePath[platform::kPathBufferSize];
  memset(szShareName, 0, sizeof(szShareName));
  memset(szSharePath, 0, sizeof(szSharePath));
  int result;
  {
    LockMutex guard(sdk::SDKMutex());
    result = platform::Current()->ShareNamePathGet(full_path.c_str(), szShareName, sizeof(szShareName),
                                                   szSharePath, sizeof(szSharePath));
  }
  CORV_CHECK_THROW_TEXT(0 > result,
                        "0 > CORVShareNamePathGet(full_path.c_str(), szShareName, sizeof(szShareName), szSharePath, "
                        "sizeof(szSharePath))",
                        kErrorSystem, "CORVShareNamePathGet failed, full_path=" + full_path);
  share_name = szShareName;
  share_path = szSharePath;
}

std::string ReplacePathShare(const std::string& path, const std::string& new_share, const std::string& old_share) {
  // The appended "/" lets a path that ends with the share's name match.
  const size_t pos = (path + "/").find("/" + old_share + "/");
  CORV_CHECK_THROW_TEXT(std::string::npos == pos, "string::npos == pos", kErrorBadArgument,
                        "Cannot find share: " + old_share);
  const size_t rest = pos + 1 + old_share.size();
  return path.substr(0, pos + 1) + new_share + (rest < path.size() ? path.substr(rest) : std::string());
}

bool IsFullPathInRecycleBin(const std::string& full_path) {
  std::string share_name, share_path;
  GetShareNamePathByFullPath(share_name, share_path, full_path);
  const std::shared_ptr<platform::Platform> current = platform::Current();
  if (std::string::npos != full_path.find("#recycle")) {
    LockMutex guard(sdk::SDKMutex());
    if (1 == current->ShareIsShareRecycle(full_path)) return true;
  }
  if (kHomesShare != share_name) return false;
  LockMutex guard(sdk::SDKMutex());
  return 1 == current->RecycleUserHomePathIsExist(full_path, kHomeRecycleFlags);
}

bool CanFullPathBeIndexed(const std::string& full_path) {
  const std::shared_ptr<platform::Platform> current = platform::Current();
  if (std::string::npos != full_path.find("#snapshot")) {
    int in_snapshot = 0;
    LockMutex guard(sdk::SDKMutex());
    if (0 == current->FhsPathInSnapshot(full_path, &in_snapshot) && 1 == in_snapshot) return false;
  }
  {
    LockMutex guard(sdk::SDKMutex());
    const int fs_type = current->GetFSType(full_path, 0);
    if (0 > fs_type || current->FSIsRemoteFS(fs_type) || current->FSIsImageFS(fs_type) ||
        platform::kFsPseudo == fs_type) {
      return false;
    }
  }
  std::string share_name, share_path;
  GetShareNamePathByFullPath(share_name, share_path, full_path);
  const sdk::SDKShare share(share_name);
  if (!share.CanBeIndexed()) return false;
  if (IsFullPathInRecycleBin(full_path)) return false;
  int mount_point;
  {
    LockMutex guard(sdk::SDKMutex());
    mount_point = current->DirIsMountPoint(full_path);
  }
  // An encrypted share's directory is the mount of its decrypted view.
  if (1 == mount_point && !share.IsEncryption()) return false;
  // Only the canonical spelling of a path without links is indexed, so each
  // file has one key in the index.
  const std::string resolved = RealPath(full_path);
  errno = 0;
  return !resolved.empty() && resolved == full_path;
}

bool CanPathBeIndexed(const std::string& share_path) {
  std::string full_path;
  GetFullPath(full_path, share_path);
  return CanFullPathBeIndexed(full_path);
}

bool IsSystemPreservedFileName(const std::string& name) {
  int hidden;
  {
    LockMutex guard(sdk::SDKMutex());
    hidden = platform::Current()->EAIsHiddenDir(name);
  }
  return 1 == hidden || kPreservedNames.count(name) > 0;
}

}  // namespace fileindex
}  // namespace corvlumex
