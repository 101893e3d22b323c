#include "programs/corvspotlightd/answer_writer.h"

#include <json/json.h>

namespace corvlumex {
namespace spotlightd {
namespace {

std::string Compact(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

bool IsUtf8(const std::string& text) {
  size_t i = 0;
  while (i < text.size()) {
    const unsigned char c = static_cast<unsigned char>(text[i]);
    size_t length = 0;
    uint32_t code = 0;
    if (c < 0x80) {
      ++i;
      continue;
    } else if ((c & 0xE0) == 0xC0) {
      length = 2;
      code = c & 0x1F;
    } else if ((c & 0xF0) == 0xE0) {
      length = 3;
      code = c & 0x0F;
    } else if ((c & 0xF8) == 0xF0) {
      length = 4;
      code = c & 0x07;
    } else {
      return false;
    }
    if (i + length > text.size()) return false;
    for (size_t k = 1; k < length; ++k) {
      const unsigned char next = static_cast<unsigned char>(text[i + k]);
      if ((next & 0xC0) != 0x80) return false;
      code = (code << 6) | (next & 0x3F);
    }
    // Overlong forms, surrogates and code points past Unicode are not UTF-8.
    static const uint32_t kMinimum[] = {0, 0, 0x80, 0x800, 0x10000};
    if (code < kMinimum[length] || code > 0x10FFFF || (code >= 0xD800 && code <= 0xDFFF)) return false;
    i += length;
  }
  return true;
}

Json::Value Hit(const std::string& index, const std::string& path, size_t number) {
  Json::Value hit(Json::objectValue);
  hit["_index"] = index;
  hit["_id"] = std::to_string(number);
  hit["_score"] = 1.0;
  hit["_source"]["path"]["real"] = path;
  return hit;
}

}  // namespace

std::string WriteSearchAnswer(const std::string& index, int64_t total, const std::vector<std::string>& paths,
                              int took_ms) {
  Json::Value answer(Json::objectValue);
  answer["took"] = took_ms;
  answer["timed_out"] = false;
  Json::Value& hits = answer["hits"];
  hits["total"]["value"] = static_cast<Json::Int64>(total);
  hits["total"]["relation"] = "eq";
  hits["max_score"] = 1.0;
  hits["hits"] = Json::Value(Json::arrayValue);
  // The envelope, then each hit as long as the whole stays under the limit
  // (each hit's own text plus its separating comma).
  size_t bytes = Compact(answer).size();
  for (size_t i = 0; i < paths.size(); ++i) {
    if (!IsUtf8(paths[i])) continue;
    Json::Value hit = Hit(index, paths[i], i);
    const size_t hit_bytes = Compact(hit).size() + 1;
    if (bytes + hit_bytes > kMaxAnswerBytes) break;
    bytes += hit_bytes;
    hits["hits"].append(std::move(hit));
  }
  return Compact(answer);
}

std::string WriteErrorAnswer(int status, const std::string& type, const std::string& reason) {
  Json::Value answer(Json::objectValue);
  answer["error"]["type"] = type;
  answer["error"]["reason"] = reason;
  answer["status"] = status;
  return Compact(answer);
}

}  // namespace spotlightd
}  // namespace corvlumex
