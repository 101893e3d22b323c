#include "programs/fileindex/command_names.h"

#include <algorithm>
#include <vector>

namespace corvlumex {
namespace cli {
namespace {

// Closer than this many edits counts as a typing slip.
constexpr size_t kMaxSlip = 2;

std::vector<std::string> Names(const CLI::App& app) {
  std::vector<std::string> names;
  for (const CLI::App* sub : app.get_subcommands([](const CLI::App*) { return true; })) names.push_back(sub->get_name());
  return names;
}

std::string Suggestion(const std::string& prefix, const std::string& word, const std::vector<std::string>& names) {
  std::string best;
  size_t best_distance = kMaxSlip + 1;
  for (const std::string& name : names) {
    const size_t distance = EditDistance(word, name);
    if (distance < best_distance) {
      best = name;
      best_distance = distance;
    }
  }
  const std::string unknown = "unknown command \"" + prefix + word + "\"";
  if (!best.empty()) return unknown + "; did you mean \"" + prefix + best + "\"?";
  std::string list;
  for (const std::string& name : names) list += (list.empty() ? "" : ", ") + name;
  return unknown + "; the commands are: " + list + " (fileindex " + prefix + "--help)";
}

}  // namespace

size_t EditDistance(const std::string& a, const std::string& b) {
  std::vector<size_t> row(b.size() + 1);
  for (size_t j = 0; j <= b.size(); ++j) row[j] = j;
  for (size_t i = 1; i <= a.size(); ++i) {
    size_t diagonal = row[0];
    row[0] = i;
    for (size_t j = 1; j <= b.size(); ++j) {
      const size_t above = row[j];
      row[j] = std::min({row[j] + 1, row[j - 1] + 1, diagonal + (a[i - 1] == b[j - 1] ? 0 : 1)});
      diagonal = above;
    }
  }
  return row[b.size()];
}

std::string SuggestCommand(const CLI::App& app, int argc, char** argv) {
  const CLI::App* level = &app;
  std::string prefix;
  for (int i = 1; i < argc; ++i) {
    const std::string word = argv[i];
    if (word.empty() || word[0] == '-') continue;  // options of the command line itself
    if (level->get_subcommands([](const CLI::App*) { return true; }).empty()) return std::string();
    const CLI::App* next = nullptr;
    for (const CLI::App* sub : level->get_subcommands([](const CLI::App*) { return true; })) {
      if (sub->get_name() == word) next = sub;
    }
    if (next == nullptr) return Suggestion(prefix, word, Names(*level));
    prefix += word + " ";
    level = next;
  }
  return std::string();
}

}  // namespace cli
}  // namespace corvlumex
