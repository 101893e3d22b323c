// Keeps one noisy file from keeping the indexer busy. A file is extracted at
// once when it changes, and once more at once for a second change within its
// settle interval (a new file's create and its first write often arrive in
// two batches). From the third change within the interval on, the extraction
// waits until the interval has passed, and the interval doubles (up to a
// ceiling) for as long as the file keeps changing. A file quiet for twice its
// interval starts over.
//
// Deferred files are saved in a small file beside the share's queue before
// the queue batch that deferred them is deleted, so a crash never loses one.
#pragma once

#include <chrono>
#include <map>
#include <string>
#include <vector>

namespace corvlumex {
namespace fileindexd {

struct SettleOptions {
  std::chrono::milliseconds initial{1000};
  std::chrono::milliseconds ceiling{60000};
};

class SettleTracker {
 public:
  using Clock = std::chrono::steady_clock;

  SettleTracker(const std::string& state_path, SettleOptions options);

  // True when the file may be extracted now (and the extraction is noted);
  // false when it was deferred (and will come out of TakeDue later).
  bool Admit(const std::string& path, Clock::time_point now);
  // The file left the index or was extracted by other means: forget it.
  void Forget(const std::string& path);
  // Deferred files whose time has come (they stay deferred until Confirm).
  std::vector<std::string> DueNow(Clock::time_point now) const;
  // The files were extracted and the extraction committed.
  void Confirm(const std::vector<std::string>& paths, Clock::time_point now);
  // When the next deferred file is due; Clock::time_point::max() when none.
  Clock::time_point NextDue() const;
  size_t DeferredCount() const;

  // Saves the deferred paths when they changed since the last save (atomic
  // replace; the file is removed when none are left). False on failure.
  bool Save();
  // Loads the saved deferred paths; they are due at once.
  void Load();

 private:
  struct Entry {
    Clock::time_point last_extracted;
    std::chrono::milliseconds interval{0};
    int burst = 1;  // extractions since the interval last started
    bool deferred = false;
    Clock::time_point due;
  };
  void Prune(Clock::time_point now);

  std::string state_path_;
  SettleOptions options_;
  std::map<std::string, Entry> entries_;
  bool dirty_ = false;
};

}  // namespace fileindexd
}  // namespace corvlumex
