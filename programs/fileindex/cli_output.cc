#include "programs/fileindex/cli_output.h"

#include <time.h>

#include <algorithm>
#include <cstdio>
#include <iostream>
#include <memory>

namespace corvlumex {
namespace cli {

void PrintTable(const std::vector<std::string>& header, const std::vector<std::vector<std::string>>& rows) {
  std::vector<size_t> widths(header.size(), 0);
  auto measure = [&widths](const std::vector<std::string>& row) {
    for (size_t i = 0; i < row.size() && i < widths.size(); ++i) widths[i] = std::max(widths[i], row[i].size());
  };
  measure(header);
  for (const auto& row : rows) measure(row);
  auto print = [&widths](const std::vector<std::string>& row) {
    std::string line;
    for (size_t i = 0; i < row.size() && i < widths.size(); ++i) {
      line += row[i];
      if (i + 1 < row.size()) line += std::string(widths[i] - row[i].size() + 2, ' ');
    }
    std::cout << line << "\n";
  };
  print(header);
  for (const auto& row : rows) print(row);
}

void PrintJson(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "  ";
  builder["emitUTF8"] = true;
  std::unique_ptr<Json::StreamWriter> writer(builder.newStreamWriter());
  writer->write(value, &std::cout);
  std::cout << std::endl;
}

void PrintError(const Output& output, int code, const std::string& reason) {
  std::cerr << "fileindex: error " << code << ": " << reason << std::endl;
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
