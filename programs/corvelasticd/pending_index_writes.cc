#include "programs/corvelasticd/pending_index_writes.h"

namespace corvlumex {
namespace elasticd {
namespace {

size_t SizeOf(const std::vector<std::string>& columns) {
  size_t size = sizeof(std::string) * columns.size();
  for (const std::string& column : columns) size += column.size();
  return size;
}

}  // namespace

void PendingIndexWrites::Add(const std::string* sql, int64_t rowid, std::vector<std::string> columns) {
  bytes_ += SizeOf(columns);
  writes_.push_back(Write{sql, rowid, std::move(columns)});
}

void PendingIndexWrites::DropAfter(size_t mark) {
  while (writes_.size() > mark) {
    bytes_ -= SizeOf(writes_.back().columns);
    writes_.pop_back();
  }
}

void PendingIndexWrites::ApplyTo(Database& db) {
  for (const Write& write : writes_) {
    Statement& stmt = db.Cached(*write.sql);
    stmt.Bind(1, write.rowid);
    // The queue keeps the words until the statement is reset below.
    for (size_t i = 0; i < write.columns.size(); ++i) stmt.BindTextInPlace(static_cast<int>(i + 2), write.columns[i]);
    stmt.Step();
    stmt.Reset();
  }
  Clear();
}

void PendingIndexWrites::Clear() {
  writes_.clear();
  writes_.shrink_to_fit();
  bytes_ = 0;
}

}  // namespace elasticd
}  // namespace corvlumex
