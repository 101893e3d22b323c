#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <iostream>
#include <algorithm>
#include <set>

#include "common/error.h"
#include "common/sys.h"
#include "fileindex/index_mgr.h"
#include "fileindex/util.h"
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
  std::set<std::string> wanted(share_paths.begin(), share_paths.end());
  std::set<std::string> shares;
  for (const std::string& path : share_paths) {
    std::string share;
    fileindex::GetShareNameByPath(share, path);
    shares.insert(share);
  }
  const bool draw = !quiet && isatty(STDERR_FILENO);
  const auto start = std::chrono::steady_clock::now();
  std::string last_line;
  for (;;) {
    Json::Value list, additional(Json::arrayValue);
    additional.append("status");
    fileindex::FolderList(list, 0, 0, "", "", additional);
    size_t finished = 0;
    std::string problem;
    for (const Json::Value& folder : list["folder"]) {
      if (wanted.count(folder["path"].asString()) == 0) continue;
      const std::string text = folder["additional"]["status"]["text"].asString();
      if (text == "finished") ++finished;
      if (text == "error") problem = folder["path"].asString() + " cannot be indexed (" +
                                     folder["additional"]["status"]["desc"].asString() + ")";
      if (text == "paused") problem = "indexing is paused (fileindex resume)";
    }
    if (finished == wanted.size()) {
      if (draw) std::cerr << "\r" << std::string(last_line.size(), ' ') << "\r";
      if (!quiet) std::cerr << "indexed.\n";
      return true;
    }
    if (!problem.empty()) {
      if (draw) std::cerr << "\n";
      std::cerr << "fileindex: " << problem << "\n";
      return false;
    }
    // Progress of the shares' workers.
    unsigned long long done = 0, todo = 0;
    double eta = -1;
    std::string state = "waiting for fileindexd";
    try {
      const Json::Value status = frontend::AskDaemon("status", Json::Value(Json::objectValue));
      state = "queued";
      for (const std::string& share : shares) {
        const Json::Value& entry = status["shares"][share];
        if (!entry.isObject()) continue;
        done += entry["done"].asUInt64();
        todo += entry["todo"].asUInt64();
        eta = std::max(eta, entry["eta_seconds"].asDouble());
        if (entry["state"].asString() != "idle") state = entry["state"].asString();
      }
    } catch (const Error&) {
    }
    if (draw) {
      const double fraction = todo > 0 ? static_cast<double>(done) / static_cast<double>(todo) : 0.0;
      char line[160];
      snprintf(line, sizeof(line), "%s %3.0f%%  %llu/%llu files  %s  left %s", Bar(fraction, 30).c_str(),
               fraction * 100, done, todo, state.c_str(), eta < 0 ? "?" : HumanDuration(eta).c_str());
      std::string text = line;
      if (text.size() < last_line.size()) text += std::string(last_line.size() - text.size(), ' ');
      std::cerr << "\r" << text << std::flush;
      last_line = line;
    }
    const double waited = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    if (timeout_seconds > 0 && waited >= timeout_seconds) {
      if (draw) std::cerr << "\n";
      std::cerr << "fileindex: still indexing after " << HumanDuration(waited) << "\n";
      return false;
    }
    SleepFor(kPollInterval);
  }
}

}  // namespace cli
}  // namespace corvlumex
