// What the command line prints: tables for people, JSON with --json, and
// errors with their code, their reason and what to do next.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

namespace corvlumex {
namespace cli {

struct Output {
  bool json = false;
};

// Prints rows under a header, each column as wide as its widest cell on a
// terminal (display width: an accented letter is one column, a CJK one two).
// Control characters in cells are shown escaped.
void PrintTable(const std::vector<std::string>& header, const std::vector<std::vector<std::string>>& rows);
// Pretty JSON on standard output.
void PrintJson(const Json::Value& value);
// "fileindex: error <code>: <reason>" on standard error (and, with --json,
// {"success": false, "error": {"code", "reason"}} on standard output). An
// empty reason is replaced by what the code means, so no error is printed
// without words.
void PrintError(const Output& output, int code, const std::string& reason);
// The words for a library code whose error came without a reason.
std::string CodeMeaning(int code);

// Columns `text` takes on a terminal (UTF-8; invalid bytes count one each).
size_t DisplayWidth(const std::string& text);
// `text` with control characters (and invalid UTF-8 bytes) as \n, \t, \xHH,
// so a file name cannot move the cursor or break a table line.
std::string Printable(const std::string& text);
// Printable, but the `kept` strings (our own bold on and off) pass as they are.
std::string PrintableKeeping(const std::string& text, const std::vector<std::string>& kept);
// Bold on (and off) when standard output is a terminal and NO_COLOR is unset.
bool UseColour();

std::string YesNo(bool value);
// 1536 -> "1.5 KiB".
std::string HumanSize(long long bytes);
// 75 -> "1m15s".
std::string HumanDuration(double seconds);
// Seconds since the epoch as local "YYYY-MM-DD HH:MM".
std::string HumanTime(long long seconds);

}  // namespace cli
}  // namespace corvlumex
