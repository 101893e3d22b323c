#include "programs/frontend/status_report.h"

#include "common/error.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/frontend/daemon_client.h"

namespace corvlumex {
namespace frontend {

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
  Json::Value shares(Json::objectValue);
  for (const std::string& share : folders.GetIndexedShares()) {
    Json::Value entry = daemon["shares"][share].isObject() ? daemon["shares"][share] : Json::Value(Json::objectValue);
    entry["flags"] = status.GetShareStatus(share);
    if (!entry.isMember("state")) entry["state"] = daemon_error.empty() ? "no worker" : "-";
    shares[share] = entry;
  }
  out["shares"] = shares;
  return out;
}

}  // namespace frontend
}  // namespace corvlumex
