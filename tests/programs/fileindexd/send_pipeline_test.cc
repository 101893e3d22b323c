// The walk's documents go to the search daemon on a sender thread, several to
// a request: the queue between extraction and sending is bounded, keeps
// order, loses nothing, and a failure of the daemon stops the pushes. How a
// walk counts each file's answer is in op_applier_test.cc.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "fileindex/elastic/daemon_codes.h"
#include "programs/fileindexd/document_sender.h"
#include "tests/fileindex/elastic/fake_search_daemon.h"

namespace corvlumex {
namespace fileindexd {
namespace {
using Document = DocumentSender::Document;

// Polls `done` for up to 30 s.
bool Eventually(const std::function<bool()>& done) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  while (!done()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(2));
  }
  return true;
}

Document Doc(int number, size_t size) { return Document{"/f" + std::to_string(number), std::string(size, 'x')}; }

// Records the batches handed to it; holds each one while `hold` is set.
struct RecordingSend {
  std::mutex mutex;
  std::condition_variable released;
  bool hold = false;
  std::vector<std::vector<std::string>> batches;  // paths
  std::vector<size_t> batch_bytes;

  DocumentSender::SendBatch Callback() {
    return [this](std::vector<Document>& batch) {
      std::unique_lock<std::mutex> lock(mutex);
      std::vector<std::string> paths;
      size_t bytes = 0;
      for (const Document& document : batch) {
        paths.push_back(document.path);
        bytes += document.request.size();
      }
      batches.push_back(paths);
      batch_bytes.push_back(bytes);
      released.wait(lock, [this] { return !hold; });
    };
  }
  void Release() {
    {
      std::lock_guard<std::mutex> lock(mutex);
      hold = false;
    }
    released.notify_all();
  }
  size_t Batches() {
    std::lock_guard<std::mutex> lock(mutex);
    return batches.size();
  }
};

TEST(DocumentSenderTest, EveryDocumentIsSentInOrderInBoundedBatches) {
  const DocumentSender::Limits limits{1000, 300, 4};
  struct Case {
    const char* name;
    std::vector<size_t> sizes;
    int pushed_while_held;  // pushes that return while the first batch is out
    size_t batches;         // how many batches in all; 0: not fixed
  };
  const Case cases[] = {
      {"small documents wait in the queue and go four at a time", std::vector<size_t>(50, 10), 50, 1 + 13},
      {"larger ones fill the queue, then wait for room", std::vector<size_t>(30, 120), 1 + 8, 0},
      {"one larger than the queue waits for it to empty and travels alone", {50, 2000, 50, 50, 301, 10}, 2, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    RecordingSend recorder;
    recorder.hold = true;
    std::atomic<int> pushed{0};
    {
      DocumentSender sender(recorder.Callback(), limits);
      std::thread walker([&] {
        for (size_t i = 0; i < c.sizes.size(); ++i) {
          sender.Push(Doc(static_cast<int>(i), c.sizes[i]));
          ++pushed;
          if (i == 0) Eventually([&] { return recorder.Batches() == 1; });  // the first goes out alone
        }
      });
      EXPECT_TRUE(Eventually([&] { return recorder.Batches() == 1 && pushed == c.pushed_while_held; }));
      if (pushed < static_cast<int>(c.sizes.size())) {
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
        EXPECT_EQ(pushed, c.pushed_while_held) << "the queue took more than its bound";
      }
      recorder.Release();
      walker.join();
      sender.Finish();
    }
    std::vector<std::string> sent;
    for (size_t b = 0; b < recorder.batches.size(); ++b) {
      const auto& batch = recorder.batches[b];
      EXPECT_LE(batch.size(), limits.batch_documents);
      if (batch.size() > 1) {
        EXPECT_LE(recorder.batch_bytes[b], limits.batch_bytes);
      }
      sent.insert(sent.end(), batch.begin(), batch.end());
    }
    std::vector<std::string> pushed_paths;
    for (size_t i = 0; i < c.sizes.size(); ++i) pushed_paths.push_back("/f" + std::to_string(i));
    EXPECT_EQ(sent, pushed_paths);
    if (c.batches != 0) {
      EXPECT_EQ(recorder.batches.size(), c.batches);
    }
  }
}

TEST(DocumentSenderTest, AFailedSendStopsThePushesAndTheFinish) {
  std::atomic<int> calls{0};
  DocumentSender sender(
      [&](std::vector<Document>&) {
        if (++calls == 2) throw Error(static_cast<ErrorCode>(elasticd::kCodeIndexNotFound), "no index");
      },
      DocumentSender::Limits{1000, 100, 1});
  const auto code_of = [](const std::function<void()>& step) { return testing_support::ErrorOrNone(step).code; };
  sender.Push(Doc(0, 10));
  sender.Push(Doc(1, 10));
  ASSERT_TRUE(Eventually([&] { return calls == 2; }));
  int refused = 0;
  EXPECT_TRUE(Eventually([&] { return (refused = code_of([&] { sender.Push(Doc(2, 10)); })) != 0; }));
  EXPECT_EQ(refused, elasticd::kCodeIndexNotFound);
  EXPECT_EQ(code_of([&] { sender.Finish(); }), elasticd::kCodeIndexNotFound);
  EXPECT_EQ(calls, 2) << "nothing is sent after a failure";
}

}  // namespace
}  // namespace fileindexd
}  // namespace corvlumex
