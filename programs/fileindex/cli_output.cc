#include "programs/fileindex/cli_output.h"

#include <stdlib.h>
#include <time.h>
#include <unistd.h>
#include <utf8proc.h>

#include <algorithm>
#include <cstdio>
#include <iostream>
#include <memory>

#include "common/error.h"

namespace corvlumex {
namespace cli {

void PrintTable(const std::vector<std::string>& header, const std::vector<std::vector<std::string>>& rows) {
  std::vector<std::vector<std::string>> cells;
  cells.push_back(header);
  for (const auto& row : rows) {
    std::vector<std::string> shown;
    for (const std::string& cell : row) shown.push_back(Printable(cell));
    cells.push_back(shown);
  }
  std::vector<size_t> widths(header.size(), 0);
  for (const auto& row : cells) {
    for (size_t i = 0; i < row.size() && i < widths.size(); ++i) widths[i] = std::max(widths[i], DisplayWidth(row[i]));
  }
  for (const auto& row : cells) {
    std::string line;
    for (size_t i = 0; i < row.size() && i < widths.size(); ++i) {
      line += row[i];
      if (i + 1 < row.size()) line += std::string(widths[i] - DisplayWidth(row[i]) + 2, ' ');
    }
    std::cout << line << "\n";
  }
}

namespace {

// Calls `each(offset, length, code_point)` for every UTF-8 sequence of
// `text`; an invalid byte comes as length 1 and code point -1.
template <typename Each>
void ForEachCodePoint(const std::string& text, Each each) {
  const auto* bytes = reinterpret_cast<const utf8proc_uint8_t*>(text.data());
  const auto size = static_cast<utf8proc_ssize_t>(text.size());
  for (utf8proc_ssize_t offset = 0; offset < size;) {
    utf8proc_int32_t code_point = -1;
    utf8proc_ssize_t length = utf8proc_iterate(bytes + offset, size - offset, &code_point);
    if (length <= 0) {
      length = 1;
      code_point = -1;
    }
    each(static_cast<size_t>(offset), static_cast<size_t>(length), code_point);
    offset += length;
  }
}

}  // namespace

size_t DisplayWidth(const std::string& text) {
  size_t width = 0;
  ForEachCodePoint(text, [&width](size_t, size_t, utf8proc_int32_t code_point) {
    width += code_point < 0 ? 1 : static_cast<size_t>(std::max(0, utf8proc_charwidth(code_point)));
  });
  return width;
}

std::string Printable(const std::string& text) {
  std::string shown;
  ForEachCodePoint(text, [&](size_t offset, size_t length, utf8proc_int32_t code_point) {
    if (code_point >= 0 && utf8proc_category(code_point) != UTF8PROC_CATEGORY_CC) {
      shown.append(text, offset, length);
      return;
    }
    if (code_point == '\n') return void(shown += "\\n");
    if (code_point == '\t') return void(shown += "\\t");
    if (code_point == '\r') return void(shown += "\\r");
    // Other controls (C1 ones are two bytes) and invalid bytes, byte by byte.
    for (size_t i = offset; i < offset + length; ++i) {
      char hex[8];
      snprintf(hex, sizeof(hex), "\\x%02x", static_cast<unsigned char>(text[i]));
      shown += hex;
    }
  });
  return shown;
}

std::string PrintableKeeping(const std::string& text, const std::vector<std::string>& kept) {
  std::string shown, plain;
  for (size_t at = 0; at < text.size();) {
    const auto marker = std::find_if(kept.begin(), kept.end(), [&](const std::string& word) {
      return !word.empty() && text.compare(at, word.size(), word) == 0;
    });
    if (marker == kept.end()) {
      plain += text[at++];
      continue;
    }
    shown += Printable(plain) + *marker;
    plain.clear();
    at += marker->size();
  }
  return shown + Printable(plain);
}

bool UseColour() {
  const char* no_colour = getenv("NO_COLOR");
  if (no_colour != nullptr && no_colour[0] != '\0') return false;
  return isatty(STDOUT_FILENO) == 1;
}

void PrintJson(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "  ";
  builder["emitUTF8"] = true;
  std::unique_ptr<Json::StreamWriter> writer(builder.newStreamWriter());
  writer->write(value, &std::cout);
  std::cout << std::endl;
}

std::string CodeMeaning(int code) {
  switch (code) {
    case kErrorBadArgument: return "bad argument";
    case kErrorShareNotFound: return "no such share (fileindex share list shows the shares)";
    case kErrorUserLookup: return "no such user";
    case kErrorFolderNotFound: return "not an indexed folder (fileindex folder list shows them)";
    case kErrorPathCannotIndex: return "this path cannot be indexed";
    case kErrorDuplicatedId: return "already indexed";
    case kErrorSearchRequest: return "the search daemon corvelasticd did not answer";
    case kErrorNoSpace: return "the volume is full";
    case kErrorLoadJson: return "a configuration file cannot be read";
    case kErrorSaveJson: return "a configuration file cannot be written";
    case kErrorLockFile: return "a lock file cannot be taken";
    case kErrorSwitchUser: return "this needs root";
    default: return "failed without a reason (fileindex -v ... shows the library's log lines)";
  }
}

void PrintError(const Output& output, int code, const std::string& given_reason) {
  const std::string reason = given_reason.empty() ? CodeMeaning(code) : given_reason;
  std::cerr << "fileindex: error " << code << ": " << Printable(reason) << std::endl;
  if (output.json) {
    Json::Value error(Json::objectValue);
    error["success"] = false;
    error["error"]["code"] = code;
    error["error"]["reason"] = reason;
    PrintJson(error);
  }
}

std::string YesNo(bool value) { return value ? "yes" : "no"; }

std::string HumanSize(long long bytes) {
  if (bytes < 0) return "-";
  const char* units[] = {"B", "KiB", "MiB", "GiB", "TiB"};
  double value = static_cast<double>(bytes);
  size_t unit = 0;
  while (value >= 1024 && unit + 1 < sizeof(units) / sizeof(units[0])) {
    value /= 1024;
    ++unit;
  }
  char text[32];
  snprintf(text, sizeof(text), unit == 0 ? "%.0f %s" : "%.1f %s", value, units[unit]);
  return text;
}

std::string HumanDuration(double seconds) {
  if (seconds < 0) return "?";
  const long long total = static_cast<long long>(seconds + 0.5);
  char text[32];
  if (total >= 3600) {
    snprintf(text, sizeof(text), "%lldh%02lldm", total / 3600, (total % 3600) / 60);
  } else if (total >= 60) {
    snprintf(text, sizeof(text), "%lldm%02llds", total / 60, total % 60);
  } else {
    snprintf(text, sizeof(text), "%llds", total);
  }
  return text;
}

std::string HumanTime(long long seconds) {
  if (seconds <= 0) return "-";
  const time_t value = static_cast<time_t>(seconds);
  struct tm local;
  localtime_r(&value, &local);
  char text[32];
  strftime(text, sizeof(text), "%Y-%m-%d %H:%M", &local);
  return text;
}

}  // namespace cli
}  // namespace corvlumex
