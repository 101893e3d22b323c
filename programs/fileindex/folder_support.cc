#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <iostream>
#include <algorithm>
#include <set>

#include "common/error.h"
#include "common/sys.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/paths/path_rules.h"
#include "programs/fileindex/cli_output.h"
#include "programs/fileindex/folder_support.h"
#include "programs/frontend/daemon_client.h"

namespace corvlumex {
namespace cli {
namespace {

constexpr auto kPollInterval = std::chrono::milliseconds(200);

std::string Bar(double fraction, size_t width) {
  const size_t filled = static_cast<size_t>(fraction * width + 0.5);
  return "[" + std::string(std::min(filled, width), '#') + std::string(width - std::min(filled, width), '.') + "]";
}

// The progress of the shares' workers, summed.
struct Progress {
  unsigned long long done = 0, todo = 0;
  double eta = -1;
  std::string state = "waiting for fileindexd";
};

Progress WorkersProgress(const std::set<std::string>& shares) {
  Progress progress;
  try {
    const Json::Value status = frontend::AskDaemon("status", Json::Value(Json::objectValue));
    progress.state = "queued";
    for (const std::string& share : shares) {
      const Json::Value& entry = status["shares"][share];
      if (!entry.isObject()) continue;
      progress.done += entry["done"].asUInt64();
      progress.todo += entry["todo"].asUInt64();
      progress.eta = std::max(progress.eta, entry["eta_seconds"].asDouble());
      if (entry["state"].asString() != "idle") progress.state = entry["state"].asString();
    }
  } catch (const Error&) {
  }
  return progress;
}

// True when every wanted folder is finished; `problem` says why waiting is
// pointless (a folder in error, indexing paused).
bool AllFinished(const std::set<std::string>& wanted, std::string& problem) {
  Json::Value list, additional(Json::arrayValue);
  additional.append("status");
  fileindex::FolderList(list, 0, 0, "", "", additional);
  size_t finished = 0;
  for (const Json::Value& folder : list["folder"]) {
    if (wanted.count(folder["path"].asString()) == 0) continue;
    const std::string text = folder["additional"]["status"]["text"].asString();
    if (text == "finished") ++finished;
    if (text == "error") {
      problem = folder["path"].asString() + " cannot be indexed (" + folder["additional"]["status"]["desc"].asString() + ")";
    }
    if (text == "paused") problem = "indexing is paused (fileindex resume)";
  }
  return finished == wanted.size();
}

// One line on standard error, redrawn in place.
class ProgressLine {
 public:
  explicit ProgressLine(bool draw) : draw_(draw) {}
  void Draw(const Progress& progress) {
    if (!draw_) return;
    const double fraction = progress.todo > 0 ? static_cast<double>(progress.done) / static_cast<double>(progress.todo) : 0.0;
    char line[160];
    snprintf(line, sizeof(line), "%s %3.0f%%  %llu/%llu files  %s  left %s", Bar(fraction, 30).c_str(), fraction * 100,
             progress.done, progress.todo, progress.state.c_str(),
             progress.eta < 0 ? "?" : HumanDuration(progress.eta).c_str());
    std::string text = line;
    if (text.size() < last_.size()) text += std::string(last_.size() - text.size(), ' ');
    std::cerr << "\r" << text << std::flush;
    last_ = line;
  }
  // Removes the line (the wait succeeded).
  void Clear() {
    if (draw_) std::cerr << "\r" << std::string(last_.size(), ' ') << "\r";
  }
  // Keeps the line and moves below it (a message follows).
  void End() {
    if (draw_) std::cerr << "\n";
  }

 private:
  bool draw_;
  std::string last_;
};

}  // namespace

std::string ToSharePath(const std::string& path) {
  if (path.empty() || path[0] != '/') return path;  // the operation refuses it with its own message
  std::string share_name, share_dir;
  try {
    fileindex::GetShareNamePathByFullPath(share_name, share_dir, path);
  } catch (const Error&) {
    return path;  // not inside a share's directory: already a share path
  }
  return "/" + share_name + path.substr(share_dir.size());
}

bool WaitForIndexing(const std::vector<std::string>& share_paths, double timeout_seconds, bool quiet) {
  const std::set<std::string> wanted(share_paths.begin(), share_paths.end());
  std::set<std::string> shares;
  for (const std::string& path : share_paths) {
    std::string share;
    fileindex::GetShareNameByPath(share, path);
    shares.insert(share);
  }
  ProgressLine line(!quiet && isatty(STDERR_FILENO));
  const auto start = std::chrono::steady_clock::now();
  for (;;) {
    std::string problem;
    if (AllFinished(wanted, problem)) {
      line.Clear();
      if (!quiet) std::cerr << "indexed.\n";
      return true;
    }
    if (!problem.empty()) {
      line.End();
      std::cerr << "fileindex: " << problem << "\n";
      return false;
    }
    line.Draw(WorkersProgress(shares));
    const double waited = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    if (timeout_seconds > 0 && waited >= timeout_seconds) {
      line.End();
      std::cerr << "fileindex: still indexing after " << HumanDuration(waited) << "\n";
      return false;
    }
    SleepFor(kPollInterval);
  }
}

}  // namespace cli
}  // namespace corvlumex
