// Pausing and resuming the indexing of shares, one by one or a volume at a
// time. The status file is the record (fileindexd reads it when it starts);
// a running daemon is told to stop or start the share's worker. When the
// daemon cannot be told, the status change is undone, so the file never
// claims a pause the daemon did not hear of.
#include <vector>

#include "common/log.h"
#include "common/path_below.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/mgmt/mgmt_util.h"
#include "fileindex/mgmt/pause_util.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {
namespace {

// The shares whose directory lies on the volume, sorted by name.
std::vector<std::string> SharesOnVolume(std::string volume_path) {
  while (volume_path.size() > 1 && volume_path.back() == '/') volume_path.pop_back();
  std::vector<std::string> shares;
  for (const std::string& share_name : sdk::SDKShare::Enum()) {
    const std::string dir = sdk::SDKShare(share_name).GetPath();
    if (IsPathStrictlyBelow(dir, volume_path)) shares.push_back(share_name);
  }
  return shares;
}

}  // namespace

void PauseShareBits(const FolderMgr& folder_mgr, const std::string& share_name, unsigned int bit) {
  const unsigned int before = StatusMgr().GetShareStatus(share_name);
  if (before & bit) return;
  StatusMgr().SetShareStatus(share_name, bit);
  if (!folder_mgr.IsShareIndexed(share_name) || (before & kShareStatusPauseMask)) return;
  try {
    SendWorkerCommand("worker_delete", share_name);
  } catch (const Error&) {
    if (before == 0) StatusMgr().ClearShareStatus(share_name);
    else StatusMgr().UnsetShareStatus(share_name, bit);
    throw;
  }
}

void ResumeShareBits(const FolderMgr& folder_mgr, const std::string& share_name, unsigned int bits) {
  const unsigned int before = StatusMgr().GetShareStatus(share_name);
  if (!(before & bits)) return;
  StatusMgr().UnsetShareStatus(share_name, bits);
  if (!folder_mgr.IsShareIndexed(share_name) || (before & ~bits & kShareStatusPauseMask)) return;
  try {
    SendWorkerCommand("worker_create", share_name);
  } catch (const Error&) {
    StatusMgr().SetShareStatus(share_name, before & bits);
    throw;
  }
}

void SharePause(const std::string& share_name) {
  const FolderLock lock;
  CORV_CHECK_THROW(share_name.empty(), kErrorBadArgument, "Empty share name");
  const FolderMgr folder_mgr;
  const sdk::SDKShare share(share_name);
  PauseShareBits(folder_mgr, share_name, kShareStatusPaused);
}

void ShareResume(const std::string& share_name) {
  const FolderLock lock;
  CORV_CHECK_THROW(share_name.empty(), kErrorBadArgument, "Empty share name");
  const FolderMgr folder_mgr;
  const sdk::SDKShare share(share_name);
  ResumeShareBits(folder_mgr, share_name, kShareStatusPaused);
}

void ShareClearPaused(const std::string& share_name) {
  const FolderLock lock;
  CORV_CHECK_THROW(share_name.empty(), kErrorBadArgument, "Empty share name");
  if (StatusMgr().GetShareStatus(share_name) & kShareStatusPauseMask) {
    StatusMgr().UnsetShareStatus(share_name, kShareStatusPauseMask);
  }
}

void VolumePause(const std::string& volume_path) {
  const FolderLock lock;
  CORV_CHECK_THROW(volume_path.empty(), kErrorBadArgument, "Empty volume path");
  const FolderMgr folder_mgr;
  for (const std::string& share_name : SharesOnVolume(volume_path)) {
    PauseShareBits(folder_mgr, share_name, kShareStatusVolumePaused);
  }
}

void VolumeResume(const std::string& volume_path) {
  const FolderLock lock;
  CORV_CHECK_THROW(volume_path.empty(), kErrorBadArgument, "Empty volume path");
  const FolderMgr folder_mgr;
  for (const std::string& share_name : SharesOnVolume(volume_path)) {
    ResumeShareBits(folder_mgr, share_name, kShareStatusVolumePaused);
  }
}

void VolumeClearPaused(const std::string& volume_path) {
  const FolderLock lock;
  CORV_CHECK_THROW(volume_path.empty(), kErrorBadArgument, "Empty volume path");
  for (const std::string& share_name : SharesOnVolume(volume_path)) {
    if (StatusMgr().GetShareStatus(share_name) & kShareStatusVolumePaused) {
      StatusMgr().UnsetShareStatus(share_name, kShareStatusVolumePaused);
    }
  }
}

}  // namespace fileindex
}  // namespace corvlumex
