// Following a share that was renamed, moved to another volume, or whose
// recycle bin was switched on or off.
//
// Documents are keyed by full path, so when a share's directory changes,
// every document of the share names a place that no longer exists. The
// index keeps its identity (settings, suggestions) and follows the share;
// its documents under the old directory are removed and each folder is
// queued for a reindex, which writes them again under the new paths.
#include <dirent.h>

#include "common/file_util.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/mgmt/mgmt_util.h"
#include "fileindex/mgmt/related_services.h"
#include "fileindex/paths/path_rules.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {
namespace {

constexpr char kRecycleBin[] = "#recycle";

// The recycle bins of a share: its own, and in the home folders each user's.
std::vector<std::string> RecycleBins(const std::string& share_name, const std::string& share_dir) {
  std::vector<std::string> bins = {share_dir + "/" + kRecycleBin};
  if (share_name != kHomesShare) return bins;
  DIR* dir = opendir(share_dir.c_str());
  if (dir == nullptr) return bins;
  while (const struct dirent* entry = readdir(dir)) {
    const std::string name = entry->d_name;
    if (name == "." || name == ".." || name[0] == '@' || name[0] == '#') continue;
    const std::string bin = share_dir + "/" + name + "/" + kRecycleBin;
    if (IsDirExist(bin, false)) bins.push_back(bin);
  }
  closedir(dir);
  errno = 0;
  return bins;
}

void CarryStatus(const std::string& share_from, const std::string& share_to, unsigned int status) {
  if (status == 0) return;
  StatusMgr().SetShareStatus(share_to, status);
  StatusMgr().ClearShareStatus(share_from);
}

}  // namespace

void ShareRename(const std::string& share_from, const std::string& share_to) {
  const FolderLock lock;
  CORV_CHECK_THROW(share_from.empty(), kErrorBadArgument, "Empty share name");
  CORV_CHECK_THROW(share_to.empty(), kErrorBadArgument, "Empty share name");
  if (share_from == share_to) return;

  FolderMgr folder_mgr;
  const std::vector<std::shared_ptr<Folder>> folders = FoldersOfShare(folder_mgr, share_from);
  const unsigned int status = StatusMgr().GetShareStatus(share_from);
  if (folders.empty()) {
    // Nothing indexed: only flags left behind by earlier operations follow.
    CarryStatus(share_from, share_to, status);
    return;
  }
  CORV_CHECK_THROW(folder_mgr.IsShareIndexed(share_to), kErrorDuplicatedId, "Duplicated ID: /" + share_to);
  const sdk::SDKShare share(share_to);
  // The share's directory bears its name: the old one stood beside the new.
  const std::string old_dir = Dirname(share.GetPath()) + "/" + share_from;
  const std::string old_queue = ComposeQueuePath(old_dir);
  for (const std::shared_ptr<Folder>& folder : folders) folder->SetShare(share_to);

  // The index and the folder file change names together; when the file
  // cannot follow, the index takes its old name back.
  elastic::ShareIndexRename(share_from, share_to, share.GetDBPath());
  try {
    folder_mgr.Save();
  } catch (const Error&) {
    try {
      elastic::ShareIndexRename(share_to, share_from, share.GetDBPath());
    } catch (const Error& error) {
      CORV_LOG_FN("Cannot rename the index back to [%s], code=%d, reason=%s", share_from.c_str(), error.code,
                  error.reason.c_str());
    }
    throw;
  }
  try {
    const FolderMgr saved;
    DeleteCORVNotifydCfgByQueue(old_queue, share_from);
    UpsertCORVNotifydCfg(share_to, saved);
    IndexDelTree(share_to, old_dir);
    CarryStatus(share_from, share_to, status);
  } catch (const Error&) {
    MarkNeedReindex(share_to);
    throw;
  }
  SendSettingChanged(share_from, false);
  SendSettingChanged(share_to, true);
  QueueFoldersReindex(folders);
}

void ShareMigrate(const std::string& share_name, const std::string& path_from, const std::string& path_to) {
  const FolderLock lock;
  CORV_CHECK_THROW(share_name.empty(), kErrorBadArgument, "Empty share name");
  CORV_CHECK_THROW(path_from.empty(), kErrorBadArgument, "Empty source path");
  CORV_CHECK_THROW(path_to.empty(), kErrorBadArgument, "Empty target path");
  if (path_from == path_to) return;

  const FolderMgr folder_mgr;
  const std::vector<std::shared_ptr<Folder>> folders = FoldersOfShare(folder_mgr, share_name);
  if (folders.empty()) return;
  const sdk::SDKShare share(share_name);
  CORV_CHECK_THROW(share.GetPath() != path_to, kErrorBadArgument,
                   "Share " + share_name + " lies at " + share.GetPath() + ", not at " + path_to);
  const std::string old_queue = ComposeQueuePath(path_from);

  // The search daemon moves the database itself; when it refuses, nothing
  // else has changed.
  elastic::ShareIndexMigrate(share_name, share.GetDBPath());
  try {
    DeleteCORVNotifydCfgByQueue(old_queue, share_name);
    UpsertCORVNotifydCfg(share_name, folder_mgr);
    IndexDelTree(share_name, path_from);
  } catch (const Error&) {
    MarkNeedReindex(share_name);
    throw;
  }
  SendSettingChanged(share_name, true);
  QueueFoldersReindex(folders);
}

void ShareCheckRecycle(const std::string& share_name) {
  const FolderLock lock;
  CORV_CHECK_THROW(share_name.empty(), kErrorBadArgument, "Empty share name");
  const FolderMgr folder_mgr;
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  const sdk::SDKShare share(share_name);

  // The path rules decide, as they do for every file: a bin they refuse
  // leaves the index, a bin they accept is indexed like any folder.
  for (const std::string& bin : RecycleBins(share_name, share.GetPath())) {
    if (!folder_mgr.IsFullPathIndexed(bin)) continue;
    if (CanFullPathBeIndexed(bin)) {
      if (IsDirExist(bin, false)) QueueReindex(bin);
    } else {
      IndexDelTree(share_name, bin);
    }
  }
}

}  // namespace fileindex
}  // namespace corvlumex
