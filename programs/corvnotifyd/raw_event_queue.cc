#include "programs/corvnotifyd/raw_event_queue.h"

#include <sys/inotify.h>

#include <cstring>

namespace corvlumex {
namespace notifyd {

std::string OverflowRecord() {
  struct inotify_event event;
  memset(&event, 0, sizeof(event));
  event.wd = -1;
  event.mask = IN_Q_OVERFLOW;
  return std::string(reinterpret_cast<const char*>(&event), sizeof(event));
}

RawEventQueue::RawEventQueue(size_t max_bytes) : max_bytes_(max_bytes) {}

void RawEventQueue::Push(std::string chunk) {
  {
    std::lock_guard<std::mutex> guard(mutex_);
    if (bytes_ + chunk.size() > max_bytes_) {
      // Memory is bounded too: what does not fit is lost, and said so once.
      if (dropping_) return;
      dropping_ = true;
      chunk = OverflowRecord();
    } else {
      dropping_ = false;
    }
    bytes_ += chunk.size();
    chunks_.push_back(std::move(chunk));
  }
  ready_.notify_one();
}

void RawEventQueue::Close() {
  {
    std::lock_guard<std::mutex> guard(mutex_);
    closed_ = true;
  }
  ready_.notify_all();
}

bool RawEventQueue::Take(std::deque<std::string>* out, std::chrono::milliseconds timeout) {
  std::unique_lock<std::mutex> lock(mutex_);
  ready_.wait_for(lock, timeout, [this] { return !chunks_.empty() || closed_; });
  if (chunks_.empty()) return !closed_;
  for (auto& chunk : chunks_) out->push_back(std::move(chunk));
  chunks_.clear();
  bytes_ = 0;
  return true;
}

bool RawEventQueue::Empty() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return chunks_.empty();
}

}  // namespace notifyd
}  // namespace corvlumex
