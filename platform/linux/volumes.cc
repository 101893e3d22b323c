// Snapshots, hidden metadata names and free space on the Linux platform.
#include <sys/quota.h>
#include <sys/statvfs.h>

#include <cerrno>
#include <cstring>
#include <set>

#include "common/file_util.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/mount_table.h"

namespace corvlumex {
namespace platform {
namespace {

// Snapshots of a share are shown read-only below "<share>/#snapshot".
constexpr char kSnapshotDir[] = "#snapshot";

}  // namespace

int LinuxPlatform::FhsPathInSnapshot(const std::string& path, int* in_snapshot) {
  if (in_snapshot == nullptr || path.empty() || path[0] != '/') {
    CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "not an absolute path: \"" + path + "\"");
    return -1;
  }
  *in_snapshot = 0;
  // Only a whole component named "#snapshot" that is a real directory (not a
  // link to one) counts; "a#snapshot" or a file of that name does not.
  for (size_t start = 1; start < path.size();) {
    size_t end = path.find('/', start);
    if (end == std::string::npos) end = path.size();
    if (path.compare(start, end - start, kSnapshotDir) == 0 && IsDirExist(path.substr(0, end), false)) {
      *in_snapshot = 1;
      break;
    }
    start = end + 1;
  }
  return 0;
}

int LinuxPlatform::EAIsHiddenDir(const std::string& name) {
  // "@eaDir" holds per-folder metadata and each share's queue and index
  // files; "@tmp" is the platform's scratch folder on a volume.
  static const std::set<std::string> hidden = {"@eaDir", "@tmp"};
  return hidden.count(name) ? 1 : 0;
}

bool LinuxPlatform::VolumeFreeBytes(const std::string& path, uint64_t* free_bytes) {
  struct statvfs st;
  if (statvfs(path.c_str(), &st) != 0) return false;
  // What an ordinary writer may still use (df's "Avail"): the blocks
  // reserved for root are not counted on, so the volume never fills to the brim.
  *free_bytes = static_cast<uint64_t>(st.f_bavail) * st.f_frsize;
  return true;
}

bool LinuxPlatform::QuotaFreeBytes(uid_t uid, const std::string& path, uint64_t* free_bytes) {
  MountEntry mount;
  if (!FindMountOf(path, &mount) || mount.source.empty() || mount.source[0] != '/') return false;
  struct dqblk quota;
  memset(&quota, 0, sizeof(quota));
  if (quotactl(QCMD(Q_GETQUOTA, USRQUOTA), mount.source.c_str(), static_cast<int>(uid),
               reinterpret_cast<caddr_t>(&quota)) != 0) {
    errno = 0;  // no quota on this volume: nothing to report
    return false;
  }
  if (!(quota.dqb_valid & QIF_BLIMITS) || quota.dqb_bhardlimit == 0) return false;
  const uint64_t limit = static_cast<uint64_t>(quota.dqb_bhardlimit) * 1024;  // limits count 1 KiB blocks
  *free_bytes = limit > quota.dqb_curspace ? limit - quota.dqb_curspace : 0;
  return true;
}

int LinuxPlatform::QuotaIsEnough(uid_t uid, const std::string& path, uint64_t size) {
  uint64_t free_bytes = 0;
  if (!VolumeFreeBytes(path, &free_bytes)) {
    CORV_PLATFORM_ERROR(kPlatformErrSystem, "statvfs failed for \"" + path + "\": " + strerror(errno));
    return 0;
  }
  if (free_bytes < size) {
    CORV_PLATFORM_ERROR(kPlatformErrNoSpace, "volume of \"" + path + "\" has " + std::to_string(free_bytes) +
                                                 " bytes free, " + std::to_string(size) + " wanted");
    return 0;
  }
  // uid 0 stands for the owner of the volume, whom no quota limits.
  if (uid != 0 && QuotaFreeBytes(uid, path, &free_bytes) && free_bytes < size) {
    CORV_PLATFORM_ERROR(kPlatformErrQuotaExceeded, "quota of user " + std::to_string(uid) + " leaves " +
                                                       std::to_string(free_bytes) + " bytes, " +
                                                       std::to_string(size) + " wanted");
    return 0;
  }
  ClearLastError();
  return 1;
}

}  // namespace platform
}  // namespace corvlumex
