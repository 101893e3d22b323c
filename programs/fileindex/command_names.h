// A mistyped command gets the closest command as a suggestion.
#pragma once

#include <CLI/CLI.hpp>
#include <string>

namespace corvlumex {
namespace cli {

// Damerau-free edit distance (insertions, deletions, substitutions).
size_t EditDistance(const std::string& a, const std::string& b);
// For the first word of argv that names no subcommand where one is
// expected: "unknown command "serch"; did you mean "search"?" (or the list
// of commands when none is close). Empty when every command word is known.
std::string SuggestCommand(const CLI::App& app, int argc, char** argv);

}  // namespace cli
}  // namespace corvlumex
