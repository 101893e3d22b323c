// fileindex status: whether indexing is paused, whether each daemon runs
// (and how to start one that does not), and per indexed share what the
// index holds, its size on disk, the files that could not be indexed and
// what the indexer is doing now. Exits non-zero while a daemon is down.
#include <json/json.h>
#include <time.h>

#include <filesystem>
#include <iostream>

#include "common/error.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindex/commands.h"
#include "programs/fileindex/daemon_client.h"
#include "sdk/share.h"

namespace corvlumex {
namespace cli {
namespace {

namespace fs = std::filesystem;

// How indexing as a whole stands, in words that cannot be read as "busy".
std::string PauseText(long long resume_time) {
  if (resume_time == 0) return "paused until resumed (fileindex resume)";
  if (resume_time > 0 && resume_time > static_cast<long long>(time(nullptr))) {
    return "paused until " + HumanTime(resume_time) + " (fileindex resume ends it sooner)";
  }
  return "on (not paused)";
}

// Bytes of the files below `dir`; -1 when it cannot be read.
long long DiskUse(const std::string& dir) {
  std::error_code error;
  long long total = 0;
  for (fs::recursive_directory_iterator it(dir, error), end; !error && it != end; it.increment(error)) {
    std::error_code size_error;
    if (it->is_regular_file(size_error)) {
      const auto size = it->file_size(size_error);
      if (!size_error) total += static_cast<long long>(size);
    }
  }
  return error ? -1 : total;
}

// Documents in the share's index, as a search counts them; -1 when the
// search daemon cannot say.
long long DocumentCount(const std::string& share) {
  Json::Value request(Json::objectValue);
  request["command"] = "search";
  request["data"]["ids"].append(fileindex::elastic::GetFileIndexID(share));
  request["data"]["query"]["qsl"]["match_all"] = Json::Value(Json::objectValue);
  request["data"]["size"] = 0;
  request["data"]["track_total"] = true;
  try {
    Json::Value answer;
    fileindex::elastic::SendRequestWithRetry(answer, request);
    return answer["data"]["total"].asInt64();
  } catch (const Error&) {
    return -1;
  }
}

// What the share's worker is doing, from fileindexd's "state".
std::string ActivityText(const Json::Value& entry, unsigned int flags, bool indexer_running) {
  if (!indexer_running) return "nothing (fileindexd is not running)";
  const std::string state = entry["state"].asString();
  const std::string detail = entry["detail"].asString();
  if (state == "idle") return "up to date, watching for changes";
  if (state == "indexing") {
    const double eta = entry["eta_seconds"].asDouble();
    return "indexing " + std::to_string(entry["done"].asUInt64()) + "/" + std::to_string(entry["todo"].asUInt64()) +
           " files" + (eta < 0 ? "" : ", " + HumanDuration(eta) + " left");
  }
  if (state == "paused") return "paused (fileindex resume)";
  if (state == "retrying") return "waiting for corvelasticd, retrying" + (detail.empty() ? "" : " (" + detail + ")");
  if (state == "no_space") return "stopped: the volume is full" + (detail.empty() ? "" : " (" + detail + ")");
  if (state == "stopped") return "stopped";
  if (flags & fileindex::kShareStatusPauseMask) return "paused: " + ShareFlags(flags);
  return state.empty() ? "not indexing (no worker)" : state;
}

Json::Value ShareEntry(const std::string& share, const Json::Value& daemon_entry, unsigned int flags,
                       bool indexer_running, bool search_running) {
  Json::Value entry = daemon_entry.isObject() ? daemon_entry : Json::Value(Json::objectValue);
  if (!entry.isMember("state")) entry["state"] = indexer_running ? "no worker" : "-";
  entry["flags"] = flags;
  entry["documents"] = static_cast<Json::Int64>(search_running ? DocumentCount(share) : -1);
  long long size = -1;
  try {
    size = DiskUse(sdk::SDKShare(share).GetDBPath());
  } catch (const Error&) {
  }
  entry["index_bytes"] = static_cast<Json::Int64>(size);
  entry["activity"] = ActivityText(entry, flags, indexer_running);
  return entry;
}

std::string Count(const Json::Value& value) { return value.asInt64() < 0 ? "?" : std::to_string(value.asInt64()); }

void PrintStatus(const Json::Value& out) {
  std::cout << "indexing: " << out["indexing"].asString() << "\n";
  for (const std::string& name : out["daemons"].getMemberNames()) {
    const Json::Value& daemon = out["daemons"][name];
    std::cout << name << ": ";
    if (daemon["running"].asBool()) std::cout << "running\n";
    else if (daemon.isMember("start")) std::cout << "NOT RUNNING (start it with " << daemon["start"].asString() << ")\n";
    else std::cout << daemon["problem"].asString() << "\n";
  }
  const Json::Value& shares = out["shares"];
  if (shares.empty()) {
    std::cout << "no folder is indexed (fileindex folder add FOLDER)\n";
    return;
  }
  std::vector<std::vector<std::string>> rows;
  for (const std::string& share : shares.getMemberNames()) {
    const Json::Value& entry = shares[share];
    rows.push_back({share, Count(entry["documents"]), HumanSize(entry["index_bytes"].asInt64()),
                    entry.isMember("total_failed") ? std::to_string(entry["total_failed"].asUInt64()) : "?",
                    entry["activity"].asString(), ShareFlags(entry["flags"].asUInt())});
  }
  std::cout << "\n";
  PrintTable({"SHARE", "DOCUMENTS", "INDEX SIZE", "NOT INDEXED", "NOW", "FLAGS"}, rows);
  std::cout << "(NOT INDEXED: files that could not be indexed since fileindexd started; the fileindexd log names each)\n";
}

// Returns the exit condition: false when a daemon is down.
bool Status(const Output& output) {
  const fileindex::StatusMgr status;
  Json::Value out(Json::objectValue);
  out["resume_time"] = static_cast<Json::Int64>(status.GetPauseInfo());
  out["indexing"] = PauseText(status.GetPauseInfo());
  bool all_running = true;
  for (Daemon daemon : {Daemon::kSearch, Daemon::kNotifier, Daemon::kIndexer}) {
    Json::Value entry(Json::objectValue);
    entry["running"] = DaemonRunning(daemon);
    if (!entry["running"].asBool()) {
      entry["problem"] = NotRunningText(daemon);
      entry["start"] = StartCommand(daemon);
      all_running = false;
    }
    out["daemons"][DaemonName(daemon)] = entry;
  }
  Json::Value daemon;
  bool indexer_running = out["daemons"]["fileindexd"]["running"].asBool();
  if (indexer_running) {
    try {
      daemon = AskDaemon("status", Json::Value(Json::objectValue));
    } catch (const Error& error) {
      indexer_running = false;
      all_running = false;
      out["daemons"]["fileindexd"]["running"] = false;
      out["daemons"]["fileindexd"]["problem"] = "fileindexd does not answer: " + error.reason;
    }
  }
  out["daemon_running"] = indexer_running;  // kept for scripts written against earlier versions
  const bool search_running = out["daemons"]["corvelasticd"]["running"].asBool();
  out["shares"] = Json::Value(Json::objectValue);
  for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) {
    out["shares"][share] =
        ShareEntry(share, daemon["shares"][share], status.GetShareStatus(share), indexer_running, search_running);
  }
  if (output.json) PrintJson(out);
  else PrintStatus(out);
  return all_running;
}

}  // namespace

void AddStatusCommand(CLI::App& app, Output& output) {
  app.add_subcommand("status", "whether indexing runs, the daemons, and each share's index and progress")
      ->callback([&output] {
        if (Status(output)) return;
        // What is down and how to start it is in the report itself.
        std::cerr << "fileindex: a daemon is not running (the status above says how to start it)" << std::endl;
        throw CLI::RuntimeError(1);
      });
}

}  // namespace cli
}  // namespace corvlumex
