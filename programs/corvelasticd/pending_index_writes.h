// Changes to an index's full-text tables (word and name index) held in
// memory until the transaction commits.
//
// The full-text engine writes its whole in-memory buffer to disk as a new
// segment at every savepoint. Each request runs in a savepoint (so a failed
// one leaves nothing half-done); writing the full-text rows inside it would
// thus make one tiny segment per document, which costs most of the ingest
// time and leaves many small segments to merge. Queued here, the rows of a
// whole transaction reach the engine at once and make one segment.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "programs/corvelasticd/sqlite_db.h"

namespace corvlumex {
namespace elasticd {

class PendingIndexWrites {
 public:
  // `sql` (an insert or a 'delete' command with the rowid and one value per
  // column) must outlive the queue.
  void Add(const std::string* sql, int64_t rowid, std::vector<std::string> columns);
  bool empty() const { return writes_.empty(); }
  size_t bytes() const { return bytes_; }

  // The queue's length, and dropping what a failed request queued after it.
  size_t Mark() const { return writes_.size(); }
  void DropAfter(size_t mark);

  // Runs every queued write in order on `db`; the queue is emptied only
  // when all succeeded (the caller rolls the partial work back otherwise).
  void ApplyTo(Database& db);
  void Clear();

 private:
  struct Write {
    const std::string* sql;
    int64_t rowid;
    std::vector<std::string> columns;
  };
  std::vector<Write> writes_;
  size_t bytes_ = 0;
};

}  // namespace elasticd
}  // namespace corvlumex
