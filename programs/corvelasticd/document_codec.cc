#include "programs/corvelasticd/document_codec.h"

#include <cstdint>
#include <cstring>
#include <map>
#include <optional>

#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/json_text.h"

namespace corvlumex {
namespace elasticd {
namespace {

constexpr unsigned char kRecordMark = 0x01;
// Earlier versions stored JSON text, which starts with this.
constexpr char kJsonRecordMark = '{';
constexpr char kUnmappedMark = '~';

enum Type : unsigned char {
  kNull = 0,
  kFalse = 1,
  kTrue = 2,
  kInt = 3,       // zigzag varint
  kUInt = 4,      // varint, beyond the signed range
  kReal = 5,      // 8 bytes
  kString = 6,    // varint length, bytes
  kArray = 7,     // varint count, values
  kJson = 8,      // varint length, JSON text (objects)
  kSameAs = 9,    // varint code of an earlier field holding the same text
  kKeyParent = 10,  // the key up to its last '/'
};

void PutVarint(uint64_t value, std::string* out) {
  while (value >= 0x80) {
    out->push_back(static_cast<char>((value & 0x7F) | 0x80));
    value >>= 7;
  }
  out->push_back(static_cast<char>(value));
}

void PutBytes(std::string_view bytes, std::string* out) {
  PutVarint(bytes.size(), out);
  out->append(bytes.data(), bytes.size());
}

std::string_view KeyParent(const std::string& key) {
  const size_t slash = key.rfind('/');
  return slash == std::string::npos ? std::string_view() : std::string_view(key).substr(0, slash);
}

void PutValue(const Json::Value& value, std::string* out) {
  switch (value.type()) {
    case Json::nullValue: out->push_back(kNull); return;
    case Json::booleanValue: out->push_back(value.asBool() ? kTrue : kFalse); return;
    case Json::intValue: {
      const int64_t number = value.asInt64();
      out->push_back(kInt);
      PutVarint((static_cast<uint64_t>(number) << 1) ^ static_cast<uint64_t>(number >> 63), out);
      return;
    }
    case Json::uintValue:
      out->push_back(kUInt);
      PutVarint(value.asUInt64(), out);
      return;
    case Json::realValue: {
      const double number = value.asDouble();
      char bytes[sizeof(number)];
      memcpy(bytes, &number, sizeof(number));
      out->push_back(kReal);
      out->append(bytes, sizeof(bytes));
      return;
    }
    case Json::stringValue: {
      const char* begin = nullptr;
      const char* end = nullptr;
      value.getString(&begin, &end);
      out->push_back(kString);
      PutBytes(std::string_view(begin, static_cast<size_t>(end - begin)), out);
      return;
    }
    case Json::arrayValue:
      out->push_back(kArray);
      PutVarint(value.size(), out);
      for (const Json::Value& element : value) PutValue(element, out);
      return;
    case Json::objectValue:
      out->push_back(kJson);
      PutBytes(JsonText(value), out);
      return;
  }
}

// Reads a record; every read is bounds-checked, so a damaged record gives
// what could be read rather than a crash.
class Reader {
 public:
  Reader(const std::string& key, std::string_view record) : key_(key), data_(record) {}

  bool AtEnd() const { return pos_ >= data_.size(); }

  std::optional<uint64_t> Varint() {
    uint64_t value = 0;
    for (int shift = 0; shift < 64 && pos_ < data_.size(); shift += 7) {
      const auto byte = static_cast<unsigned char>(data_[pos_++]);
      value |= static_cast<uint64_t>(byte & 0x7F) << shift;
      if ((byte & 0x80) == 0) return value;
    }
    return std::nullopt;
  }

  std::optional<std::string_view> Bytes() {
    const auto length = Varint();
    if (!length || *length > data_.size() - pos_) return std::nullopt;
    const std::string_view bytes = data_.substr(pos_, *length);
    pos_ += *length;
    return bytes;
  }

  bool Skip(size_t count) {
    if (count > data_.size() - pos_) return false;
    pos_ += count;
    return true;
  }

