#include "fileindex/mgmt/mgmt_util.h"

#include <algorithm>

#include "common/json_util.h"
#include "common/log.h"
#include "common/sys.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/queue/custom_event.h"
#include "fileindex/queue/event.h"
#include "fileindex/state/communication.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "platform/platform.h"

namespace corvlumex {
namespace fileindex {

FolderLock::FolderLock() : lock_(SysPath(kFileIndexFoldersLockPath), true) {}

std::vector<std::string> RequestPaths(const Json::Value& path_list) {
  std::vector<std::string> paths;
  for (const Json::Value& element : path_list) {
    std::string path;
    if (element.isObject()) {
      GetJsonValue(path, element, "path", true);
    } else {
      CORV_CHECK_THROW(!element.isString(), kErrorBadArgument, "Not a path: " + JsonToString(element));
      path = element.asString();
    }
    CORV_CHECK_THROW(path.empty(), kErrorBadArgument, "Empty path in " + JsonToString(path_list));
    if (std::find(paths.begin(), paths.end(), path) == paths.end()) paths.push_back(path);
  }
  return paths;
}

std::vector<std::shared_ptr<Folder>> FoldersOfShare(const FolderMgr& folder_mgr, const std::string& share_name) {
  std::vector<std::shared_ptr<Folder>> folders;
  for (const std::shared_ptr<Folder>& folder : folder_mgr.Folders()) {
    if (folder->GetShare() == share_name) folders.push_back(folder);
  }
  return folders;
}

std::string ComposeQueuePath(const std::string& share_dir) {
  char path[platform::kPathBufferSize] = {};
  CORV_CHECK_THROW(0 > platform::Current()->QueuePathCompose(share_dir.c_str(), path, sizeof(path)), kErrorSystem,
                   "FILEIDXQueuePathCompose failed, share_path=" + share_dir);
  return path;
}

void QueueReindex(const std::string& full_path) {
  AddCustomEvent(kEventReindex, full_path, "", Json::Value());
}

void QueueFoldersReindex(const std::vector<std::shared_ptr<Folder>>& folders) {
  for (const std::shared_ptr<Folder>& folder : folders) QueueReindex(Folder(folder->GetData()).GetFullPath());
}

void IndexDelTree(const std::string& share_name, const std::string& full_path) {
  elastic::IndexDelDir(share_name, full_path);
  elastic::IndexDel(share_name, full_path);
}

void MarkNeedReindex(const std::string& share_name) {
  try {
    StatusMgr status_mgr;
    status_mgr.SetShareStatus(share_name, kShareStatusNeedReindex);
    CORV_LOG("Set [%s] need reindex", share_name.c_str());
  } catch (const Error& error) {
    CORV_LOG_FN("Cannot mark [%s] for reindex, code=%d, reason=%s", share_name.c_str(), error.code,
                error.reason.c_str());
  }
}

void SendWorkerCommand(const std::string& command, const std::string& share_name) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share_name;
  SendCommandToDaemon(command, data);
}

}  // namespace fileindex
}  // namespace corvlumex
