// Listing, reading, adding and changing indexed folders.
#include "fileindex/mgmt/index_mgr.h"

#include <memory>
#include <set>
#include <vector>

#include "common/json_util.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/mgmt/mgmt_util.h"
#include "fileindex/mgmt/related_services.h"
#include "fileindex/paths/path_rules.h"
#include "fileindex/queue/custom_event.h"
#include "fileindex/queue/event.h"
#include "fileindex/state/folder_mgr.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {

void FolderList(Json::Value& out, unsigned int offset, unsigned int limit, const std::string& sort_by,
                const std::string& sort_direction, const Json::Value& additional) {
  const FolderMgr folder_mgr;
  std::vector<std::shared_ptr<Folder>> folders;
  unsigned int total = 0;
  folder_mgr.List(folders, total, offset, limit, sort_by, sort_direction);
  out = Json::Value(Json::objectValue);
  out["folder"] = Json::Value(Json::arrayValue);
  out["total"] = total;
  out["offset"] = offset;
  for (const std::shared_ptr<Folder>& folder : folders) out["folder"].append(folder->GetDataWithAdditional(additional));
}

void FolderGet(Json::Value& out, const std::string& path) {
  const FolderMgr folder_mgr;
  std::shared_ptr<Folder> folder;
  folder_mgr.Get(folder, path);
  out = folder->GetData();
}

void FolderAdd(const Json::Value& folder_list, bool updater_mode) { FolderUpsert(folder_list, true, updater_mode); }

void FolderSet(const Json::Value& folder_list, bool updater_mode) { FolderUpsert(folder_list, false, updater_mode); }

void FolderUpsert(const Json::Value& folder_list, bool create, bool updater_mode) {
  const FolderLock lock;
  FolderMgr folder_mgr;
  const FolderMgr folder_mgr_before;
  CORV_CHECK_THROW(!folder_list.isArray(), kErrorBadArgument, JsonToString(folder_list));

  // Every element is checked and applied in memory first: a refusal at any
  // of them leaves the file, the services, the index and the daemon alone.
  std::set<std::string> touched_shares;
  std::vector<std::shared_ptr<Folder>> reindex_list;
  for (const Json::Value& element : folder_list) {
    const std::shared_ptr<Folder> folder_new = std::make_shared<Folder>(element);
    CORV_CHECK_THROW_TEXT(!updater_mode && !CanPathBeIndexed(folder_new->GetPath()),
                          "!CanPathBeIndexed(folder_new->GetPath()) && !updater_mode", kErrorPathCannotIndex,
                          "Path cannot index: " + folder_new->GetPath());
    const sdk::SDKShare share(folder_new->GetShare());
    CORV_CHECK_THROW(!share.IsSpaceEnough(), kErrorNoSpace,
                     "Share (" + folder_new->GetShare() + ") space not enough");
    touched_shares.insert(folder_new->GetShare());
    CORV_CHECK_THROW(create && folder_mgr.HasFolder(folder_new->GetPath()), kErrorDuplicatedId,
                     "Duplicated ID: " + folder_new->GetPath());

    std::shared_ptr<Folder> folder_reindex;
    folder_mgr.Upsert(folder_reindex, folder_new);
    if (create) {
      // Everything in a new folder is indexed, whatever governed it before.
      folder_reindex = std::make_shared<Folder>(folder_new->GetPath(), folder_new->GetName(), true, true, true,
                                                true, false, false);
    }
    reindex_list.push_back(folder_reindex);
  }

  // The shares first, so that switching Spotlight on makes samba read
  // them with the same reload.
  UpdateSpotlightShares(folder_mgr);
  SetupRelatedServices(true);
  for (const std::string& share_name : touched_shares) {
    if (create && !folder_mgr_before.IsShareIndexed(share_name)) elastic::ShareIndexCreate(share_name);
    UpsertCORVNotifydCfg(share_name, folder_mgr);
  }
  folder_mgr.Save();
  for (const std::string& share_name : touched_shares) SendSettingChanged(share_name, true);
  if (updater_mode) return;
  for (const std::shared_ptr<Folder>& folder : reindex_list) {
    AddCustomEvent(kEventUpdateCfg, folder->GetFullPath(), "", folder->GetIndexCfg());
  }
}

}  // namespace fileindex
}  // namespace corvlumex
