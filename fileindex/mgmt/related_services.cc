#include "fileindex/mgmt/related_services.h"

#include <json/json.h>

#include <set>
#include <vector>

#include "common/log.h"
#include "fileindex/state/communication.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "platform/platform.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {

void PrepareServices() {
  const FolderMgr folder_mgr;
  // The share list is written while Spotlight is still off (or once it is
  // off): samba re-reads its configuration once.
  const bool enable = !folder_mgr.Folders().empty();
  if (enable) UpdateSpotlightShares(folder_mgr);
  SetupRelatedServices(enable);
  if (!enable) UpdateSpotlightShares(folder_mgr);
}

void UpdateSpotlightShares(const FolderMgr& folder_mgr) {
  const std::shared_ptr<platform::Platform> platform = platform::Current();
  const std::set<std::string> indexed = folder_mgr.GetIndexedShares();
  const int changed = platform->SMBSetSpotlightShares(std::vector<std::string>(indexed.begin(), indexed.end()));
  if (changed < 0) {
    CORV_LOG_PLATFORM_ERROR("CORVSMBSetSpotlightShares failed");
  } else if (changed > 0 && platform->SMBIsEnableSpotlight() > 0 && 0 > platform->ServiceRestart(kSambaService)) {
    CORV_LOG_PLATFORM_ERROR("KLIBServiceRestart failed");
  }
}

void SetupRelatedServices(bool enable) {
  const std::shared_ptr<platform::Platform> platform = platform::Current();
  // Spotlight follows whether anything is indexed; samba re-reads its
  // configuration after a change (the platform reloads it, never dropping
  // connected clients), and only then.
  const int spotlight = platform->SMBIsEnableSpotlight();
  if (enable ? spotlight == 0 : spotlight > 0) {
    if (0 > platform->SMBSetSpotlight(enable)) {
      CORV_LOG_PLATFORM_ERROR("CORVSMBSetSpotlight failed");
    } else if (0 > platform->ServiceRestart(kSambaService)) {
      CORV_LOG_PLATFORM_ERROR("KLIBServiceRestart failed");
    }
  }
  if (enable) {
    if (0 > platform->ServiceStart(kContentExtractService, true)) {
      CORV_LOG_FAILED("0 > KLIBServiceStart(\"corvcontentextractd\", TRUE)");
    }
    if (0 > platform->ServicectlStart(kFileIndexDaemonJob, platform::kServicectlUpstart)) {
      CORV_LOG_FAILED("0 > KLIBServicectlStart(\"pkg-CorvLumex-fileindexd\", KLIB_SERVICECTL_UPSTART)");
    }
  } else {
    if (0 > platform->ServiceStop(kContentExtractService, false)) {
      CORV_LOG_FAILED("0 > KLIBServiceStop(\"corvcontentextractd\", FALSE)");
    }
    if (0 > platform->ServicectlStop(kFileIndexDaemonJob, platform::kServicectlUpstart)) {
      CORV_LOG_FAILED("0 > KLIBServicectlStop(\"pkg-CorvLumex-fileindexd\", KLIB_SERVICECTL_UPSTART)");
    }
  }
}

void UpsertCORVNotifydCfg(const std::string& share_name, const FolderMgr& folder_mgr) {
  const sdk::SDKShare share(share_name);
  Json::Value ignore(Json::arrayValue);
  ignore.append(kMonitorIgnore);

  // "config" stays null for a share without folders: the notifier then
  // keeps the queue but watches nothing.
  Json::Value config;
  Json::Value entry(Json::objectValue);
  for (const std::shared_ptr<Folder>& folder : folder_mgr.Folders()) {
    if (folder->GetShare() != share_name) continue;
    entry["path"] = folder->GetFullPath();
    entry["mask"] = kMonitorMask;
    entry["ignore"] = ignore;
    config.append(entry);
  }
  Json::Value monitor_queue(Json::objectValue);
  monitor_queue["queue"] = share.GetQueuePath();
  monitor_queue["config"] = config;
  CORV_CHECK_THROW_TEXT(
      !platform::Current()->MonitorQueueUpsert(monitor_queue, kAppName, platform::kMonitorQueueTypeApplication),
      "!MonitorQueue::Upsert(monitor_queue, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)", kErrorSystem,
      "MonitorQueue::Upsert failed, share=" + share_name);
}

void DeleteCORVNotifydCfg(const std::string& share_name) {
  const sdk::SDKShare share(share_name);
  CORV_CHECK_THROW_TEXT(
      !platform::Current()->MonitorQueueDelete(share.GetQueuePath(), kAppName, platform::kMonitorQueueTypeApplication),
      "!MonitorQueue::Delete(share.GetQueuePath(), kAppName, MONITOR_QUEUE_TYPE_APPLICATION)", kErrorSystem,
      "MonitorQueue::Delete failed, share=" + share_name);
}

void DeleteCORVNotifydCfgByQueue(const std::string& queue_path, const std::string& share_name) {
  CORV_CHECK_THROW_TEXT(
      !platform::Current()->MonitorQueueDelete(queue_path, kAppName, platform::kMonitorQueueTypeApplication),
      "!MonitorQueue::Delete(queue_path, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)", kErrorSystem,
      "MonitorQueue::Delete failed, share=" + share_name);
}

void CleanShareIndexData(const std::string& share_name, const std::string& share_path) {
  const std::shared_ptr<platform::Platform> platform = platform::Current();
  char path[platform::kPathBufferSize] = {};
  CORV_CHECK_THROW_TEXT(0 > platform->QueuePathCompose(share_path.c_str(), path, sizeof(path)),
                        "0 > FILEIDXQueuePathCompose(share_path.c_str(), path, sizeof(path))", kErrorSystem,
                        "FILEIDXQueuePathCompose failed, share_path=" + share_path);
  const std::string queue_path = path;
  // The queue and the queue manager's taken-over copy; whatever they held
  // is about an index that is going away.
  platform->Exec("/bin/rm", {"-rf", queue_path}, platform::kExecDefault);
  platform->Exec("/bin/rm", {"-rf", queue_path + ".tmp"}, platform::kExecDefault);

  CORV_CHECK_THROW_TEXT(0 > platform->DBPathCompose(share_path.c_str(), path, sizeof(path)),
                        "0 > FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path))", kErrorSystem,
                        "FILEIDXDBPathCompose failed, share_path=" + share_path);
  platform->Exec("/bin/rm", {"-rf", std::string(path)}, platform::kExecDefault);

  StatusMgr status_mgr;
  status_mgr.ClearShareStatus(share_name);
}

void SendSettingChanged(const std::string& share_name, bool is_upsert) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share_name;
  data["is_upsert"] = is_upsert;
  SendCommandToDaemon("notify_setting_changed", data);
}

}  // namespace fileindex
}  // namespace corvlumex
