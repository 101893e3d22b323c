#include "programs/corvelasticd/fts_tokenizer.h"

#include <cstring>
#include <string>

#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/text_analysis.h"

namespace corvlumex {
namespace elasticd {
namespace {

// The tokenizer keeps no state; any non-null pointer serves as its instance.
int BlankCreate(void*, const char**, int, Fts5Tokenizer** out) {
  static int instance;
  *out = reinterpret_cast<Fts5Tokenizer*>(&instance);
  return SQLITE_OK;
}

void BlankDelete(Fts5Tokenizer*) {}

int BlankTokenize(Fts5Tokenizer*, void* context, int, const char* text, int length,
                  int (*emit)(void*, int, const char*, int, int, int)) {
  // The runs between blanks; memchr finds the next blank faster than a
  // loop over the characters of a megabyte text.
  int start = 0;
  while (start < length) {
    if (text[start] == ' ') {
      ++start;
      continue;
    }
    const void* blank = memchr(text + start, ' ', static_cast<size_t>(length - start));
    const int end = blank != nullptr ? static_cast<int>(static_cast<const char*>(blank) - text) : length;
    const int rc = emit(context, 0, text + start, end - start, start, end);
    if (rc != SQLITE_OK) return rc;
    start = end;
  }
  return SQLITE_OK;
}

void FoldFunction(sqlite3_context* context, int, sqlite3_value** argv) {
  const auto* text = reinterpret_cast<const char*>(sqlite3_value_text(argv[0]));
  if (text == nullptr) {
    sqlite3_result_null(context);
    return;
  }
  const std::string folded = Fold(std::string_view(text, static_cast<size_t>(sqlite3_value_bytes(argv[0]))), FoldMode::kSearch);
  sqlite3_result_text64(context, folded.data(), folded.size(), SQLITE_TRANSIENT, SQLITE_UTF8);
}

}  // namespace

fts5_api* Fts5Api(sqlite3* db) {
  fts5_api* api = nullptr;
  sqlite3_stmt* stmt = nullptr;
  if (sqlite3_prepare_v2(db, "SELECT fts5(?1)", -1, &stmt, nullptr) == SQLITE_OK) {
    sqlite3_bind_pointer(stmt, 1, static_cast<void*>(&api), "fts5_api_ptr", nullptr);
    sqlite3_step(stmt);
  }
  sqlite3_finalize(stmt);
  return api;
}

void RegisterTokenizer(sqlite3* db) {
  fts5_api* api = Fts5Api(db);
  if (api == nullptr) throw DaemonError(kCodeStorage, "This SQLite has no FTS5");
  static fts5_tokenizer tokenizer = {BlankCreate, BlankDelete, BlankTokenize};
  if (api->xCreateTokenizer(api, "corvblank", nullptr, &tokenizer, nullptr) != SQLITE_OK) {
    throw DaemonError(kCodeStorage, "Cannot register the index tokenizer");
  }
  if (sqlite3_create_function_v2(db, "corv_fold", 1, SQLITE_UTF8 | SQLITE_DETERMINISTIC, nullptr, FoldFunction,
                                 nullptr, nullptr, nullptr) != SQLITE_OK) {
    throw DaemonError(kCodeStorage, "Cannot register corv_fold");
  }
}

}  // namespace elasticd
}  // namespace corvlumex
