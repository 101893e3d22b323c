// The daemon's indexes: which exist, where their databases are, whether they
// are paused, and their state (opening, ready, failed). The list survives
// restarts in a small JSON file written atomically; at start every listed
// index is reopened in the background (requests meanwhile get 1401).
//
// Lock order. A thread that holds one of these locks takes only locks lower
// in the list, so no two threads ever wait for each other:
//   1. IndexHandle::writer_mutex_  one index's writer: a write request, its
//                                  opening, reconfiguration, deletion, closing
//   2. IndexRegistry::mutex_       the map of indexes and the registry file
//   3. IndexHandle::state_mutex_   one index's id, path, state, store, plug-in
// A search takes 2 then 3 and never a writer lock, so a long write does not
// hold up searches of other indexes, nor of this one's committed data.
#pragma once

#include <json/json.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "programs/corvelasticd/event_plugin.h"
#include "programs/corvelasticd/index_store.h"

namespace corvlumex {
namespace elasticd {

class IndexHandle {
 public:
  enum class State { kOpening, kReady, kFailed, kGone };

  IndexHandle(std::string id, std::string path, Json::Value event_handler, bool paused)
      : id_(std::move(id)), path_(std::move(path)), event_handler_(std::move(event_handler)), paused_(paused) {}

  std::string id() const;
  std::string path() const;
  bool paused() const { return paused_; }
  // The store for reading; throws the code that says why there is none.
  std::shared_ptr<IndexStore> Store() const;

 private:
  friend class IndexRegistry;
  friend class WriterTurn;

  mutable std::mutex state_mutex_;  // guards the members below it that change
  std::string id_;
  std::string path_;
  Json::Value event_handler_;
  std::atomic<bool> paused_;
  State state_ = State::kOpening;
  std::string failure_;
  std::shared_ptr<IndexStore> store_;
  std::unique_ptr<EventPlugin> plugin_;

  std::mutex writer_mutex_;          // one writer request at a time
  std::atomic<int> writers_waiting_{0};
};

// A writer request's turn at an index: waits for the requests before it, or
// answers busy (1400) when the index is paused (for `takes_writes`) or too
// many requests already wait.
class WriterTurn {
 public:
  WriterTurn(const std::shared_ptr<IndexHandle>& handle, bool takes_writes, int max_backlog);
  ~WriterTurn();
  WriterTurn(const WriterTurn&) = delete;
  WriterTurn& operator=(const WriterTurn&) = delete;

  IndexStore& store() { return *store_; }
  EventPlugin* plugin() { return handle_->plugin_.get(); }

 private:
  std::shared_ptr<IndexHandle> handle_;
  std::shared_ptr<IndexStore> store_;
  std::unique_lock<std::mutex> lock_;
};

class IndexRegistry {
 public:
  // `file` is the registry's JSON file; `open_delay_ms` slows the background
  // opening (for tests of the 1401 answer only).
  IndexRegistry(std::string file, int open_delay_ms);
  ~IndexRegistry();

  // Reads the registry file and starts reopening every listed index.
  void Start();
  // Commits what is pending and closes every index.
  void Shutdown();

  // Throws 2010 (unknown), 1401 (opening), 2014 (failed to open).
  std::shared_ptr<IndexHandle> Get(const std::string& id) const;
  // Every index, for a search that names none: waits up to `wait` for the
  // indexes still opening (just after a start), then throws 1401 naming one
  // that still is: a search must not silently leave an index out. Indexes
  // that failed to open are left out.
  std::vector<std::shared_ptr<IndexHandle>> AllForSearch(std::chrono::milliseconds wait) const;
  Json::Value List() const;

  // true when created, false when the same index already existed.
  bool Create(const std::string& id, const std::string& path, const Json::Value& mappings,
              const Json::Value& settings, const Json::Value& event_handler);
  void Delete(const std::string& id);
  // A new id and/or a new directory: the database moves with it.
  void Configure(const std::string& id, const std::string& new_id, const std::string& new_path);
  void SetPaused(const std::string& id, bool paused);

 private:
  void Save();  // with mutex_ held
  void OpenInBackground();
  void OpenOne(const std::shared_ptr<IndexHandle>& handle);

  // Steps of Configure, with the index's writer lock held.
  // Refuses a new id taken by another index, a new directory (when
  // `target_path` is not null) used by one or not absolute.
  void CheckNewName(const IndexHandle& handle, const std::string& id, const std::string& target_id,
                    const std::string* target_path) const;
  // Commits what was written under the old id and place; `closes` closes
  // the store too, for a move.
  static void CommitUnderOldName(IndexHandle& handle, bool closes);
  // Where the database is after trying to move it: `target_path`, or the
  // old path with the reason in `failure`.
  static std::string MoveDatabase(const std::string& old_path, const std::string& target_path, std::string* failure);
  void Rename(const std::shared_ptr<IndexHandle>& handle, const std::string& id, const std::string& new_id,
              const std::string& new_path);
  // Opens the store again after a move (`moved`) and gives the index a
  // plug-in under its current id; the reason when the store did not open.
  static std::string Reopen(IndexHandle& handle, bool moved, const std::string& final_path);

  std::string file_;
  int open_delay_ms_;
  mutable std::mutex mutex_;
  mutable std::condition_variable opened_;  // an index left the opening state
  std::map<std::string, std::shared_ptr<IndexHandle>> indexes_;
  std::vector<std::shared_ptr<IndexHandle>> to_open_;
  std::thread opener_;
  std::atomic<bool> stopping_{false};
};

}  // namespace elasticd
}  // namespace corvlumex
