#include "programs/fileindexd/daemon.h"

#include <sys/stat.h>
#include <time.h>

#include <set>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json_util.h"
#include "common/log.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindexd {
namespace {

std::string ShareName(const Json::Value& data) {
  std::string share;
  GetJsonValue(share, data, "share_name", true);
  CORV_CHECK_THROW(share.empty(), kErrorBadArgument, "\"share_name\" must not be empty");
  return share;
}

// Size of a file, -1 when it does not exist.
long long FileSize(const std::string& path) {
  struct stat st;
  if (stat(path.c_str(), &st) != 0) {
    errno = 0;
    return -1;
  }
  return static_cast<long long>(st.st_size);
}

}  // namespace

Daemon::Daemon(WorkerOptions options) : options_(options) {}

Daemon::~Daemon() { Stop(); }

void Daemon::Start() {
  try {
    pause_.Set(fileindex::StatusMgr().GetPauseInfo());
  } catch (const Error& error) {
    CORV_LOG("cannot read the pause state, running: %s", error.reason.c_str());
  }
  std::set<std::string> shares;
  try {
    shares = fileindex::FolderMgr().GetIndexedShares();
  } catch (const Error& error) {
    CORV_LOG("cannot read the indexed folders: %s", error.reason.c_str());
  }
  for (const std::string& share : shares) Sync(share);
}

void Daemon::Stop() {
  std::map<std::string, std::unique_ptr<ShareWorker>> workers;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    workers.swap(workers_);
  }
  workers.clear();  // each destructor stops and joins its thread
}

void Daemon::Sync(const std::string& share) {
  bool wanted = false;
  try {
    wanted = fileindex::FolderMgr().IsShareIndexed(share) &&
             (fileindex::StatusMgr().GetShareStatus(share) & fileindex::kShareStatusPauseMask) == 0;
  } catch (const Error& error) {
    CORV_LOG("cannot tell whether share %s is indexed: %s", share.c_str(), error.reason.c_str());
    return;
  }
  if (!wanted) {
    StopWorker(share);
    return;
  }
  std::lock_guard<std::mutex> lock(mutex_);
  auto it = workers_.find(share);
  if (it != workers_.end() && !it->second->Finished()) {
    it->second->Wake();
    return;
  }
  if (it != workers_.end()) workers_.erase(it);  // ended on a full volume: a fresh start
  try {
    auto worker = std::make_unique<ShareWorker>(share, options_, pause_, progress_);
    worker->Start();
    workers_[share] = std::move(worker);
    CORV_LOG("worker of share %s started", share.c_str());
  } catch (const Error& error) {
    CORV_LOG("cannot start a worker for share %s: %s", share.c_str(), error.reason.c_str());
  }
}

void Daemon::StopWorker(const std::string& share) {
  std::unique_ptr<ShareWorker> worker;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    auto it = workers_.find(share);
    if (it == workers_.end()) return;
    worker = std::move(it->second);
    workers_.erase(it);
  }
  worker->Stop();
  progress_.Remove(share);
  CORV_LOG("worker of share %s stopped", share.c_str());
}

void Daemon::WakeAll() {
  std::lock_guard<std::mutex> lock(mutex_);
  for (auto& [share, worker] : workers_) worker->Wake();
}

Json::Value Daemon::Handle(const std::string& type, const Json::Value& data) {
  if (type == "notify_setting_changed" || type == "worker_create") {
    Sync(ShareName(data));
    return Json::Value(Json::objectValue);
  }
  if (type == "worker_delete") {
    StopWorker(ShareName(data));
    return Json::Value(Json::objectValue);
  }
  if (type == "pause") {
    long long resume_time = 0;
    GetJsonValue(resume_time, data, "resume_time", true);
    pause_.Set(resume_time);
    WakeAll();
    return Json::Value(Json::objectValue);
  }
  if (type == "resume") {
    pause_.Set(-1);
    WakeAll();
    return Json::Value(Json::objectValue);
  }
  if (type == "status") return Status();
  throw Error(kErrorBadArgument, "Unknown command: " + type);
}

Json::Value Daemon::Status() {
  Json::Value out(Json::objectValue);
  const long long resume_time = pause_.Get();
  out["resume_time"] = static_cast<Json::Int64>(resume_time);
  out["paused"] = pause_.IsPaused(static_cast<long long>(time(nullptr)));
  Json::Value shares = progress_.Snapshot();
  for (const std::string& name : shares.getMemberNames()) {
    // What waits in the queue beyond the batch being worked on.
    try {
      const std::string queue = sdk::SDKShare(name).GetQueuePath();
      const long long live = FileSize(queue);
      shares[name]["queued_bytes"] = static_cast<Json::Int64>(live < 0 ? 0 : live);
      shares[name]["batch_pending"] = FileSize(queue + ".tmp") >= 0;
    } catch (const Error&) {
      shares[name]["queued_bytes"] = 0;
      shares[name]["batch_pending"] = false;
    }
  }
  out["shares"] = shares;
  return out;
}

}  // namespace fileindexd
}  // namespace corvlumex
