// What a search daemon's index holds, for comparing two runs of the
// end-to-end figures: every document key, then every word of the full-text
// table, field by field, with the number of documents and of occurrences
// it has there.
//
//   system_index_dump DATABASE      (corvelasticd.db of a stopped daemon)
//
// Prints "doc KEY" and "word FIELD TERM DOCS COUNT" lines in a fixed order.
#include <json/json.h>
#include <sqlite3.h>

#include <cstdio>
#include <string>

#include "common/json_util.h"
#include "programs/corvelasticd/fts_tokenizer.h"
#include "programs/corvelasticd/index_schema.h"

namespace {

// The full-text table's columns are named by field codes; the dump names
// the fields, so dumps of indexes made with other mappings compare.
void NameColumns(sqlite3* db) {
  sqlite3_stmt* statement = nullptr;
  sqlite3_prepare_v2(db, "SELECT value FROM meta WHERE name = 'mappings'", -1, &statement, nullptr);
  Json::Value mappings;
  if (sqlite3_step(statement) == SQLITE_ROW) {
    corvlumex::JsonFromString(mappings, reinterpret_cast<const char*>(sqlite3_column_text(statement, 0)));
  }
  sqlite3_finalize(statement);
  const auto schema = corvlumex::elasticd::IndexSchema::FromMappings(mappings);
  sqlite3_exec(db, "CREATE TEMP TABLE field_names(col TEXT PRIMARY KEY, name TEXT)", nullptr, nullptr, nullptr);
  for (const auto& field : schema.fields()) {
    const std::string insert =
        "INSERT INTO temp.field_names VALUES('" + field.Column() + "', '" + field.name + "')";
    sqlite3_exec(db, insert.c_str(), nullptr, nullptr, nullptr);
  }
}

bool Print(sqlite3* db, const char* sql) {
  sqlite3_stmt* statement = nullptr;
  if (sqlite3_prepare_v2(db, sql, -1, &statement, nullptr) != SQLITE_OK) return false;
  int step;
  while ((step = sqlite3_step(statement)) == SQLITE_ROW) {
    std::printf("%s\n", reinterpret_cast<const char*>(sqlite3_column_text(statement, 0)));
  }
  sqlite3_finalize(statement);
  return step == SQLITE_DONE;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: system_index_dump DATABASE\n");
    return 2;
  }
  sqlite3* db = nullptr;
  if (sqlite3_open_v2(argv[1], &db, SQLITE_OPEN_READONLY, nullptr) != SQLITE_OK) {
    std::fprintf(stderr, "cannot open %s: %s\n", argv[1], sqlite3_errmsg(db));
    return 1;
  }
  // The full-text table names the daemon's tokenizer; reading its words
  // needs it registered.
  corvlumex::elasticd::RegisterTokenizer(db);
  NameColumns(db);
  const bool done =
      Print(db, "SELECT 'doc ' || key FROM docs ORDER BY key") &&
      sqlite3_exec(db, "CREATE VIRTUAL TABLE temp.words USING fts5vocab(main, fts_text, 'col')", nullptr, nullptr,
                   nullptr) == SQLITE_OK &&
      Print(db,
            "SELECT 'word ' || coalesce(n.name, w.col) || ' ' || w.term || ' ' || w.doc || ' ' || w.cnt "
            "FROM temp.words w LEFT JOIN temp.field_names n ON n.col = w.col ORDER BY 1");
  if (!done) std::fprintf(stderr, "cannot read %s: %s\n", argv[1], sqlite3_errmsg(db));
  sqlite3_close(db);
  return done ? 0 : 1;
}
