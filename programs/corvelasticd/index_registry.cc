#include "programs/corvelasticd/index_registry.h"

#include <sys/stat.h>

#include <chrono>

#include "common/file_util.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/sys.h"
#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/index_files.h"

namespace corvlumex {
namespace elasticd {

std::string IndexHandle::id() const {
  std::lock_guard<std::mutex> guard(state_mutex_);
  return id_;
}

std::string IndexHandle::path() const {
  std::lock_guard<std::mutex> guard(state_mutex_);
  return path_;
}

std::shared_ptr<IndexStore> IndexHandle::Store() const {
  std::lock_guard<std::mutex> guard(state_mutex_);
  switch (state_) {
    case State::kReady: return store_;
    case State::kOpening: throw DaemonError(kCodeOpening, "Index " + id_ + " is still opening");
    case State::kFailed: throw DaemonError(kCodeIndexFailed, "Index " + id_ + " could not be opened: " + failure_);
    case State::kGone: break;
  }
  throw DaemonError(kCodeIndexNotFound, "No index " + id_);
}

WriterTurn::WriterTurn(const std::shared_ptr<IndexHandle>& handle, bool takes_writes, int max_backlog) : handle_(handle) {
  if (takes_writes && handle_->paused_) throw DaemonError(kCodeBusy, "Index " + handle_->id() + " is paused");
  if (handle_->writers_waiting_.fetch_add(1) >= max_backlog) {
    handle_->writers_waiting_.fetch_sub(1);
    throw DaemonError(kCodeBusy, "Index " + handle_->id() + " has too many writes waiting");
  }
  lock_ = std::unique_lock<std::mutex>(handle_->writer_mutex_);
  handle_->writers_waiting_.fetch_sub(1);
  // The index may have been paused, deleted or moved while this request waited.
  if (takes_writes && handle_->paused_) throw DaemonError(kCodeBusy, "Index " + handle_->id() + " is paused");
  store_ = handle_->Store();
}

WriterTurn::~WriterTurn() = default;

IndexRegistry::IndexRegistry(std::string file, int open_delay_ms) : file_(std::move(file)), open_delay_ms_(open_delay_ms) {}

IndexRegistry::~IndexRegistry() { Shutdown(); }

void IndexRegistry::Start() {
  Json::Value saved;
  if (!JsonFromFile(saved, file_)) {
    errno = 0;
    struct stat info;
    if (stat(file_.c_str(), &info) == 0) CORV_LOG("index registry %s is unreadable; starting with no index", file_.c_str());
    errno = 0;
  }
  {
    std::lock_guard<std::mutex> guard(mutex_);
    for (const Json::Value& entry : saved["indexes"]) {
      if (!entry["id"].isString() || !entry["path"].isString()) continue;
      auto handle = std::make_shared<IndexHandle>(entry["id"].asString(), entry["path"].asString(), entry["event_handler"],
                                                  entry["paused"].asBool());
      indexes_[handle->id_] = handle;
      to_open_.push_back(handle);
    }
  }
  opener_ = std::thread([this] { OpenInBackground(); });
}

void IndexRegistry::OpenInBackground() {
  std::vector<std::shared_ptr<IndexHandle>> pending;
  {
    std::lock_guard<std::mutex> guard(mutex_);
    pending.swap(to_open_);
  }
  if (open_delay_ms_ > 0 && !pending.empty()) SleepFor(std::chrono::milliseconds(open_delay_ms_));
  for (const auto& handle : pending) {
    if (stopping_) return;
    OpenOne(handle);
  }
}

void IndexRegistry::OpenOne(const std::shared_ptr<IndexHandle>& handle) {
  std::lock_guard<std::mutex> writer(handle->writer_mutex_);
  const std::string id = handle->id();
  std::shared_ptr<IndexStore> store;
  std::unique_ptr<EventPlugin> plugin;
  std::string failure;
  try {
    store = IndexStore::Open(handle->path());
    plugin = std::make_unique<EventPlugin>(id, handle->event_handler_);
  } catch (const std::exception& error) {
    failure = error.what();
    CORV_LOG("index %s could not be opened: %s", id.c_str(), failure.c_str());
  }
  {
    std::lock_guard<std::mutex> guard(handle->state_mutex_);
    if (handle->state_ != IndexHandle::State::kOpening) return;  // deleted meanwhile
    handle->store_ = store;
    handle->plugin_ = std::move(plugin);
    handle->failure_ = failure;
    handle->state_ = failure.empty() ? IndexHandle::State::kReady : IndexHandle::State::kFailed;
  }
  // Taken (after the state's lock: searches take it first) and released, so
  // a search checking the states cannot miss the news.
  { std::lock_guard<std::mutex> registry(mutex_); }
  opened_.notify_all();
}

void IndexRegistry::Shutdown() {
  stopping_ = true;
  if (opener_.joinable()) opener_.join();
  std::map<std::string, std::shared_ptr<IndexHandle>> indexes;
  {
    std::lock_guard<std::mutex> guard(mutex_);
    indexes = indexes_;
  }
  for (auto& [id, handle] : indexes) {
    std::lock_guard<std::mutex> writer(handle->writer_mutex_);
    std::lock_guard<std::mutex> state(handle->state_mutex_);
    if (handle->store_ == nullptr) continue;
    try {
      handle->store_->Close(true);
    } catch (const std::exception& error) {
      CORV_LOG("index %s: closing failed: %s", id.c_str(), error.what());
    }
    handle->plugin_.reset();
  }
}

std::shared_ptr<IndexHandle> IndexRegistry::Get(const std::string& id) const {
  std::shared_ptr<IndexHandle> handle;
  {
    std::lock_guard<std::mutex> guard(mutex_);
    const auto it = indexes_.find(id);
    if (it == indexes_.end()) throw DaemonError(kCodeIndexNotFound, "No index " + id);
    handle = it->second;
  }
  handle->Store();  // throws when it is not ready
  return handle;
}

std::vector<std::shared_ptr<IndexHandle>> IndexRegistry::AllForSearch(std::chrono::milliseconds wait) const {
  std::vector<std::shared_ptr<IndexHandle>> ready;
  std::string opening;
  const auto collect = [&] {
    ready.clear();
    opening.clear();
    for (const auto& [id, handle] : indexes_) {
      std::lock_guard<std::mutex> state(handle->state_mutex_);
      if (handle->state_ == IndexHandle::State::kReady) ready.push_back(handle);
      if (handle->state_ == IndexHandle::State::kOpening && opening.empty()) opening = handle->id_;
    }
    return opening.empty();
  };
  std::unique_lock<std::mutex> lock(mutex_);
  if (!opened_.wait_for(lock, wait, collect)) throw DaemonError(kCodeOpening, "Index " + opening + " is still opening");
  return ready;
}

Json::Value IndexRegistry::List() const {
  Json::Value list(Json::arrayValue);
  std::lock_guard<std::mutex> guard(mutex_);
  for (const auto& [id, handle] : indexes_) {
    std::lock_guard<std::mutex> state(handle->state_mutex_);
    Json::Value entry(Json::objectValue);
    entry["id"] = handle->id_;
    entry["path"] = handle->path_;
    entry["paused"] = handle->paused_.load();
    static const char* const kStates[] = {"opening", "ready", "failed", "gone"};
    entry["state"] = kStates[static_cast<int>(handle->state_)];
    if (!handle->failure_.empty()) entry["failure"] = handle->failure_;
    list.append(entry);
  }
  return list;
}

void IndexRegistry::Save() {
  Json::Value saved(Json::objectValue);
  saved["version"] = 1;
  saved["indexes"] = Json::Value(Json::arrayValue);
  for (const auto& [id, handle] : indexes_) {
    Json::Value entry(Json::objectValue);
    entry["id"] = handle->id_;
    entry["path"] = handle->path_;
    entry["paused"] = handle->paused_.load();
    entry["event_handler"] = handle->event_handler_;
    saved["indexes"].append(entry);
  }
  const std::string directory = Dirname(file_);
  if (!directory.empty()) MakeDirectories(directory);
  if (!JsonToFile(saved, file_, 0600)) {
    CORV_LOG_FAILED("JsonToFile(registry)");
    throw DaemonError(kCodeStorage, "Cannot write the index registry " + file_);
  }
}

bool IndexRegistry::Create(const std::string& id, const std::string& path, const Json::Value& mappings,
                           const Json::Value& settings, const Json::Value& event_handler) {
  std::lock_guard<std::mutex> guard(mutex_);
  const auto it = indexes_.find(id);
  if (it != indexes_.end()) {
    if (it->second->path() == path) return false;
    throw DaemonError(kCodeIndexExists, "Index " + id + " already exists at " + it->second->path());
  }
  for (const auto& [other_id, other] : indexes_) {
    if (other->path() == path) throw DaemonError(kCodeIndexExists, "Index " + other_id + " already uses " + path);
  }
  std::shared_ptr<IndexStore> store;
  struct stat info;
  if (stat(IndexStore::DatabasePath(path).c_str(), &info) == 0) {
    // A database left at that path (a lost registry, a re-created share) is taken back as it is.
    CORV_LOG("index %s: reusing the database already at %s", id.c_str(), path.c_str());
    store = IndexStore::Open(path);
  } else {
    errno = 0;
    store = IndexStore::Create(path, mappings, settings);
  }
  auto handle = std::make_shared<IndexHandle>(id, path, event_handler, false);
  handle->store_ = store;
  handle->plugin_ = std::make_unique<EventPlugin>(id, event_handler);
  handle->state_ = IndexHandle::State::kReady;
  indexes_[id] = handle;
  try {
    Save();
  } catch (...) {
    indexes_.erase(id);
    throw;
  }
  return true;
}

void IndexRegistry::Delete(const std::string& id) {
  std::shared_ptr<IndexHandle> handle;
  {
    std::lock_guard<std::mutex> guard(mutex_);
    const auto it = indexes_.find(id);
    if (it == indexes_.end()) throw DaemonError(kCodeIndexNotFound, "No index " + id);
    handle = it->second;
  }
  std::lock_guard<std::mutex> writer(handle->writer_mutex_);
  {
    std::lock_guard<std::mutex> state(handle->state_mutex_);
    if (handle->state_ == IndexHandle::State::kGone) throw DaemonError(kCodeIndexNotFound, "No index " + id);
    if (handle->store_ != nullptr) handle->store_->Close(false);
    handle->store_.reset();
    handle->plugin_.reset();
    handle->state_ = IndexHandle::State::kGone;
  }
  std::lock_guard<std::mutex> guard(mutex_);
  indexes_.erase(id);
  Save();
  RemoveIndexFiles(handle->path());
}

void IndexRegistry::Configure(const std::string& id, const std::string& new_id, const std::string& new_path) {
  std::shared_ptr<IndexHandle> handle = Get(id);
  std::lock_guard<std::mutex> writer(handle->writer_mutex_);
  const std::string old_path = handle->path();
  const std::string target_id = new_id.empty() ? id : new_id;
  const std::string target_path = new_path.empty() ? old_path : new_path;
  const bool moves = target_path != old_path;
  CheckNewName(*handle, id, target_id, moves ? &target_path : nullptr);
  CommitUnderOldName(*handle, moves);
  std::string failure;
  const std::string final_path = moves ? MoveDatabase(old_path, target_path, &failure) : target_path;
  if (failure.empty()) Rename(handle, id, target_id, target_path);
  const std::string open_failure = Reopen(*handle, moves, final_path);
  if (!failure.empty()) throw DaemonError(kCodeIndexPath, failure);
  if (!open_failure.empty()) throw DaemonError(kCodeIndexFailed, "Index " + target_id + " could not be reopened: " + open_failure);
}

void IndexRegistry::CheckNewName(const IndexHandle& handle, const std::string& id, const std::string& target_id,
                                 const std::string* target_path) const {
  {
    std::lock_guard<std::mutex> guard(mutex_);
    if (handle.state_ != IndexHandle::State::kReady) throw DaemonError(kCodeIndexNotFound, "No index " + id);
    if (target_id != id && indexes_.count(target_id) != 0) throw DaemonError(kCodeIndexExists, "Index " + target_id + " already exists");
    for (const auto& [other_id, other] : indexes_) {
      if (target_path != nullptr && other->path() == *target_path) throw DaemonError(kCodeIndexExists, "Index " + other_id + " already uses " + *target_path);
    }
  }
  if (target_path != nullptr && (target_path->empty() || (*target_path)[0] != '/')) {
    throw DaemonError(kCodeIndexPath, "The index path must be absolute: \"" + *target_path + "\"");
  }
}

void IndexRegistry::CommitUnderOldName(IndexHandle& handle, bool closes) {
  std::lock_guard<std::mutex> state(handle.state_mutex_);
  const CommitChanges changes = handle.store_->Commit();
  if (handle.plugin_ != nullptr) handle.plugin_->Committed(changes);
  handle.plugin_.reset();
  if (closes) {
    handle.store_->Close(true);
    handle.store_.reset();
    handle.state_ = IndexHandle::State::kOpening;
  }
}

std::string IndexRegistry::MoveDatabase(const std::string& old_path, const std::string& target_path, std::string* failure) {
  try {
    MoveIndexFiles(old_path, target_path);
  } catch (const DaemonError& error) {
    *failure = error.what();
    return old_path;  // the database stays where it was and is opened there again
  }
  return target_path;
}

void IndexRegistry::Rename(const std::shared_ptr<IndexHandle>& handle, const std::string& id, const std::string& new_id,
                           const std::string& new_path) {
  std::lock_guard<std::mutex> guard(mutex_);
  {
    std::lock_guard<std::mutex> state(handle->state_mutex_);
    handle->id_ = new_id;
    handle->path_ = new_path;
  }
  indexes_.erase(id);
  indexes_[new_id] = handle;
  Save();
}

std::string IndexRegistry::Reopen(IndexHandle& handle, bool moved, const std::string& final_path) {
  std::string open_failure;
  std::shared_ptr<IndexStore> store;
  if (moved) {
    try {
      store = IndexStore::Open(final_path);
    } catch (const std::exception& error) {
      open_failure = error.what();
    }
  }
  std::lock_guard<std::mutex> state(handle.state_mutex_);
  if (moved) {
    handle.store_ = store;
    handle.failure_ = open_failure;
    handle.state_ = open_failure.empty() ? IndexHandle::State::kReady : IndexHandle::State::kFailed;
  }
  if (handle.store_ != nullptr) handle.plugin_ = std::make_unique<EventPlugin>(handle.id_, handle.event_handler_);
  return open_failure;
}

void IndexRegistry::SetPaused(const std::string& id, bool paused) {
  std::shared_ptr<IndexHandle> handle = Get(id);
  std::lock_guard<std::mutex> guard(mutex_);
  handle->paused_ = paused;
  Save();
}

}  // namespace elasticd
}  // namespace corvlumex
