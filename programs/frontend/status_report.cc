#include "programs/frontend/status_report.h"

#include "common/error.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "platform/linux/notifier_presence.h"
#include "programs/frontend/daemon_client.h"
#include "sdk/share.h"

namespace corvlumex {
namespace frontend {

namespace {

const char* NotifierText(platform::NotifierState state) {
  switch (state) {
    case platform::NotifierState::kRunning: return "running";
    case platform::NotifierState::kNotRunning: return "not running";
    case platform::NotifierState::kUnknown: break;
  }
  return "unknown";
}

// Whether the share's queue holds a crash marker: its events were lost (the
// notifier was not running, or could not keep up), so the whole share is
// checked against the disk. Null when the queue cannot be read.
Json::Value EventsMissed(const std::string& share) {
  try {
    return fileindex::QueueMgr(sdk::SDKShare(share).GetQueuePath()).HasLostEvents();
  } catch (const Error&) {
    return Json::Value();
  }
}

}  // namespace

Json::Value StatusReport() {
  const fileindex::StatusMgr status;
  const fileindex::FolderMgr folders;
  Json::Value daemon;
  std::string daemon_error;
  try {
    daemon = AskDaemon("status", Json::Value(Json::objectValue));
  } catch (const Error& error) {
    daemon_error = error.reason;
  }
  Json::Value out(Json::objectValue);
  out["resume_time"] = static_cast<Json::Int64>(status.GetPauseInfo());
  out["daemon_running"] = daemon_error.empty();
  if (!daemon_error.empty()) out["daemon_error"] = daemon_error;
  out["notifier"] = NotifierText(platform::ProbeNotifier(platform::NotifierConfigDir()));
  Json::Value shares(Json::objectValue);
  for (const std::string& share : folders.GetIndexedShares()) {
    Json::Value entry = daemon["shares"][share].isObject() ? daemon["shares"][share] : Json::Value(Json::objectValue);
    entry["flags"] = status.GetShareStatus(share);
    if (!entry.isMember("state")) entry["state"] = daemon_error.empty() ? "no worker" : "-";
    entry["events_missed"] = EventsMissed(share);
    shares[share] = entry;
  }
  out["shares"] = shares;
  return out;
}

}  // namespace frontend
}  // namespace corvlumex
