#include <json/json.h>
#include <stdlib.h>
#include <unistd.h>

#include <functional>
#include <iostream>
#include <sstream>

#include "common/error.h"
#include "common/index_fields.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/paths/file_type.h"
#include "fileindex/query/user_query.h"
#include "platform/platform.h"
#include "programs/fileindex/commands.h"
#include "programs/frontend/daemon_client.h"
#include "programs/frontend/search_request.h"

namespace corvlumex {
namespace cli {
namespace {

namespace elastic = fileindex::elastic;

constexpr char kBoldOn[] = "\033[1m";
constexpr char kBoldOff[] = "\033[0m";

struct SearchArgs {
  std::vector<std::string> words;
  bool name = false;
  bool content = false;
  std::vector<std::string> shares;
  std::string type;
  unsigned from = 0;
  unsigned size = 20;
};

// Points the query's text clauses (those on kFieldAll) at file names only:
// each word, phrase or prefix becomes a part of the name to find.
Json::Value NamesOnly(const Json::Value& clause) {
  if (!clause.isObject() || clause.size() != 1) return clause;
  const std::string kind = clause.getMemberNames().front();
  const Json::Value& body = clause[kind];
  if (kind == "bool") {
    Json::Value out(Json::objectValue);
    for (const std::string& list : body.getMemberNames()) {
      for (const Json::Value& member : body[list]) out["bool"][list].append(NamesOnly(member));
    }
    return out;
  }
  if ((kind != "match" && kind != "match_phrase" && kind != "prefix") || !body.isMember(kFieldAll)) return clause;
  std::vector<std::string> parts;
  const std::string text = body[kFieldAll].asString();
  if (kind == "match") {
    std::istringstream words(text);
    for (std::string word; words >> word;) parts.push_back(word);
  } else {
    parts.push_back(text);
  }
  Json::Value out(Json::objectValue);
  for (const std::string& part : parts) {
    Json::Value match(Json::objectValue);
    match["match"][kFieldSearchFileName] = part;
    out["bool"]["must"].append(match);
  }
  return out;
}

// Points the query's text clauses at the content only.
Json::Value ContentOnly(const Json::Value& clause) {
  if (clause.isArray() || clause.isObject()) {
    Json::Value out(clause.type());
    for (auto member = clause.begin(); member != clause.end(); ++member) {
      const Json::Value converted = ContentOnly(*member);
      if (clause.isArray()) {
        out.append(converted);
      } else {
        const std::string key = member.name();
        out[key == kFieldAll ? kFieldTextContent : key] = converted;
      }
    }
    return out;
  }
  return clause;
}

// The "data" of corvelasticd's answer to the request `make_request` makes
// once the daemon is known to run (a daemon that is down is said first).
Json::Value AskSearchDaemon(const std::function<Json::Value()>& make_request) {
  frontend::RequireRunning(frontend::Daemon::kSearch);
  Json::Value answer;
  elastic::SendRequestWithPatience(answer, make_request());
  return answer["data"];
}

// The request of corvelasticd's "search" command for these arguments.
Json::Value SearchRequest(const SearchArgs& args) {
  // Each argument is a part of the query: `search saffron rice` and
  // `search 'saffron rice'` mean the same.
  std::string text;
  for (const std::string& word : args.words) text += (text.empty() ? "" : " ") + word;
  frontend::SearchParams params;
  try {
    params.qsl = fileindex::UserQueryToSearch(text)["qsl"];
  } catch (const fileindex::UserQuerySyntaxError& error) {
    throw Error(kErrorBadArgument, std::string(error.what()) + " (the syntax: docs/search.md)");
  }
  if (args.name) params.qsl = NamesOnly(params.qsl);
  if (args.content) params.qsl = ContentOnly(params.qsl);
  params.shares = args.shares;
  params.category = args.type;
  params.from = args.from;
  params.size = args.size;
  if (!args.name) {
    // Matched words in bold on a terminal (unless NO_COLOR), in [brackets] otherwise.
    const bool tty = UseColour();
    params.highlight = true;
    params.highlight_size = 80;
    params.highlight_pre = tty ? kBoldOn : "[";
    params.highlight_post = tty ? kBoldOff : "]";
  }
  return frontend::SearchRequest(params);
}

void PrintHits(const SearchArgs& args, const Json::Value& result) {
  const Json::Value& hits = result["hits"];
  std::vector<std::vector<std::string>> rows;
  for (const Json::Value& hit : hits) {
    const Json::Value& fields = hit["fields"];
    const bool dir = fields[kFieldIsDir].asBool();
    rows.push_back({fields[kFieldPath].asString() + (dir ? "/" : ""),
                    dir ? "-" : HumanSize(fields[kFieldFSSize].asInt64()),
                    HumanTime(fields[kFieldContentChangeDate].asInt64())});
  }
  if (!rows.empty()) PrintTable({"PATH", "SIZE", "MODIFIED"}, rows);
  for (const Json::Value& hit : hits) {
    std::string snippet = hit["highlight"].asString();
    if (snippet.empty()) continue;
    for (char& c : snippet) {
      if (c == '\n' || c == '\r' || c == '\t') c = ' ';
    }
    // A file's own control characters are shown escaped; only our bold reaches the terminal.
    std::cout << "  " << Printable(hit["fields"][kFieldPath].asString()) << ": "
              << PrintableKeeping(snippet, {kBoldOn, kBoldOff}) << "\n";
  }
  const long long total = result["total"].asInt64();
  std::cout << total << " result(s)";
  if (total > static_cast<long long>(args.from + hits.size())) {
    std::cout << "; next page: --from " << args.from + hits.size();
  }
  std::cout << "\n";
}

void AddSearch(CLI::App& app, Output& output) {
  static SearchArgs search;
  CLI::App* command = app.add_subcommand("search", "search the index by file name and content");
  command->add_option("words", search.words,
                      "what to look for: words, \"a phrase\", prefix*, OR, NOT word, (groups), name:, ext:, "
                      "type:, in:, size:, modified:, owner: (see docs/search.md); put -- before words "
                      "that start with -")
      ->required();
  auto* name = command->add_flag("--name", search.name, "search file names only");
  command->add_flag("--content", search.content, "search file content only")->excludes(name);
  // One value per --share, so the words may follow it: `search --share docs saffron rice`.
  command->add_option("--share", search.shares, "only in this share (repeatable)")->allow_extra_args(false);
  command->add_option("--type", search.type, "only files of this category")
      ->check(CLI::IsMember({"document", "audio", "video", "photo"}));
  command->add_option("--from", search.from, "skip this many results (paging)");
  command->add_option("--size", search.size, "show at most this many results (1-1000)")->check(CLI::Range(1, 1000));
  command->callback([&output] {
    const Json::Value answer = AskSearchDaemon([] { return SearchRequest(search); });
    if (output.json) return PrintJson(answer);
    PrintHits(search, answer);
  });
}

void AddSuggest(CLI::App& app, Output& output) {
  static struct {
    std::string text;
    std::vector<std::string> shares;
    unsigned size = 10;
  } suggest;
  CLI::App* command = app.add_subcommand("suggest", "file-name words that begin with TEXT");
  command->add_option("text", suggest.text, "the beginning of a word")->required();
  command->add_option("--share", suggest.shares, "only in this share (repeatable)")->allow_extra_args(false);
  command->add_option("--size", suggest.size, "at most this many (1-100)")->check(CLI::Range(1, 100));
  command->callback([&output] {
    const Json::Value answer = AskSearchDaemon([] { return frontend::SuggestRequest(suggest.shares, suggest.text, suggest.size); });
    if (output.json) return PrintJson(answer);
    for (const Json::Value& item : answer["suggestions"]) {
      std::cout << item["term"].asString() << "  (" << item["freq"].asInt64() << ")\n";
    }
  });
}

// The request of corvelasticd's "search" command for the files whose
// content could not be read.
Json::Value FailedRequest(const std::vector<std::string>& shares, unsigned from, unsigned size) {
  Json::Value data(Json::objectValue);
  if (!shares.empty()) data["ids"] = frontend::IndexIds(shares);
  data["query"]["qsl"]["term"][kFieldExtractionFailed] = true;
  data["from"] = from;
  data["size"] = size;
  data["track_total"] = true;
  data["load_field"].append(kFieldPath);
  data["load_field"].append(kFieldExtractionError);
  Json::Value request(Json::objectValue);
  request["command"] = "search";
  request["data"] = data;
  return request;
}

void AddFailed(CLI::App& app, Output& output) {
  static struct {
    std::vector<std::string> shares;
    unsigned from = 0;
    unsigned size = 100;
  } failed;
  CLI::App* command = app.add_subcommand(
      "failed", "files whose content could not be read, with the reason (they are still found by name and path)");
  command->add_option("--share", failed.shares, "only in this share (repeatable)")->allow_extra_args(false);
  command->add_option("--from", failed.from, "skip this many files (paging)");
  command->add_option("--size", failed.size, "show at most this many files (1-1000)")->check(CLI::Range(1, 1000));
  command->callback([&output] {
    const Json::Value answer = AskSearchDaemon([] { return FailedRequest(failed.shares, failed.from, failed.size); });
    if (output.json) return PrintJson(answer);
    std::vector<std::vector<std::string>> rows;
    for (const Json::Value& hit : answer["hits"]) {
      rows.push_back({hit["fields"][kFieldPath].asString(), hit["fields"][kFieldExtractionError].asString()});
    }
    if (!rows.empty()) PrintTable({"PATH", "REASON"}, rows);
    std::cout << answer["total"].asInt64() << " file(s) whose content could not be read\n";
  });
}

// An absolute path for `file`, which must exist when it is relative.
std::string AbsolutePath(const std::string& file) {
  if (!file.empty() && file[0] == '/') return file;
  char* absolute = realpath(file.c_str(), nullptr);
  if (absolute == nullptr) throw Error(kErrorBadArgument, "no such file: " + file);
  const std::string path = absolute;
  free(absolute);
  return path;
}

void AddExtract(CLI::App& app) {
  static struct {
    std::string file;
    bool meta = false;
  } extract;
  CLI::App* command = app.add_subcommand("extract", "print the document extraction gives for FILE, as JSON");
  command->add_option("file", extract.file, "the file")->required();
  command->add_flag("--meta", extract.meta, "extract music, photo and video details too");
  command->callback([] {
    const std::string path = AbsolutePath(extract.file);
    Json::Value options(Json::objectValue), document(Json::objectValue);
    options[elastic::kOptionNeedMeta] = extract.meta;
    try {
      platform::Current()->ParseFile(path, options, document);
    } catch (const Error& error) {
      throw;
    } catch (const std::exception& error) {
      throw Error(kErrorParseDocument, "Parse failed, path=" + path + ": " + error.what());
    }
    PrintJson(document);  // the document is JSON with or without --json
  });
}

}  // namespace

void AddSearchCommands(CLI::App& app, Output& output) {
  AddSearch(app, output);
  AddSuggest(app, output);
  AddFailed(app, output);
  AddExtract(app);
}

}  // namespace cli
}  // namespace corvlumex
