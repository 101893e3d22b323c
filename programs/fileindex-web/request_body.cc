#include "programs/fileindex-web/request_body.h"

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <set>
#include <stdexcept>

#include "programs/fileindex-web/api_error.h"

namespace corvlumex {
namespace web {
namespace {

ApiError BadMember(const std::string& key, const std::string& wanted) {
  return ApiError(400, "\"" + key + "\" must be " + wanted, "send \"" + key + "\" as " + wanted);
}

bool Known(const std::string& name, std::initializer_list<const char*> known) {
  for (const char* k : known) {
    if (name == k) return true;
  }
  return false;
}

std::string KnownList(std::initializer_list<const char*> known) {
  std::string list;
  for (const char* k : known) list += (list.empty() ? "" : ", ") + std::string(k);
  return list.empty() ? "none" : list;
}

}  // namespace

Json::Value ParseBody(const std::string& text, std::initializer_list<const char*> known) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["stackLimit"] = 64;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value body;
  std::string errors;
  const std::string input = text.empty() ? "{}" : text;
  bool parsed = false;
  try {
    parsed = reader->parse(input.data(), input.data() + input.size(), &body, &errors);
  } catch (const std::exception& error) {
    errors = error.what();  // nesting deeper than the stack limit throws
  }
  if (!parsed) {
    throw ApiError(400, "the request body is not valid JSON: " + errors.substr(0, 200), "send a JSON object");
  }
  if (!body.isObject()) throw ApiError(400, "the request body must be a JSON object", "send a JSON object {...}");
  for (const std::string& name : body.getMemberNames()) {
    if (!Known(name, known)) {
      throw ApiError(400, "unknown field \"" + name + "\"", "use only these fields: " + KnownList(known));
    }
  }
  return body;
}

std::string RequiredString(const Json::Value& body, const char* key) {
  if (!body[key].isString() || body[key].asString().empty()) throw BadMember(key, "a non-empty string");
  return body[key].asString();
}

std::optional<std::string> OptionalString(const Json::Value& body, const char* key) {
  if (!body.isMember(key)) return std::nullopt;
  if (!body[key].isString()) throw BadMember(key, "a string");
  return body[key].asString();
}

std::optional<bool> OptionalBool(const Json::Value& body, const char* key) {
  if (!body.isMember(key)) return std::nullopt;
  if (!body[key].isBool()) throw BadMember(key, "true or false");
  return body[key].asBool();
}

std::optional<long long> OptionalInteger(const Json::Value& body, const char* key, long long min, long long max) {
  if (!body.isMember(key)) return std::nullopt;
  const Json::Value& value = body[key];
  const std::string range = "a whole number from " + std::to_string(min) + " to " + std::to_string(max);
  if (!value.isIntegral() || value.asLargestInt() < min || value.asLargestInt() > max) throw BadMember(key, range);
  return value.asLargestInt();
}

Json::Value RequiredStringList(const Json::Value& body, const char* key) {
  const Json::Value& list = body[key];
  if (!list.isArray() || list.empty()) throw BadMember(key, "a non-empty list of strings");
  for (const Json::Value& item : list) {
    if (!item.isString() || item.asString().empty()) throw BadMember(key, "a non-empty list of strings");
  }
  return list;
}

void CheckParams(const Params& params, std::initializer_list<const char*> known) {
  std::set<std::string> seen;
  for (const auto& [name, value] : params) {
    if (!Known(name, known)) {
      throw ApiError(400, "unknown parameter \"" + name + "\"", "use only these parameters: " + KnownList(known));
    }
    if (!seen.insert(name).second) throw ApiError(400, "parameter \"" + name + "\" is given twice", "give it once");
  }
}

std::optional<std::string> Param(const Params& params, const char* key) {
  const auto found = params.find(key);
  if (found == params.end()) return std::nullopt;
  return found->second;
}

std::optional<long long> IntegerParam(const Params& params, const char* key, long long min, long long max) {
  const std::optional<std::string> text = Param(params, key);
  if (!text) return std::nullopt;
  char* end = nullptr;
  errno = 0;
  const long long value = std::strtoll(text->c_str(), &end, 10);
  const bool bad = text->empty() || *end != '\0' || errno != 0 || value < min || value > max;
  errno = 0;
  if (bad) throw BadMember(key, "a whole number from " + std::to_string(min) + " to " + std::to_string(max));
  return value;
}

}  // namespace web
}  // namespace corvlumex