  // One value; `code` >= 0 records a top-level text for later references.
  std::optional<Json::Value> Value(int code) {
    if (AtEnd()) return std::nullopt;
    const auto type = static_cast<unsigned char>(data_[pos_++]);
    switch (type) {
      case kNull: return Json::Value();
      case kFalse: return Json::Value(false);
      case kTrue: return Json::Value(true);
      case kInt: {
        const auto raw = Varint();
        if (!raw) return std::nullopt;
        return Json::Value(static_cast<Json::Int64>((*raw >> 1) ^ (~(*raw & 1) + 1)));
      }
      case kUInt: {
        const auto raw = Varint();
        if (!raw) return std::nullopt;
        return Json::Value(static_cast<Json::UInt64>(*raw));
      }
      case kReal: {
        double number = 0;
        if (data_.size() - pos_ < sizeof(number)) return std::nullopt;
        memcpy(&number, data_.data() + pos_, sizeof(number));
        pos_ += sizeof(number);
        return Json::Value(number);
      }
      case kString: {
        const auto bytes = Bytes();
        if (!bytes) return std::nullopt;
        if (code >= 0) texts_[code] = *bytes;
        return Json::Value(bytes->data(), bytes->data() + bytes->size());
      }
      case kArray: {
        const auto count = Varint();
        if (!count) return std::nullopt;
        Json::Value array(Json::arrayValue);
        for (uint64_t i = 0; i < *count; ++i) {
          auto element = Value(-1);
          if (!element) return std::nullopt;
          array.append(std::move(*element));
        }
        return array;
      }
      case kJson: {
        const auto bytes = Bytes();
        Json::Value parsed;
        if (!bytes || !ParseJsonText(*bytes, &parsed)) return std::nullopt;
        return parsed;
      }
      case kSameAs: {
        const auto source = Varint();
        if (!source) return std::nullopt;
        const auto found = texts_.find(static_cast<int>(*source));
        if (found == texts_.end()) return std::nullopt;
        if (code >= 0) texts_[code] = found->second;
        return Json::Value(found->second.data(), found->second.data() + found->second.size());
      }
      case kKeyParent: {
        const std::string_view parent = KeyParent(key_);
        if (code >= 0) texts_[code] = parent;
        return Json::Value(parent.data(), parent.data() + parent.size());
      }
      default: return std::nullopt;
    }
  }

