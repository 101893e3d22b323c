#include "programs/frontend/status_report.h"

#include <filesystem>

#include "common/error.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/queue/queue_mgr.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "platform/linux/notifier_presence.h"
#include "programs/frontend/daemon_client.h"
#include "programs/frontend/search_request.h"
#include "sdk/share.h"

namespace corvlumex {
namespace frontend {

namespace {

namespace fs = std::filesystem;

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

// Bytes of the files below the share's index folder; null when it cannot
// be read.
Json::Value IndexBytes(const std::string& share) {
  std::string dir;
  try {
    dir = sdk::SDKShare(share).GetDBPath();
  } catch (const Error&) {
    return Json::Value();
  }
  std::error_code error;
  long long total = 0;
  for (fs::recursive_directory_iterator it(dir, error), end; !error && it != end; it.increment(error)) {
    std::error_code size_error;
    if (it->is_regular_file(size_error)) {
      const auto size = it->file_size(size_error);
      if (!size_error) total += static_cast<long long>(size);
    }
  }
  return error ? Json::Value() : Json::Value(static_cast<Json::Int64>(total));
}

// Documents in the share's index, as a search counts them; null when the
// search daemon cannot say.
Json::Value DocumentCount(const std::string& share) {
  SearchParams count;
  count.shares = {share};
  count.size = 0;
  try {
    Json::Value answer;
    fileindex::elastic::SendRequestWithPatience(answer, SearchRequest(count), std::chrono::seconds(2));
    return answer["data"]["total"];
  } catch (const Error&) {
    return Json::Value();
  }
}

// {"running"} and, for a daemon that is down, the "problem" in words and
// the command that "start"s it.
Json::Value DaemonEntry(Daemon daemon, bool running) {
  Json::Value entry(Json::objectValue);
  entry["running"] = running;
  if (!running) {
    entry["problem"] = NotRunningText(daemon);
    entry["start"] = StartCommand(daemon);
  }
  return entry;
}

}  // namespace

Json::Value StatusReport() {
  const fileindex::StatusMgr status;
  Json::Value out(Json::objectValue);
  out["resume_time"] = static_cast<Json::Int64>(status.GetPauseInfo());

  const platform::NotifierState notifier = platform::ProbeNotifier(platform::NotifierConfigDir());
  out["notifier"] = NotifierText(notifier);
  Json::Value& daemons = out["daemons"];
  daemons[DaemonName(Daemon::kSearch)] = DaemonEntry(Daemon::kSearch, DaemonRunning(Daemon::kSearch));
  daemons[DaemonName(Daemon::kNotifier)] =
      DaemonEntry(Daemon::kNotifier, notifier != platform::NotifierState::kNotRunning);
  // Asked only when it runs: the library's client would wait for one that is starting.
  Json::Value& indexer = daemons[DaemonName(Daemon::kIndexer)];
  indexer = DaemonEntry(Daemon::kIndexer, DaemonRunning(Daemon::kIndexer));
  Json::Value daemon;
  if (indexer["running"].asBool()) {
    try {
      daemon = AskDaemon("status", Json::Value(Json::objectValue));
    } catch (const Error& error) {
      indexer["running"] = false;
      indexer["problem"] = "fileindexd does not answer: " + error.reason;
    }
  }
  const bool indexer_running = indexer["running"].asBool();
  out["daemon_running"] = indexer_running;
  if (!indexer_running) out["daemon_error"] = indexer["problem"];
  const bool search_running = daemons[DaemonName(Daemon::kSearch)]["running"].asBool();

  Json::Value shares(Json::objectValue);
  for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) {
    Json::Value entry = daemon["shares"][share].isObject() ? daemon["shares"][share] : Json::Value(Json::objectValue);
    entry["flags"] = status.GetShareStatus(share);
    if (!entry.isMember("state")) entry["state"] = indexer_running ? "no worker" : "-";
    entry["events_missed"] = EventsMissed(share);
    entry["documents"] = search_running ? DocumentCount(share) : Json::Value();
    entry["index_bytes"] = IndexBytes(share);
    shares[share] = entry;
  }
  out["shares"] = shares;
  return out;
}

}  // namespace frontend
}  // namespace corvlumex
