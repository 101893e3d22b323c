#include "programs/corvnotifyd/event_line.h"

#include <cstdio>

namespace corvlumex {
namespace notifyd {

void AppendJsonString(std::string& out, std::string_view text) {
  out += '"';
  size_t run = 0;
  for (size_t i = 0; i < text.size(); ++i) {
    const unsigned char c = static_cast<unsigned char>(text[i]);
    if (c >= 0x20 && c != '"' && c != '\\') continue;
    out.append(text.data() + run, i - run);
    run = i + 1;
    switch (c) {
      case '"': out += "\\\""; break;
      case '\\': out += "\\\\"; break;
      case '\b': out += "\\b"; break;
      case '\f': out += "\\f"; break;
      case '\n': out += "\\n"; break;
      case '\r': out += "\\r"; break;
      case '\t': out += "\\t"; break;
      default: {
        char escaped[8];
        snprintf(escaped, sizeof(escaped), "\\u%04x", static_cast<unsigned>(c));
        out += escaped;
      }
    }
  }
  out.append(text.data() + run, text.size() - run);
  out += '"';
}

void FormatQueueLine(std::string& out, uint32_t event, bool is_dir, std::string_view path,
                     std::string_view path_old) {
  out += "{\"event\":";
  out += std::to_string(event);
  out += is_dir ? ",\"is_dir\":true,\"path\":" : ",\"is_dir\":false,\"path\":";
  AppendJsonString(out, path);
  if (!path_old.empty()) {
    out += ",\"path_old\":";
    AppendJsonString(out, path_old);
  }
  out += "}\n";
}

}  // namespace notifyd
}  // namespace corvlumex
