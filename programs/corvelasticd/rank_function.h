// corv_bm25(fts_text, lengths, weight...): FTS5's own BM25, the same
// formula in the same order of operations (so the same scores to the last
// bit), except that each row's length is taken from the key directory when
// it knows it at the reader's generation. FTS5's bm25 reads every match's
// length from its docsize table, one B-tree lookup per match: nine tenths
// of the scoring of a prefix that matches thousands of documents.
// `lengths` is a RowLengths bound with sqlite3_bind_pointer under the type
// kRowLengthsType; a null one (or a row the directory does not know) reads
// the length from the index, as bm25 does.
#pragma once

#include <sqlite3.h>

#include <cstdint>

#include "programs/corvelasticd/key_directory.h"

namespace corvlumex {
namespace elasticd {

struct RowLengths {
  const KeyDirectory* directory = nullptr;
  uint64_t at = 0;  // the generation of the reader's snapshot
};

inline constexpr char kRowLengthsType[] = "corv_row_lengths";

// Registers corv_bm25 on the connection. Throws DaemonError.
void RegisterRankFunction(sqlite3* db);

}  // namespace elasticd
}  // namespace corvlumex
