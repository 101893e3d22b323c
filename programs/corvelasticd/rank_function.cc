#include "programs/corvelasticd/rank_function.h"

#include <cmath>
#include <cstring>

#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/fts_tokenizer.h"

namespace corvlumex {
namespace elasticd {
namespace {

// What does not change from row to row of one statement (plain data: it
// lives in SQLite's memory, with its arrays behind it, until the statement ends).
struct QueryStatistics {
  int phrases;
  double average_length;
  double* idf;        // per phrase
  double* frequency;  // per phrase, of the current row
};

int CountHit(const Fts5ExtensionApi*, Fts5Context*, void* count) {
  ++*static_cast<sqlite3_int64*>(count);
  return SQLITE_OK;
}

int Statistics(const Fts5ExtensionApi* api, Fts5Context* fts, QueryStatistics** out) {
  auto* stats = static_cast<QueryStatistics*>(api->xGetAuxdata(fts, 0));
  if (stats != nullptr) {
    *out = stats;
    return SQLITE_OK;
  }
  const int phrases = api->xPhraseCount(fts);
  const sqlite3_int64 bytes = static_cast<sqlite3_int64>(sizeof(QueryStatistics) + phrases * 2 * sizeof(double));
  stats = static_cast<QueryStatistics*>(sqlite3_malloc64(static_cast<sqlite3_uint64>(bytes)));
  if (stats == nullptr) return SQLITE_NOMEM;
  memset(stats, 0, static_cast<size_t>(bytes));
  stats->phrases = phrases;
  stats->idf = reinterpret_cast<double*>(&stats[1]);
  stats->frequency = &stats->idf[phrases];
  sqlite3_int64 rows = 0, tokens = 0;
  int rc = api->xRowCount(fts, &rows);
  if (rc == SQLITE_OK) rc = api->xColumnTotalSize(fts, -1, &tokens);
  if (rc == SQLITE_OK) stats->average_length = static_cast<double>(tokens) / static_cast<double>(rows);
  for (int i = 0; rc == SQLITE_OK && i < phrases; ++i) {
    sqlite3_int64 hits = 0;
    rc = api->xQueryPhrase(fts, i, &hits, CountHit);
    if (rc == SQLITE_OK) {
      // As bm25: a phrase in more than half the rows would get a negative IDF.
      double idf = log((rows - hits + 0.5) / (hits + 0.5));
      if (idf <= 0.0) idf = 1e-6;
      stats->idf[i] = idf;
    }
  }
  if (rc == SQLITE_OK) rc = api->xSetAuxdata(fts, stats, sqlite3_free);
  else sqlite3_free(stats);
  *out = rc == SQLITE_OK ? stats : nullptr;
  return rc;
}

void RankFunction(const Fts5ExtensionApi* api, Fts5Context* fts, sqlite3_context* context, int count, sqlite3_value** values) {
  const double k1 = 1.2;
  const double b = 0.75;
  if (count < 1) {
    sqlite3_result_error(context, "corv_bm25 needs the row lengths", -1);
    return;
  }
  const auto* lengths = static_cast<const RowLengths*>(sqlite3_value_pointer(values[0], kRowLengthsType));
  sqlite3_value** weights = values + 1;
  const int weight_count = count - 1;
  QueryStatistics* stats = nullptr;
  int rc = Statistics(api, fts, &stats);
  int instances = 0;
  if (rc == SQLITE_OK) {
    memset(stats->frequency, 0, sizeof(double) * static_cast<size_t>(stats->phrases));
    rc = api->xInstCount(fts, &instances);
  }
  for (int i = 0; rc == SQLITE_OK && i < instances; ++i) {
    int phrase = 0, column = 0, offset = 0;
    rc = api->xInst(fts, i, &phrase, &column, &offset);
    if (rc == SQLITE_OK) stats->frequency[phrase] += weight_count > column ? sqlite3_value_double(weights[column]) : 1.0;
  }
  double length = 0.0;
  if (rc == SQLITE_OK) {
    uint32_t known = 0;
    if (lengths != nullptr && lengths->directory != nullptr &&
        lengths->directory->Length(lengths->at, api->xRowid(fts), &known)) {
      length = static_cast<double>(static_cast<int>(known));
    } else {
      int tokens = 0;
      rc = api->xColumnSize(fts, -1, &tokens);
      length = static_cast<double>(tokens);
    }
  }
  double score = 0.0;
  for (int i = 0; rc == SQLITE_OK && i < stats->phrases; ++i) {
    score += stats->idf[i] *
             ((stats->frequency[i] * (k1 + 1.0)) / (stats->frequency[i] + k1 * (1 - b + b * length / stats->average_length)));
  }
  if (rc == SQLITE_OK) {
    sqlite3_result_double(context, -1.0 * score);
  } else {
    sqlite3_result_error_code(context, rc);
  }
}

}  // namespace

void RegisterRankFunction(sqlite3* db) {
  fts5_api* api = Fts5Api(db);
  if (api == nullptr || api->xCreateFunction(api, "corv_bm25", nullptr, RankFunction, nullptr) != SQLITE_OK) {
    throw DaemonError(kCodeStorage, "Cannot register corv_bm25");
  }
}

}  // namespace elasticd
}  // namespace corvlumex
