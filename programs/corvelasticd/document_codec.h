// How a document is kept in the "docs" table: a compact binary record rather
// than JSON, since the stored documents are most of an index's size.
//
//   record := 0x01 entry*
//   entry  := varint(code + 1) value          a mapped field (numbered by the mappings)
//           | 0x00 varint(length) name value  a field the mappings do not name
//   value  := type byte, then its payload (numbers as varints or 8 bytes,
//             strings with their length, arrays with their count, other
//             JSON as text), or a reference: "the same text as field N"
//             (a file's name is often sent in several fields) or "the key
//             without its last component" (the parent folder of a path).
//
// Decoding gives back exactly the values that were sent (same JSON types).
// The key field is not in the record: the row's key column holds it.
// Records written as JSON text by earlier versions ({"<code>": value,
// "~<name>": value}) are still read.
#pragma once

#include <json/json.h>
#include <sqlite3.h>

#include <string>
#include <string_view>

#include "programs/corvelasticd/index_schema.h"

namespace corvlumex {
namespace elasticd {

// `document` holds the key field too; it is left out of the record.
std::string EncodeDocument(const IndexSchema& schema, const std::string& key, const Json::Value& document);
// Every field with its name, the key field included.
Json::Value DecodeDocument(const IndexSchema& schema, const std::string& key, std::string_view record);
// One mapped field's value (null when absent); arrays and objects come back as Json values too.
Json::Value DecodeField(const std::string& key, std::string_view record, int code);

// Registers corv_field(key, record, code) on the connection: the field as an
// SQL value (text, integer, real, 1/0 for bools, JSON text for arrays and
// objects, NULL when absent), for ranges, sorting and short name scans.
void RegisterDocumentFunctions(sqlite3* db);

}  // namespace elasticd
}  // namespace corvlumex
