// The whole system in a sandbox root for end-to-end tests: a share "share"
// (on tmpfs when there is one), the real corvelasticd, corvnotifyd and
// fileindexd started as child processes on the sandbox's private sockets,
// the management operations called in-process, and the index read back the
// way a user sees it: through corvelasticd's "search" command; and the
// fileindex command line run as a user runs it.
#pragma once

#include <json/json.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "tests/support/child_process.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace testing_support {

class SystemSandbox {
 public:
  SystemSandbox();
  ~SystemSandbox();

  const std::string& root() const { return root_.path(); }
  const std::string& share_dir() const { return share_dir_; }  // the share "share"
  std::string Path(const std::string& relative) const { return share_dir_ + "/" + relative; }

  void InstallNoticeTool(const std::string& log_path) { root_.InstallNoticeTool(log_path); }
  // Starts the three daemons (fileindexd with `indexer_args`) and waits for
  // their sockets.
  void StartAll(const std::vector<std::string>& indexer_args = {},
                const std::map<std::string, std::string>& notifier_env = {});
  void StartIndexer(const std::vector<std::string>& args = {});
  // corvelasticd alone (after StopSearchDaemon), and its kill -9 (or another signal).
  void StartSearchDaemon();
  void StopSearchDaemon(int signal);
  // kill -9 (or another signal) of fileindexd.
  void StopIndexer(int signal);
  ChildProcess& indexer() { return *indexer_; }
  // corvnotifyd started again (with the environment StartAll gave it), and
  // stopped with a signal (SIGTERM, or SIGKILL).
  void StartNotifier();
  void StopNotifier(int signal);
  std::string Logs() const;

  // FolderAdd of /share/<relative> (relative may be empty: the whole share)
  // with every category, in-process as the management operations run it.
  void AddFolder(const std::string& relative);

  // Every document path of the share's index, as a search shows it.
  std::set<std::string> IndexedPaths() const;
  // Paths of a search of `words` in `field` ("_all", "CORVMDTextContent", ...).
  std::set<std::string> Search(const std::string& words, const std::string& field = "_all") const;
  // Paths whose `field` holds exactly `value` (a keyword field).
  std::set<std::string> SearchTerm(const std::string& field, const std::string& value) const;
  // Everything at or below /share/<relative> on disk, the hidden metadata
  // folder and what `exclude` says true for left out.
  std::set<std::string> DiskPaths(const std::string& relative,
                                  const std::function<bool(const std::string&)>& exclude = nullptr) const;

  // Polls until the index holds exactly `expected`; on a timeout the
  // differences are reported through the returned text (empty = converged).
  std::string Converge(const std::set<std::string>& expected,
                       std::chrono::milliseconds timeout = std::chrono::seconds(30)) const;

  // fileindexd's answer to "status", and the files it extracted and stored
  // since it started.
  std::string IndexerStatus() const;
  uint64_t Extracted() const;

 private:
  std::set<std::string> Query(const Json::Value& qsl) const;

  Sandbox root_;
  std::string share_dir_;
  // Started from the system's programs of the build folder.
  std::unique_ptr<ChildProcess> Launch(const std::string& program, const std::vector<std::string>& args,
                                       const std::map<std::string, std::string>& env = {}) const;

  std::unique_ptr<ChildProcess> search_daemon_;
  std::unique_ptr<ChildProcess> notifier_;
  std::unique_ptr<ChildProcess> indexer_;
  std::vector<std::string> indexer_args_;
  std::map<std::string, std::string> notifier_env_;
};

// Writes `content` to `path` (created or truncated).
void WriteText(const std::string& path, const std::string& content);

// What the fileindex command line of the build folder printed, and its exit status.
struct CliResult {
  int status = -1;
  std::string out;
  std::string err;
};
// `as_user` other than 0 runs it under that user id (and group "nogroup"),
// for what an unprivileged user sees; the caller must be root then.
CliResult RunCli(const std::vector<std::string>& args, unsigned as_user = 0);

}  // namespace testing_support
}  // namespace corvlumex
