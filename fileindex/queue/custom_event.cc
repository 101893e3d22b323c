#include "fileindex/queue/custom_event.h"

#include <memory>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/sys.h"
#include "fileindex/paths/path_rules.h"
#include "fileindex/queue/queue_mgr.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/status_mgr.h"
#include "platform/platform.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {
namespace {

// Wait for the tool, no terminal, no inherited descriptors, own session:
// a notice must never hold up or disturb the caller.
constexpr int kNotifyExecFlags = 0xBB;

int RunNotifier(const std::vector<std::string>& args) { return RunAdminNotifier(args, true); }

}  // namespace

int RunAdminNotifier(const std::vector<std::string>& args, bool wait) {
  // A notice is best effort: its failure shows only in the result.
  const int flags = wait ? kNotifyExecFlags : kNotifyExecFlags & ~platform::kExecWait;
  try {
    return platform::Current()->Exec(SysPath(kVXMNotifyPath), args, flags);
  } catch (const std::exception& error) {
    CORV_LOG_FN("notification tool failed, reason=%s", error.what());
    return -1;
  }
}

void AddCustomEvent(int event, const std::string& full_path, const std::string& path_old, const Json::Value& data) {
  std::string share_name;
  std::unique_ptr<QueueMgr> queue;
  try {
    std::string share_path;
    GetShareNamePathByFullPath(share_name, share_path, full_path);
    const sdk::SDKShare share(share_name);
    queue = std::make_unique<QueueMgr>(share.GetQueuePath());
    // A pending reindex of the path or an ancestor will see the path anyway.
    if (queue->IsFullPathHasReindex(full_path)) return;
  } catch (const Error& error) {
    CORV_LOG_FN("AddCustomEvent failed, code=%d, reason=%s. Set [%s] need reindex", static_cast<int>(error.code),
                error.reason.c_str(), share_name.c_str());
    // The event is lost: rebuilding the share's index is what recovers it.
    StatusMgr().SetShareStatus(share_name, kShareStatusNeedReindex);
    throw error;
  }
  Json::Value line(Json::objectValue);
  line["event"] = event;
  line["path"] = full_path;
  line["path_old"] = path_old;
  line["data"] = data;
  AppendQueueLine(queue->GetQueuePath(), JsonToString(line));
}

int SendVXMNotify() {
  return RunNotifier({"-c", "CORV.Lumex.Application", "-b", "true", "-e", "false", "@administrators",
                      "app:displayname", "error:index_no_space",
                      "<a data-corv-app=\"CORV.Lumex.Application\" data-corv-fn=\"preference\">", "</a>"});
}

int NotifyLackOfMemory() {
  return RunNotifier({"-c", "CORV.Lumex.Application", "@administrators", "app:displayname", "error:lack_of_memory"});
}

}  // namespace fileindex
}  // namespace corvlumex
