#include "programs/corvelasticd/json_text.h"

#include <exception>
#include <memory>
#include <sstream>

namespace corvlumex {
namespace elasticd {

bool ParseJsonText(std::string_view text, Json::Value* value) {
  thread_local const std::unique_ptr<Json::CharReader> reader([] {
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    return builder.newCharReader();
  }());
  Json::Value parsed;
  std::string errors;
  try {
    if (!reader->parse(text.data(), text.data() + text.size(), &parsed, &errors)) return false;
  } catch (const std::exception&) {
    // jsoncpp throws, instead of failing, on nesting deeper than its limit.
    return false;
  }
  value->swap(parsed);
  return true;
}

std::string JsonText(const Json::Value& value) {
  thread_local const std::unique_ptr<Json::StreamWriter> writer([] {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["emitUTF8"] = true;
    return builder.newStreamWriter();
  }());
  std::ostringstream text;
  writer->write(value, &text);
  return text.str();
}

}  // namespace elasticd
}  // namespace corvlumex
