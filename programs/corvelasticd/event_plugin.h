// Loads an index's event-handler plug-in (corvelasticd_event_handler.h) and
// tells it of committed changes.
#pragma once

#include <json/json.h>

#include <string>

#include "programs/corvelasticd/index_store.h"

namespace corvlumex {
namespace elasticd {

class EventPlugin {
 public:
  // `handler` is the index's "event_handler" object. A missing library is
  // logged once per path for the process's life; a library that cannot be
  // loaded or refuses the index is logged and left out.
  EventPlugin(const std::string& index_id, const Json::Value& handler);
  ~EventPlugin();
  EventPlugin(const EventPlugin&) = delete;
  EventPlugin& operator=(const EventPlugin&) = delete;

  bool loaded() const { return handle_ != nullptr; }
  void Committed(const CommitChanges& changes);

 private:
  using OpenFn = int (*)(const char*);
  using CommitFn = int (*)(const void*);
  using CloseFn = void (*)(const char*);

  std::string index_id_;
  std::string path_;
  void* handle_ = nullptr;
  CommitFn on_commit_ = nullptr;
  CloseFn on_close_ = nullptr;
};

}  // namespace elasticd
}  // namespace corvlumex