 private:
  const std::string& key_;
  std::string_view data_;
  size_t pos_ = 1;  // past the record mark
  std::map<int, std::string_view> texts_;
};

// Visits the entries of a binary record: (code, name, value); code is -1 for unmapped fields.
template <typename Visit>
void ForEachEntry(const std::string& key, std::string_view record, Visit visit) {
  Reader reader(key, record);
  while (!reader.AtEnd()) {
    const auto tag = reader.Varint();
    if (!tag) return;
    std::string_view name;
    if (*tag == 0) {
      const auto bytes = reader.Bytes();
      if (!bytes) return;
      name = *bytes;
    }
    const int code = *tag == 0 ? -1 : static_cast<int>(*tag - 1);
    auto value = reader.Value(code);
    if (!value) return;
    if (!visit(code, name, std::move(*value))) return;
  }
}

Json::Value ParseJsonRecord(std::string_view record) {
  Json::Value stored;
  if (!ParseJsonText(record, &stored) || !stored.isObject()) return Json::Value(Json::objectValue);
  return stored;
}

void ResultValue(sqlite3_context* context, const Json::Value& value) {
  switch (value.type()) {
    case Json::nullValue: sqlite3_result_null(context); return;
    case Json::booleanValue: sqlite3_result_int(context, value.asBool() ? 1 : 0); return;
    case Json::intValue: sqlite3_result_int64(context, value.asInt64()); return;
    case Json::uintValue:
      if (value.isInt64()) {
        sqlite3_result_int64(context, value.asInt64());
      } else {
        sqlite3_result_double(context, value.asDouble());
      }
      return;
    case Json::realValue: sqlite3_result_double(context, value.asDouble()); return;
    case Json::stringValue: {
      const char* begin = nullptr;
      const char* end = nullptr;
      value.getString(&begin, &end);
      sqlite3_result_text64(context, begin, static_cast<sqlite3_uint64>(end - begin), SQLITE_TRANSIENT, SQLITE_UTF8);
      return;
    }
    default: {
      const std::string text = JsonText(value);
      sqlite3_result_text64(context, text.data(), text.size(), SQLITE_TRANSIENT, SQLITE_UTF8);
    }
  }
}

std::string_view ArgumentBytes(sqlite3_value* value) {
  const auto* bytes = static_cast<const char*>(sqlite3_value_blob(value));
  return bytes == nullptr ? std::string_view() : std::string_view(bytes, static_cast<size_t>(sqlite3_value_bytes(value)));
}

void FieldFunction(sqlite3_context* context, int, sqlite3_value** argv) {
  const std::string_view key = ArgumentBytes(argv[0]);
  const std::string_view record = ArgumentBytes(argv[1]);
  ResultValue(context, DecodeField(std::string(key), record, sqlite3_value_int(argv[2])));
}

}  // namespace

std::string EncodeDocument(const IndexSchema& schema, const std::string& key, const Json::Value& document) {
  std::string out(1, static_cast<char>(kRecordMark));
  const std::string_view parent = KeyParent(key);
  std::map<std::string_view, int> texts;  // top-level texts written so far, by value
  for (auto it = document.begin(); it != document.end(); ++it) {
    const std::string name = it.name();
    if (name == schema.property_id()) continue;  // kept once, as the row's key
    const Json::Value& value = *it;
    const FieldSpec* field = schema.Find(name);
    if (field == nullptr) {
      out.push_back(0);
      PutBytes(name, &out);
      PutValue(value, &out);
      continue;
    }
    PutVarint(static_cast<uint64_t>(field->code) + 1, &out);
    if (!value.isString()) {
      PutValue(value, &out);
      continue;
    }
    const char* begin = nullptr;
    const char* end = nullptr;
    value.getString(&begin, &end);
    const std::string_view text(begin, static_cast<size_t>(end - begin));
    const auto same = texts.find(text);
    if (!parent.empty() && text == parent) {
      out.push_back(kKeyParent);
    } else if (same != texts.end()) {
      out.push_back(kSameAs);
      PutVarint(static_cast<uint64_t>(same->second), &out);
    } else {
      PutValue(value, &out);
      texts.emplace(text, field->code);
    }
  }
  return out;
}

Json::Value DecodeDocument(const IndexSchema& schema, const std::string& key, std::string_view record) {
  Json::Value document(Json::objectValue);
  if (!record.empty() && record[0] == kJsonRecordMark) {
    const Json::Value stored = ParseJsonRecord(record);
    for (auto it = stored.begin(); it != stored.end(); ++it) {
      const std::string name = it.name();
      if (!name.empty() && name[0] == kUnmappedMark) {
        document[name.substr(1)] = *it;
      } else if (const FieldSpec* field = schema.FindCode(atoi(name.c_str()))) {
        document[field->name] = *it;
      }
    }
  } else if (!record.empty() && static_cast<unsigned char>(record[0]) == kRecordMark) {
    ForEachEntry(key, record, [&](int code, std::string_view name, Json::Value value) {
      if (code < 0) {
        document[std::string(name)] = std::move(value);
      } else if (const FieldSpec* field = schema.FindCode(code)) {
        document[field->name] = std::move(value);
      }
      return true;
    });
  }
  document[schema.property_id()] = key;
  return document;
}

Json::Value DecodeField(const std::string& key, std::string_view record, int code) {
  if (!record.empty() && record[0] == kJsonRecordMark) return ParseJsonRecord(record)[std::to_string(code)];
  Json::Value found;
  if (record.empty() || static_cast<unsigned char>(record[0]) != kRecordMark) return found;
  ForEachEntry(key, record, [&](int entry_code, std::string_view, Json::Value value) {
    if (entry_code != code) return true;
    found = std::move(value);
    return false;
  });
  return found;
}

void RegisterDocumentFunctions(sqlite3* db) {
  if (sqlite3_create_function_v2(db, "corv_field", 3, SQLITE_UTF8 | SQLITE_DETERMINISTIC, nullptr, FieldFunction, nullptr,
                                 nullptr, nullptr) != SQLITE_OK) {
    throw DaemonError(kCodeStorage, "Cannot register corv_field");
  }
}

}  // namespace elasticd
}  // namespace corvlumex
