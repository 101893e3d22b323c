// fileindex status: whether indexing is paused, whether each daemon runs
// (and how to start one that does not), and per indexed share what the
// index holds, its size on disk, the files that could not be indexed and
// what the indexer is doing now. Exits non-zero while a daemon is down.
#include <json/json.h>
#include <time.h>

#include <iostream>

#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "programs/fileindex/commands.h"
#include "programs/frontend/status_report.h"

namespace corvlumex {
namespace cli {
namespace {

// How indexing as a whole stands, in words that cannot be read as "busy".
std::string PauseText(long long resume_time) {
  if (resume_time == 0) return "paused until resumed (fileindex resume)";
  if (resume_time > 0 && resume_time > static_cast<long long>(time(nullptr))) {
    return "paused until " + HumanTime(resume_time) + " (fileindex resume ends it sooner)";
  }
  return "on (not paused)";
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

std::string Count(const Json::Value& value) { return value.isNull() ? "?" : std::to_string(value.asInt64()); }

void PrintStatus(const Json::Value& out) {
  std::cout << "indexing: " << out["indexing"].asString() << "\n";
  for (const std::string& name : out["daemons"].getMemberNames()) {
    const Json::Value& daemon = out["daemons"][name];
    const bool notifier = name == "corvnotifyd";
    std::cout << name << ": ";
    if (notifier && out["notifier"].asString() == "unknown") {
      std::cout << "unknown (its configuration folder cannot be read)\n";
    } else if (daemon["running"].asBool()) {
      std::cout << "running\n";
    } else if (daemon.isMember("start")) {
      std::cout << "NOT RUNNING (start it with " << daemon["start"].asString() << ")"
                << (notifier ? ": changes on disk are not seen now; when it starts again, every indexed share is "
                               "checked against the disk"
                             : "")
                << "\n";
    } else {
      std::cout << daemon["problem"].asString() << "\n";
    }
  }
  const Json::Value& shares = out["shares"];
  if (shares.empty()) {
    std::cout << "no folder is indexed (fileindex folder add FOLDER)\n";
    return;
  }
  std::vector<std::vector<std::string>> rows;
  for (const std::string& share : shares.getMemberNames()) {
    const Json::Value& entry = shares[share];
    rows.push_back({share, Count(entry["documents"]),
                    entry["index_bytes"].isNull() ? "?" : HumanSize(entry["index_bytes"].asInt64()),
                    entry.isMember("total_failed") ? std::to_string(entry["total_failed"].asUInt64()) : "?",
                    entry["activity"].asString(), ShareFlags(entry["flags"].asUInt())});
  }
  std::cout << "\n";
  PrintTable({"SHARE", "DOCUMENTS", "INDEX SIZE", "NOT INDEXED", "NOW", "FLAGS"}, rows);
  std::cout << "(NOT INDEXED: files that could not be indexed since fileindexd started; the fileindexd log names each)\n";
  for (const std::string& share : shares.getMemberNames()) {
    const Json::Value& entry = shares[share];
    if (!entry["events_missed"].asBool()) continue;
    std::cout << share << ": " << (entry["state"].asString() == "indexing" ? "being checked" : "waiting to be checked")
              << " against the disk: changes may have been missed while the change notifier was not running "
                 "(or could not keep up)\n";
  }
}

// Returns the exit condition: false when a daemon is down.
bool Status(const Output& output) {
  Json::Value out = frontend::StatusReport();
  out["indexing"] = PauseText(out["resume_time"].asInt64());
  const bool indexer_running = out["daemon_running"].asBool();
  for (const std::string& share : out["shares"].getMemberNames()) {
    Json::Value& entry = out["shares"][share];
    entry["activity"] = ActivityText(entry, entry["flags"].asUInt(), indexer_running);
  }
  if (output.json) PrintJson(out);
  else PrintStatus(out);
  bool all_running = true;
  for (const Json::Value& daemon : out["daemons"]) all_running = all_running && daemon["running"].asBool();
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
