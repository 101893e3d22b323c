// The full-text index's own tokenizer and SQL helpers. The daemon analyzes
// every value itself (text_analysis.h) and hands the index tokens joined by
// single blanks, so the index only has to split on blanks: "corvblank".
#pragma once

#include <sqlite3.h>

namespace corvlumex {
namespace elasticd {

// Registers the "corvblank" tokenizer and the SQL function corv_fold(text)
// (Fold with FoldMode::kSearch) on the connection. Throws DaemonError.
void RegisterTokenizer(sqlite3* db);

// The connection's FTS5 interface, to register tokenizers and functions; null without FTS5.
fts5_api* Fts5Api(sqlite3* db);

}  // namespace elasticd
}  // namespace corvlumex
