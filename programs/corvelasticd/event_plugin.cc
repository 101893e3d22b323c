#include "programs/corvelasticd/event_plugin.h"

#include <dlfcn.h>
#include <sys/stat.h>

#include <mutex>
#include <set>

#include "common/log.h"
#include "programs/corvelasticd/corvelasticd_event_handler.h"

namespace corvlumex {
namespace elasticd {
namespace {

// The same missing plug-in is named once, not once per index and restart of an index.
bool FirstTimeMissing(const std::string& path) {
  static std::mutex mutex;
  static std::set<std::string> reported;
  std::lock_guard<std::mutex> guard(mutex);
  return reported.insert(path).second;
}

}  // namespace

EventPlugin::EventPlugin(const std::string& index_id, const Json::Value& handler) : index_id_(index_id) {
  if (!handler.isObject() || !handler["lib_path"].isString() || handler["lib_path"].asString().empty()) return;
  path_ = handler["lib_path"].asString();
  struct stat info;
  if (stat(path_.c_str(), &info) != 0) {
    errno = 0;
    if (FirstTimeMissing(path_)) CORV_LOG("event handler %s is not installed; indexes work without it", path_.c_str());
    return;
  }
  handle_ = dlopen(path_.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (handle_ == nullptr) {
    const char* reason = dlerror();
    CORV_LOG("event handler %s cannot be loaded: %s", path_.c_str(), reason != nullptr ? reason : "?");
    return;
  }
  on_commit_ = reinterpret_cast<CommitFn>(dlsym(handle_, "corvelasticd_handler_on_commit"));
  const auto on_open = reinterpret_cast<OpenFn>(dlsym(handle_, "corvelasticd_handler_open"));
  on_close_ = reinterpret_cast<CloseFn>(dlsym(handle_, "corvelasticd_handler_close"));
  int refused = 0;
  if (on_commit_ == nullptr) {
    CORV_LOG("event handler %s has no corvelasticd_handler_on_commit; not used", path_.c_str());
  } else if (on_open != nullptr && (refused = on_open(index_id_.c_str())) != 0) {
    CORV_LOG("event handler %s refused index %s (%d); not used", path_.c_str(), index_id_.c_str(), refused);
  } else {
    return;
  }
  on_close_ = nullptr;
  dlclose(handle_);
  handle_ = nullptr;
}

EventPlugin::~EventPlugin() {
  if (handle_ == nullptr) return;
  if (on_close_ != nullptr) on_close_(index_id_.c_str());
  dlclose(handle_);
}

void EventPlugin::Committed(const CommitChanges& changes) {
  if (handle_ == nullptr || (changes.upserted.empty() && changes.deleted.empty() && !changes.truncated)) return;
  std::vector<const char*> upserted, deleted;
  for (const std::string& key : changes.upserted) upserted.push_back(key.c_str());
  for (const std::string& key : changes.deleted) deleted.push_back(key.c_str());
  corvelasticd_commit_event event;
  event.version = CORVELASTICD_EVENT_HANDLER_VERSION;
  event.index_id = index_id_.c_str();
  event.upserted = upserted.data();
  event.upserted_count = upserted.size();
  event.deleted = deleted.data();
  event.deleted_count = deleted.size();
  event.truncated = changes.truncated ? 1 : 0;
  const int rc = on_commit_(&event);
  if (rc != 0) CORV_LOG("event handler %s failed on a commit of %s (%d)", path_.c_str(), index_id_.c_str(), rc);
}

}  // namespace elasticd
}  // namespace corvlumex
