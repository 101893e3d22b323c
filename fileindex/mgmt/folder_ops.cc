// Reindexing and deleting folders, and the term suggestions of the indexes.
#include <map>
#include <set>

#include "common/json_util.h"
#include "common/log.h"
#include "common/path_below.h"
#include "fileindex/queue/custom_event.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/mgmt/mgmt_util.h"
#include "fileindex/mgmt/related_services.h"
#include "fileindex/queue/custom_event.h"
#include "fileindex/queue/event.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {
namespace {

// What deleting folders does to one share, worked out before anything changes.
struct ShareDeletion {
  bool exists = true;         // the share's record still answers
  std::string directory;      // the share's own directory
  bool keeps_folders = false;  // other folders of the share stay configured
  // Folders whose documents nothing governs any more.
  std::vector<std::string> orphaned_paths;
  // Folders now governed by an outer folder: the content kinds to redo.
  std::vector<std::pair<std::string, Json::Value>> changed_settings;
  // Remaining folders inside an orphaned one: their documents went with it.
  std::set<std::string> to_reindex;
};

bool AnyKind(const Json::Value& index_cfg) {
  for (const char* kind : {"document", "audio", "video", "photo"}) {
    if (index_cfg[kind].asBool()) return true;
  }
  return false;
}


// Lists the index work of removing `removed` from `folder_mgr` (already
// without them), share by share.
std::map<std::string, ShareDeletion> PlanDeletion(const FolderMgr& folder_mgr,
                                                  const std::vector<std::shared_ptr<Folder>>& removed) {
  std::map<std::string, ShareDeletion> plan;
  for (const std::shared_ptr<Folder>& folder : removed) {
    const std::string share_name = folder->GetShare();
    const bool first = plan.count(share_name) == 0;
    ShareDeletion& share = plan[share_name];
    if (first) {
      share.keeps_folders = folder_mgr.IsShareIndexed(share_name);
      try {
        share.directory = sdk::SDKShare(share_name).GetPath();
      } catch (const Error& error) {
        if (error.code != kErrorShareNotFound) throw;
        // The share itself is gone: only its configuration is left to drop.
        share.exists = false;
      }
    }
    if (!share.exists || !share.keeps_folders) continue;
    const std::string full_path = folder->GetFullPath();
    const std::shared_ptr<Folder> governing = folder_mgr.GetMostSuitableCfg(full_path);
    if (governing) {
      const Json::Value diff = FolderMgr::DiffCfg(folder, governing)->GetIndexCfg();
      if (AnyKind(diff)) share.changed_settings.emplace_back(full_path, diff);
      continue;
    }
    share.orphaned_paths.push_back(full_path);
    for (const std::shared_ptr<Folder>& inner : FoldersOfShare(folder_mgr, share_name)) {
      if (IsPathStrictlyBelow(inner->GetFullPath(), full_path)) share.to_reindex.insert(inner->GetFullPath());
    }
  }
  return plan;
}

// Puts the monitor configuration of the shares already rewritten back to
// the folder file as it was, after a later share failed.
void RestoreMonitorCfg(const FolderMgr& folder_mgr_before, const std::vector<std::string>& shares) {
  for (const std::string& share_name : shares) {
    try {
      UpsertCORVNotifydCfg(share_name, folder_mgr_before);
    } catch (const Error& error) {
      CORV_LOG_FN("Cannot restore the monitor configuration of [%s], code=%d, reason=%s", share_name.c_str(),
                  error.code, error.reason.c_str());
    }
  }
}

// A share that no longer exists may still have an index in the search
// daemon; it goes too, but its absence is no reason to fail the deletion.
void DropIndexOfVanishedShare(const std::string& share_name) {
  try {
    elastic::ShareIndexDelete(share_name);
  } catch (const Error& error) {
    CORV_LOG_FN("Cannot delete the index of the vanished share [%s], code=%d, reason=%s", share_name.c_str(),
                error.code, error.reason.c_str());
  }
}

}  // namespace

void FolderReindex(const Json::Value& path_list) {
  const FolderLock lock;
  const FolderMgr folder_mgr;
  CORV_CHECK_THROW(!path_list.isArray(), kErrorBadArgument, JsonToString(path_list));
  std::vector<std::string> full_paths;
  for (const std::string& path : RequestPaths(path_list)) {
    std::shared_ptr<Folder> folder;
    folder_mgr.Get(folder, path);
    full_paths.push_back(folder->GetFullPath());
  }
  for (const std::string& full_path : full_paths) QueueReindex(full_path);
}

void FolderDelete(const Json::Value& path_list) {
  const FolderLock lock;
  FolderMgr folder_mgr;
  const FolderMgr folder_mgr_before;
  CORV_CHECK_THROW(!path_list.isArray(), kErrorBadArgument, JsonToString(path_list));
  std::vector<std::shared_ptr<Folder>> removed;
  for (const std::string& path : RequestPaths(path_list)) {
    std::shared_ptr<Folder> folder;
    folder_mgr.Delete(folder, path);
    removed.push_back(folder);
  }
  const std::map<std::string, ShareDeletion> plan = PlanDeletion(folder_mgr, removed);

  // Watching stops before the documents go, so that no new event brings
  // them back; the folder file is put back if the notifier cannot follow.
  folder_mgr.Save();
  std::vector<std::string> rewritten;
  try {
    for (const auto& [share_name, share] : plan) {
      if (!share.exists) continue;
      rewritten.push_back(share_name);
      if (share.keeps_folders) UpsertCORVNotifydCfg(share_name, folder_mgr);
      else DeleteCORVNotifydCfg(share_name);
    }
  } catch (const Error&) {
    folder_mgr_before.Save();
    RestoreMonitorCfg(folder_mgr_before, rewritten);
    throw;
  }

  for (const auto& [share_name, share] : plan) {
    if (!share.exists) {
      if (!share.keeps_folders) DropIndexOfVanishedShare(share_name);
      continue;
    }
    try {
      if (!share.keeps_folders) {
        elastic::ShareIndexDelete(share_name);
        continue;
      }
      for (const std::string& full_path : share.orphaned_paths) IndexDelTree(share_name, full_path);
    } catch (const Error&) {
      MarkNeedReindex(share_name);
      throw;
    }
  }
  for (const auto& [share_name, share] : plan) {
    if (share.keeps_folders) continue;
    if (share.exists) CleanShareIndexData(share_name, share.directory);
    else if (StatusMgr().GetShareStatus(share_name) != 0) StatusMgr().ClearShareStatus(share_name);
  }

  for (const auto& [share_name, share] : plan) {
    if (share.exists) SendSettingChanged(share_name, false);
  }
  for (const auto& [share_name, share] : plan) {
    for (const auto& [full_path, index_cfg] : share.changed_settings) {
      AddCustomEvent(kEventUpdateCfg, full_path, "", index_cfg);
    }
    for (const std::string& full_path : share.to_reindex) QueueReindex(full_path);
  }
  // Switched off first: samba then need not re-read the share list as well.
  if (folder_mgr.Folders().empty()) SetupRelatedServices(false);
  UpdateSpotlightShares(folder_mgr);
}

void UpdateTermSuggestion() {
  const FolderLock lock;
  const FolderMgr folder_mgr;
  for (const std::string& share_name : folder_mgr.GetIndexedShares()) {
    elastic::UpdateTermSuggestion(sdk::SDKShare(share_name).GetDBName(), {kFieldSearchFileName});
  }
}

}  // namespace fileindex
}  // namespace corvlumex
