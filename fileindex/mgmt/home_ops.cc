// The users' home folders: the "homes" share follows the home service being
// switched on and off, and a user's folders follow the user's new name.
#include "common/file_util.h"
#include "common/log.h"
#include "common/path_below.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/mgmt/mgmt_util.h"
#include "fileindex/mgmt/pause_util.h"
#include "fileindex/mgmt/related_services.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {
namespace {

// Best-effort return of the monitor configuration after a later step failed.
void RestoreHomesMonitorCfg(const FolderMgr& folder_mgr, bool watched) {
  try {
    if (watched) UpsertCORVNotifydCfg(kHomesShare, folder_mgr);
    else DeleteCORVNotifydCfg(kHomesShare);
  } catch (const Error& error) {
    CORV_LOG_FN("Cannot restore the monitor configuration of [%s], code=%d, reason=%s", kHomesShare, error.code,
                error.reason.c_str());
  }
}

// A user's home folder, /homes/<user>, renamed with the user.
struct HomeMove {
  HomeMove(const std::string& user_from, const std::string& user_to)
      : old_home(std::string("/") + kHomesShare + "/" + user_from), new_home(std::string("/") + kHomesShare + "/" + user_to) {}
  // The share path in the old home that `renamed` (in the new home) had.
  std::string OldPath(const Folder& renamed) const { return old_home + renamed.GetPath().substr(new_home.size()); }

  std::string old_home, new_home;
};

// The configured folders of the old home, as records under the new home.
// Throws when one of them is configured there already.
std::vector<std::shared_ptr<Folder>> FoldersMovedHome(const FolderMgr& folder_mgr, const HomeMove& move) {
  std::vector<std::shared_ptr<Folder>> moved;
  for (const std::shared_ptr<Folder>& folder : FoldersOfShare(folder_mgr, kHomesShare)) {
    const std::string& path = folder->GetPath();
    if (!IsPathAtOrBelow(path, move.old_home)) continue;
    Json::Value data = folder->GetData();
    data["path"] = move.new_home + path.substr(move.old_home.size());
    auto renamed = std::make_shared<Folder>(data);
    CORV_CHECK_THROW(folder_mgr.HasFolder(renamed->GetPath()), kErrorDuplicatedId,
                     "Duplicated ID: " + renamed->GetPath());
    moved.push_back(renamed);
  }
  return moved;
}

// The full paths whose documents went with the old home: a folder governs
// the whole old home, or only the moved folders held documents.
std::vector<std::string> OldHomeTrees(const FolderMgr& folder_mgr, const HomeMove& move, const std::string& volume,
                                      const std::vector<std::shared_ptr<Folder>>& moved) {
  std::vector<std::string> old_trees;
  if (folder_mgr.IsFullPathIndexed(volume + move.old_home)) {
    old_trees.push_back(volume + move.old_home);
  } else {
    for (const std::shared_ptr<Folder>& renamed : moved) old_trees.push_back(volume + move.OldPath(*renamed));
  }
  return old_trees;
}

// Replaces the old home's folders by `moved` in the folder file and the
// monitor configuration; a failed monitor update puts both back.
void SaveMovedFolders(FolderMgr& folder_mgr, const FolderMgr& folder_mgr_before, const HomeMove& move,
                      const std::vector<std::shared_ptr<Folder>>& moved) {
  for (const std::shared_ptr<Folder>& renamed : moved) {
    const std::string old_path = move.OldPath(*renamed);
    CORV_LOG("Update homes rule: [%s] -> [%s]", old_path.c_str(), renamed->GetPath().c_str());
    std::shared_ptr<Folder> removed;
    folder_mgr.Delete(removed, old_path);
    std::shared_ptr<Folder> reindex;
    folder_mgr.Upsert(reindex, renamed);
  }
  folder_mgr.Save();
  try {
    UpsertCORVNotifydCfg(kHomesShare, folder_mgr);
  } catch (const Error&) {
    folder_mgr_before.Save();
    RestoreHomesMonitorCfg(folder_mgr_before, true);
    throw;
  }
}

}  // namespace

void HomeDisable() {
  const FolderLock lock;
  const FolderMgr folder_mgr;
  if (!folder_mgr.IsShareIndexed(kHomesShare)) return;
  if (StatusMgr().GetShareStatus(kHomesShare) & kShareStatusHomeDisabled) return;
  // The folders and the index stay: switching the service on again brings
  // them back without the user configuring anything.
  DeleteCORVNotifydCfg(kHomesShare);
  try {
    PauseShareBits(folder_mgr, kHomesShare, kShareStatusHomeDisabled);
  } catch (const Error&) {
    RestoreHomesMonitorCfg(folder_mgr, true);
    throw;
  }
}

void HomeEnable() {
  const FolderLock lock;
  const FolderMgr folder_mgr;
  const unsigned int status = StatusMgr().GetShareStatus(kHomesShare);
  if (!folder_mgr.IsShareIndexed(kHomesShare)) {
    if (status & kShareStatusHomeDisabled) StatusMgr().UnsetShareStatus(kHomesShare, kShareStatusHomeDisabled);
    return;
  }
  UpsertCORVNotifydCfg(kHomesShare, folder_mgr);
  if (!(status & kShareStatusHomeDisabled)) return;
  try {
    ResumeShareBits(folder_mgr, kHomesShare, kShareStatusHomeDisabled);
  } catch (const Error&) {
    RestoreHomesMonitorCfg(folder_mgr, false);
    throw;
  }
  // Nothing watched the home folders meanwhile.
  QueueFoldersReindex(FoldersOfShare(folder_mgr, kHomesShare));
}

void UserRename(const std::string& user_from, const std::string& user_to) {
  const FolderLock lock;
  CORV_CHECK_THROW(user_from.empty(), kErrorBadArgument, "Empty user name");
  CORV_CHECK_THROW(user_to.empty(), kErrorBadArgument, "Empty user name");
  if (user_from == user_to) return;
  FolderMgr folder_mgr;
  const FolderMgr folder_mgr_before;
  if (!folder_mgr.IsShareIndexed(kHomesShare)) return;

  const HomeMove move(user_from, user_to);
  const std::vector<std::shared_ptr<Folder>> moved = FoldersMovedHome(folder_mgr, move);
  const std::string volume = Dirname(sdk::SDKShare(kHomesShare).GetPath());
  const std::vector<std::string> old_trees = OldHomeTrees(folder_mgr, move, volume, moved);
  if (!moved.empty()) SaveMovedFolders(folder_mgr, folder_mgr_before, move, moved);
  // The home folder was renamed on disk: what was indexed in it is keyed by
  // its old paths.
  try {
    for (const std::string& tree : old_trees) IndexDelTree(kHomesShare, tree);
  } catch (const Error&) {
    MarkNeedReindex(kHomesShare);
    throw;
  }
  if (!moved.empty()) SendSettingChanged(kHomesShare, true);
  // A reindex of the whole new home, when a folder governs it, covers the
  // moved folders; AddCustomEvent skips what a queued reindex covers.
  if (folder_mgr.IsFullPathIndexed(volume + move.new_home)) QueueReindex(volume + move.new_home);
  QueueFoldersReindex(moved);
}

}  // namespace fileindex
}  // namespace corvlumex
