// The indexing daemon's state: the global pause, one worker per indexed
// share that is not paused, and the answers to the command channel.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "programs/fileindexd/pause_state.h"
#include "programs/fileindexd/progress.h"
#include "programs/fileindexd/share_worker.h"

namespace corvlumex {
namespace fileindexd {

class Daemon {
 public:
  explicit Daemon(WorkerOptions options);
  ~Daemon();

  // Reads the pause state and starts a worker for every indexed share that
  // is not paused.
  void Start();
  // Stops every worker (each finishes the file it is working on; what it
  // did not commit is done again at the next start).
  void Stop();

  // Runs one command; the result is the answer's "data". Throws Error (120
  // for a bad argument or an unknown command).
  Json::Value Handle(const std::string& type, const Json::Value& data);
  // Commands that only read, which any local user may send.
  static bool IsReadOnly(const std::string& type) { return type == "status"; }

 private:
  // Starts or stops the share's worker as the folder and status files say.
  void Sync(const std::string& share);
  void StopWorker(const std::string& share);
  void WakeAll();
  Json::Value Status();

  WorkerOptions options_;
  PauseState pause_;
  ProgressBoard progress_;
  std::mutex mutex_;
  std::map<std::string, std::unique_ptr<ShareWorker>> workers_;
};

}  // namespace fileindexd
}  // namespace corvlumex
