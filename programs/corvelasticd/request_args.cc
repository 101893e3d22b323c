#include "programs/corvelasticd/request_args.h"

#include "programs/corvelasticd/daemon_error.h"

namespace corvlumex {
namespace elasticd {
namespace {

[[noreturn]] void Bad(const char* key, const char* what) {
  throw DaemonError(kCodeBadArgument, std::string("\"") + key + "\" " + what);
}

}  // namespace

std::string RequiredString(const Json::Value& data, const char* key) {
  if (!data.isObject() || !data.isMember(key)) Bad(key, "is missing");
  if (!data[key].isString()) Bad(key, "must be a string");
  return data[key].asString();
}

const Json::Value& RequiredObject(const Json::Value& data, const char* key) {
  if (!data.isObject() || !data.isMember(key)) Bad(key, "is missing");
  if (!data[key].isObject()) Bad(key, "must be an object");
  return data[key];
}

std::string OptionalString(const Json::Value& data, const char* key, const std::string& fallback) {
  if (!data.isObject() || !data.isMember(key) || data[key].isNull()) return fallback;
  if (!data[key].isString()) Bad(key, "must be a string");
  return data[key].asString();
}

int64_t OptionalInt(const Json::Value& data, const char* key, int64_t fallback) {
  if (!data.isObject() || !data.isMember(key) || data[key].isNull()) return fallback;
  if (!data[key].isInt64()) Bad(key, "must be an integer");
  return data[key].asInt64();
}

bool OptionalBool(const Json::Value& data, const char* key, bool fallback) {
  if (!data.isObject() || !data.isMember(key) || data[key].isNull()) return fallback;
  if (!data[key].isBool()) Bad(key, "must be true or false");
  return data[key].asBool();
}

std::vector<std::string> OptionalStrings(const Json::Value& data, const char* key) {
  std::vector<std::string> out;
  if (!data.isObject() || !data.isMember(key) || data[key].isNull()) return out;
  if (!data[key].isArray()) Bad(key, "must be an array of strings");
  for (const Json::Value& element : data[key]) {
    if (!element.isString()) Bad(key, "must be an array of strings");
    out.push_back(element.asString());
  }
  return out;
}

}  // namespace elasticd
}  // namespace corvlumex
