// What the command line prints: tables for people, JSON with --json, and
// errors with their code and reason.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

namespace corvlumex {
namespace cli {

struct Output {
  bool json = false;
};

// Prints rows under a header, each column as wide as its widest cell.
void PrintTable(const std::vector<std::string>& header, const std::vector<std::vector<std::string>>& rows);
// Pretty JSON on standard output.
void PrintJson(const Json::Value& value);
// "fileindex: error <code>: <reason>" on standard error (and, with --json,
// {"success": false, "error": {"code", "reason"}} on standard output).
void PrintError(const Output& output, int code, const std::string& reason);

std::string YesNo(bool value);
// 1536 -> "1.5 KiB".
std::string HumanSize(long long bytes);
// 75 -> "1m15s".
std::string HumanDuration(double seconds);
// Seconds since the epoch as local "YYYY-MM-DD HH:MM".
std::string HumanTime(long long seconds);

}  // namespace cli
}  // namespace corvlumex
