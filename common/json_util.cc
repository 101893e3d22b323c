#include "common/json_util.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <memory>
#include <sstream>
#include <streambuf>

#include "common/error.h"
#include "common/export.h"
#include "common/file_util.h"

namespace corvlumex {

// The specialisations and instantiations of the header's templates are
// its interface too; a definition here does not inherit its visibility.
CORVLUMEX_API_BEGIN

template <>
bool isJsonType<std::string>(const Json::Value& value) { return value.isConvertibleTo(Json::stringValue); }
template <>
bool isJsonType<bool>(const Json::Value& value) { return value.isConvertibleTo(Json::booleanValue); }
template <>
bool isJsonType<int>(const Json::Value& value) { return value.isConvertibleTo(Json::intValue); }
template <>
bool isJsonType<unsigned int>(const Json::Value& value) { return value.isConvertibleTo(Json::uintValue); }
// Deliberately strict: reals and strings are never 64-bit integers.
template <>
bool isJsonType<long long>(const Json::Value& value) {
  return value.type() == Json::intValue || value.type() == Json::uintValue;
}
template <>
bool isJsonType<double>(const Json::Value& value) { return value.isConvertibleTo(Json::realValue); }

template <>
std::string asJsonType<std::string>(const Json::Value& value) { return value.asString(); }
template <>
bool asJsonType<bool>(const Json::Value& value) { return value.asBool(); }
template <>
int asJsonType<int>(const Json::Value& value) { return value.asInt(); }
template <>
unsigned int asJsonType<unsigned int>(const Json::Value& value) { return value.asUInt(); }
template <>
long long asJsonType<long long>(const Json::Value& value) { return value.asInt64(); }
template <>
double asJsonType<double>(const Json::Value& value) { return value.asDouble(); }

std::string AppendData(const Json::Value& data) { return ", data=" + JsonToString(data); }

namespace {

// Steps shared by every instance: the object test and the required-key test.
// Returns false when a non-required key is absent.
bool CheckMember(const Json::Value& data, const std::string& key, bool required) {
  if (!data.isObject() && !data.isNull()) throw Error(kErrorBadArgument, "Not an object" + AppendData(data));
  const bool present = data.isMember(key);
  if (required && !present) throw Error(kErrorBadArgument, "Missing property: " + key + AppendData(data));
  return present;
}

}  // namespace

template <typename T>
void GetJsonValue(T& out, const Json::Value& data, const std::string& key, bool required) {
  if (!CheckMember(data, key, required)) return;
  const Json::Value& member = data[key];
  if (!isJsonType<T>(member)) {
    // One text for every type, numbers and booleans included.
    if (required) throw Error(kErrorBadArgument, "Not a string" + AppendData(data));
    return;
  }
  out = asJsonType<T>(member);
}

template <>
void GetJsonValue<Json::Value>(Json::Value& out, const Json::Value& data, const std::string& key, bool required) {
  if (!CheckMember(data, key, required)) return;
  out = data[key];
}

template void GetJsonValue<std::string>(std::string&, const Json::Value&, const std::string&, bool);
template void GetJsonValue<bool>(bool&, const Json::Value&, const std::string&, bool);
template void GetJsonValue<int>(int&, const Json::Value&, const std::string&, bool);
template void GetJsonValue<unsigned int>(unsigned int&, const Json::Value&, const std::string&, bool);
template void GetJsonValue<long long>(long long&, const Json::Value&, const std::string&, bool);
template void GetJsonValue<double>(double&, const Json::Value&, const std::string&, bool);

CORVLUMEX_API_END

void JsonApplyChanges(Json::Value& target, const Json::Value& changes) {
  for (auto it = changes.begin(); it != changes.end(); ++it) {
    const std::string key = it.name();
    const Json::Value& change = *it;
    if (change.isNull()) {
      if (target.isObject()) target.removeMember(key);
    } else if (change.isObject()) {
      // The member is created before the recursion, so {"o": {}} leaves "o": null.
      JsonApplyChanges(target[key], change);
    } else {
      target[key] = change;
    }
  }
}

template <>
Json::Value Vec2JsonArr<std::string>(const std::vector<std::string>& values) {
  Json::Value array(Json::arrayValue);
  for (const std::string& value : values) array.append(value);
  return array;
}

template <>
std::vector<std::string> JsonArr2Vec<std::string>(const Json::Value& array) {
  std::vector<std::string> values;
  if (!array.isArray()) return values;
  for (const Json::Value& element : array) {
    if (isJsonType<std::string>(element)) values.push_back(element.asString());
  }
  return values;
}

bool JsonFromString(Json::Value& value, const std::string& text) {
  Json::CharReaderBuilder builder;
  // Only valid JSON is accepted: the lenient defaults would take text after
  // the value ("{...}}"), comments or trailing commas for a good record.
  // Top-level scalars stay allowed: they are valid JSON.
  builder["collectComments"] = false;
  builder["allowComments"] = false;
  builder["allowTrailingCommas"] = false;
  builder["failIfExtra"] = true;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value parsed;
  std::string errors;
  try {
    if (!reader->parse(text.data(), text.data() + text.size(), &parsed, &errors)) return false;
  } catch (const std::exception&) {
    return false;  // jsoncpp throws on nesting deeper than it allows: not valid JSON for us
  }
  value.swap(parsed);
  return true;
}

bool JsonFromFile(Json::Value& value, const std::string& path) {
  std::ifstream input(path, std::ios::binary);
  if (!input) return false;
  std::ostringstream content;
  content << input.rdbuf();
  if (input.bad()) return false;
  return JsonFromString(value, content.str());
}

bool JsonToFile(const Json::Value& value, const std::string& path, mode_t mode) {
  return WriteFileAtomically(path, JsonToString(value) + "\n", mode);
}

namespace {

// Appends what is written to a string: the text is built in place, not in a
// stream's buffer that is then copied out (a document of megabytes was held
// twice more while it was written out).
class StringSink : public std::streambuf {
 public:
  explicit StringSink(std::string& out) : out_(out) {}

 protected:
  std::streamsize xsputn(const char* bytes, std::streamsize count) override {
    out_.append(bytes, static_cast<size_t>(count));
    return count;
  }
  int_type overflow(int_type c) override {
    if (!traits_type::eq_int_type(c, traits_type::eof())) out_.push_back(traits_type::to_char_type(c));
    return traits_type::not_eof(c);
  }

 private:
  std::string& out_;
};

}  // namespace

std::string JsonToString(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  std::string text;
  StringSink sink(text);
  std::ostream stream(&sink);
  std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter())->write(value, &stream);
  return text;
}

}  // namespace corvlumex
