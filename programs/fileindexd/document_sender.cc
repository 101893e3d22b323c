#include "programs/fileindexd/document_sender.h"

#include <utility>

namespace corvlumex {
namespace fileindexd {

DocumentSender::DocumentSender(SendBatch send, Limits limits) : send_(std::move(send)), limits_(limits) {
  thread_ = std::thread([this] { Run(); });
}

DocumentSender::~DocumentSender() {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    closing_ = true;
  }
  changed_.notify_all();
  if (thread_.joinable()) thread_.join();
}

void DocumentSender::Push(Document document) {
  const size_t size = document.request.size();
  std::unique_lock<std::mutex> lock(mutex_);
  changed_.wait(lock, [&] {
    return failure_ || queued_bytes_ == 0 || queued_bytes_ + size <= limits_.queue_bytes;
  });
  if (failure_) std::rethrow_exception(failure_);
  queued_bytes_ += size;
  queue_.push_back(std::move(document));
  lock.unlock();
  changed_.notify_all();
}

void DocumentSender::Finish() {
  std::unique_lock<std::mutex> lock(mutex_);
  changed_.wait(lock, [&] { return failure_ || (queue_.empty() && !sending_); });
  if (failure_) std::rethrow_exception(failure_);
}

std::vector<DocumentSender::Document> DocumentSender::NextBatch() {
  std::unique_lock<std::mutex> lock(mutex_);
  changed_.wait(lock, [&] { return closing_ || !queue_.empty(); });
  std::vector<Document> batch;
  if (closing_) return batch;
  size_t bytes = 0;
  while (!queue_.empty() && batch.size() < limits_.batch_documents &&
         (batch.empty() || bytes + queue_.front().request.size() <= limits_.batch_bytes)) {
    bytes += queue_.front().request.size();
    batch.push_back(std::move(queue_.front()));
    queue_.pop_front();
  }
  queued_bytes_ -= bytes;
  sending_ = true;
  lock.unlock();
  changed_.notify_all();  // room for the walk's threads
  return batch;
}

void DocumentSender::Run() {
  for (;;) {
    std::vector<Document> batch = NextBatch();
    if (batch.empty()) return;
    std::exception_ptr failure;
    try {
      send_(batch);
    } catch (...) {
      failure = std::current_exception();
    }
    batch.clear();
    {
      std::lock_guard<std::mutex> lock(mutex_);
      sending_ = false;
      if (failure) {
        failure_ = failure;
        queue_.clear();
        queued_bytes_ = 0;
      }
    }
    changed_.notify_all();
    if (failure) return;
  }
}

}  // namespace fileindexd
}  // namespace corvlumex
