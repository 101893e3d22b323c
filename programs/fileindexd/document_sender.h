// Sends the documents of a folder walk on a thread of its own, several to a
// request, so that the walk's threads go on extracting while the search
// daemon stores what they found before (each thread used to wait for the
// daemon's answer before it read its next file).
//
// Contract:
// - Push() queues one written-out request; it waits while the queue holds
//   `queue_bytes` or more, so a walk of large documents keeps at most about
//   queue_bytes queued plus the batch being sent. A request larger than
//   that waits for an empty queue and then travels alone.
// - Batches keep the order of the queue and hold at most `batch_documents`
//   requests and, unless one request alone is larger, `batch_bytes`.
// - Finish() returns once every request pushed before it was handed to
//   `send`. Nothing pushed is dropped, unless `send` threw.
// - When `send` throws, nothing more is sent: Push() and Finish() rethrow
//   that exception from then on (the walk stops and is done again later),
//   and what was still queued is let go.
// - Push() may be called from several threads at once.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <exception>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace corvlumex {
namespace fileindexd {

class DocumentSender {
 public:
  struct Document {
    std::string path;
    std::string request;  // the request text, as IndexUpsertRequest writes it
  };
  struct Limits {
    size_t queue_bytes = size_t{2} << 20;
    size_t batch_bytes = size_t{512} << 10;
    size_t batch_documents = 64;
  };
  // Sends one batch; throws to stop the sender.
  using SendBatch = std::function<void(std::vector<Document>& batch)>;

  DocumentSender(SendBatch send, Limits limits);
  DocumentSender(SendBatch send) : DocumentSender(std::move(send), Limits()) {}
  // Stops the thread; what was not sent by then is let go (Finish was not
  // called, or the sender failed).
  ~DocumentSender();
  DocumentSender(const DocumentSender&) = delete;
  DocumentSender& operator=(const DocumentSender&) = delete;

  void Push(Document document);
  void Finish();

 private:
  void Run();
  // Takes the next batch off the queue; empty when the thread is to end.
  std::vector<Document> NextBatch();

  SendBatch send_;
  const Limits limits_;
  std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<Document> queue_;
  size_t queued_bytes_ = 0;
  bool sending_ = false;  // a batch is with `send_`
  bool closing_ = false;    // the destructor: end without sending the rest
  std::exception_ptr failure_;
  std::thread thread_;
};

}  // namespace fileindexd
}  // namespace corvlumex
