// Every document's key by its row, in memory, for the searches' access
// checks: reading a candidate's key from "docs" costs a random page of a
// large table, reading it here a few instructions (about 50 MB for 1,000,000
// paths).
//
// The directory must say exactly what the searching reader's snapshot says.
// It is changed only at commits, from the rows the transaction changed, and
// counts commits in `generation`: odd while one is under way. A reader notes
// the generation before its snapshot is taken and after; when both are the
// same even number, its snapshot is the directory's state, and every lookup
// checks (under the shared lock the commit's update waits for) that it still
// is. Otherwise the reader reads the keys from "docs".
//
// It also keeps each row's length in the word index (its token count, as
// FTS5's docsize table holds it) for BM25, whose lookups of it cost most of
// a search that matches thousands of documents. Lengths come only from the
// build's scan: a row changed since is "unknown" and read from the index.
#pragma once

#include <atomic>
#include <cstdint>
#include <mutex>
#include <optional>
#include <shared_mutex>
#include <string>
#include <utility>
#include <vector>

namespace corvlumex {
namespace elasticd {

class KeyDirectory {
 public:
  using Change = std::pair<int64_t, std::optional<std::string>>;  // row, new key (none: deleted)

  uint64_t generation() const { return generation_.load(std::memory_order_acquire); }
  bool ready() const { return ready_.load(std::memory_order_acquire); }

  // ---- writer side (one writer) ----
  // Brackets a commit; `changes` are the committed transaction's row changes
  // in order. A failed commit (`committed` false) or changes that were not
  // all recorded drop the directory, to be built again.
  void BeginCommit();
  void EndCommit(bool committed, bool complete, const std::vector<Change>& changes);

  // ---- building, from a scan of one snapshot taken at generation `at` ----
  // Only one caller builds at a time; false when another is building.
  bool TryStartBuild();
  void Add(int64_t rowid, const std::string& key);  // while building
  void AddLength(int64_t rowid, uint32_t length);    // while building, after the row's key
  // Installs what was added when no commit happened since `at`; ends the build.
  void FinishBuild(uint64_t at, bool complete);

  // ---- readers ----
  // The keys of `rowids` (nullopt: no such row) as of generation `at`;
  // false (nothing filled) when the directory is not at that generation.
  bool Lookup(uint64_t at, const std::vector<int64_t>& rowids, std::vector<std::optional<std::string>>* keys) const;
  // The row's length as of generation `at`; false when it is not known
  // (another generation, a row changed since the build, no such row).
  bool Length(uint64_t at, int64_t rowid, uint32_t* length) const;

 private:
  struct Table {
    std::vector<uint64_t> slots;  // by rowid: 0 = no row, else (offset << 24) | (length + 1)
    std::string arena;            // the keys' bytes
    std::vector<uint32_t> lengths;  // by rowid, kUnknownLength when not known
    size_t garbage = 0;           // bytes of replaced keys
    static constexpr uint32_t kUnknownLength = UINT32_MAX;
    // A changed row's length becomes unknown.
    bool Set(int64_t rowid, const std::optional<std::string>& key);
    bool SetLength(int64_t rowid, uint32_t length);
    void Compact();
  };

  mutable std::shared_mutex mutex_;
  std::atomic<uint64_t> generation_{0};
  std::atomic<bool> ready_{false};
  Table table_;           // under mutex_
  std::mutex build_mutex_;
  bool building_ = false;  // under build_mutex_
  Table building_table_;  // the builder's own
  bool building_ok_ = true;
};

}  // namespace elasticd
}  // namespace corvlumex
