#include <json/json.h>
#include <stdlib.h>
#include <unistd.h>

#include <iostream>
#include <sstream>

#include "common/error.h"
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

// Points the query's text clauses (those on "_all") at file names only:
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
  if ((kind != "match" && kind != "match_phrase" && kind != "prefix") || !body.isMember("_all")) return clause;
  std::vector<std::string> parts;
  const std::string text = body["_all"].asString();
  if (kind == "match") {
    std::istringstream words(text);
    for (std::string word; words >> word;) parts.push_back(word);
  } else {
    parts.push_back(text);
  }
  Json::Value out(Json::objectValue);
  for (const std::string& part : parts) {
    Json::Value match(Json::objectValue);
    match["match"][elastic::kFieldSearchFileName] = part;
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
        out[key == "_all" ? "CORVMDTextContent" : key] = converted;
      }
    }
    return out;
  }
  return clause;
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
    const bool dir = fields["CORVMDIsDir"].asBool();
    rows.push_back({fields[elastic::kFieldPath].asString() + (dir ? "/" : ""),
                    dir ? "-" : HumanSize(fields["CORVMDFSSize"].asInt64()),
                    HumanTime(fields["CORVMDFSContentChangeDate"].asInt64())});
  }
  if (!rows.empty()) PrintTable({"PATH", "SIZE", "MODIFIED"}, rows);
  for (const Json::Value& hit : hits) {
    std::string snippet = hit["highlight"].asString();
    if (snippet.empty()) continue;
    for (char& c : snippet) {
      if (c == '\n' || c == '\r' || c == '\t') c = ' ';
    }
    // A file's own control characters are shown escaped; only our bold reaches the terminal.
    std::cout << "  " << Printable(hit["fields"][elastic::kFieldPath].asString()) << ": "
              << PrintableKeeping(snippet, {kBoldOn, kBoldOff}) << "\n";
  }
  const long long total = result["total"].asInt64();
  std::cout << total << " result(s)";
  if (total > static_cast<long long>(args.from + hits.size())) {
    std::cout << "; next page: --from " << args.from + hits.size();
  }
  std::cout << "\n";
}

}  // namespace

void AddSearchCommands(CLI::App& app, Output& output) {
  static SearchArgs search;
  CLI::App* search_cmd = app.add_subcommand("search", "search the index by file name and content");
  search_cmd->add_option("words", search.words,
                         "what to look for: words, \"a phrase\", prefix*, OR, NOT word, (groups), name:, ext:, "
                         "type:, in:, size:, modified:, owner: (see docs/search.md); put -- before words "
                         "that start with -")
      ->required();
  auto* name = search_cmd->add_flag("--name", search.name, "search file names only");
  search_cmd->add_flag("--content", search.content, "search file content only")->excludes(name);
  // One value per --share, so the words may follow it: `search --share docs saffron rice`.
  search_cmd->add_option("--share", search.shares, "only in this share (repeatable)")->allow_extra_args(false);
  search_cmd->add_option("--type", search.type, "only files of this category")
      ->check(CLI::IsMember({"document", "audio", "video", "photo"}));
  search_cmd->add_option("--from", search.from, "skip this many results (paging)");
  search_cmd->add_option("--size", search.size, "show at most this many results (1-1000)")->check(CLI::Range(1, 1000));
  search_cmd->callback([&output] {
    frontend::RequireRunning(frontend::Daemon::kSearch);
    Json::Value answer;
    elastic::SendRequestWithRetry(answer, SearchRequest(search));
    if (output.json) return PrintJson(answer["data"]);
    PrintHits(search, answer["data"]);
  });

  static struct {
    std::string text;
    std::vector<std::string> shares;
    unsigned size = 10;
  } suggest;
  CLI::App* suggest_cmd = app.add_subcommand("suggest", "file-name words that begin with TEXT");
  suggest_cmd->add_option("text", suggest.text, "the beginning of a word")->required();
  suggest_cmd->add_option("--share", suggest.shares, "only in this share (repeatable)")->allow_extra_args(false);
  suggest_cmd->add_option("--size", suggest.size, "at most this many (1-100)")->check(CLI::Range(1, 100));
  suggest_cmd->callback([&output] {
    Json::Value request(Json::objectValue);
    request["command"] = "suggest";
    if (!suggest.shares.empty()) request["data"]["ids"] = frontend::IndexIds(suggest.shares);
    request["data"]["field"] = elastic::kFieldSearchFileName;
    request["data"]["text"] = suggest.text;
    request["data"]["size"] = suggest.size;
    frontend::RequireRunning(frontend::Daemon::kSearch);
    Json::Value answer;
    elastic::SendRequestWithRetry(answer, request);
    if (output.json) return PrintJson(answer["data"]);
    for (const Json::Value& item : answer["data"]["suggestions"]) {
      std::cout << item["term"].asString() << "  (" << item["freq"].asInt64() << ")\n";
    }
  });

  static struct {
    std::vector<std::string> shares;
    unsigned from = 0;
    unsigned size = 100;
  } failed;
  CLI::App* failed_cmd = app.add_subcommand(
      "failed", "files whose content could not be read, with the reason (they are still found by name and path)");
  failed_cmd->add_option("--share", failed.shares, "only in this share (repeatable)")->allow_extra_args(false);
  failed_cmd->add_option("--from", failed.from, "skip this many files (paging)");
  failed_cmd->add_option("--size", failed.size, "show at most this many files (1-1000)")->check(CLI::Range(1, 1000));
  failed_cmd->callback([&output] {
    Json::Value data(Json::objectValue);
    if (!failed.shares.empty()) data["ids"] = frontend::IndexIds(failed.shares);
    data["query"]["qsl"]["term"][elastic::kFieldExtractionFailed] = true;
    data["from"] = failed.from;
    data["size"] = failed.size;
    data["track_total"] = true;
    data["load_field"].append(elastic::kFieldPath);
    data["load_field"].append(elastic::kFieldExtractionError);
    Json::Value request(Json::objectValue);
    request["command"] = "search";
    request["data"] = data;
    frontend::RequireRunning(frontend::Daemon::kSearch);
    Json::Value answer;
    elastic::SendRequestWithRetry(answer, request);
    if (output.json) return PrintJson(answer["data"]);
    std::vector<std::vector<std::string>> rows;
    for (const Json::Value& hit : answer["data"]["hits"]) {
      rows.push_back({hit["fields"][elastic::kFieldPath].asString(), hit["fields"][elastic::kFieldExtractionError].asString()});
    }
    if (!rows.empty()) PrintTable({"PATH", "REASON"}, rows);
    std::cout << answer["data"]["total"].asInt64() << " file(s) whose content could not be read\n";
  });

  static struct {
    std::string file;
    bool meta = false;
  } extract;
  CLI::App* extract_cmd = app.add_subcommand("extract", "print the document extraction gives for FILE, as JSON");
  extract_cmd->add_option("file", extract.file, "the file")->required();
  extract_cmd->add_flag("--meta", extract.meta, "extract music, photo and video details too");
  extract_cmd->callback([] {
    std::string path = extract.file;
    if (path.empty() || path[0] != '/') {
      char* absolute = realpath(path.c_str(), nullptr);
      if (absolute == nullptr) throw Error(kErrorBadArgument, "no such file: " + path);
      path = absolute;
      free(absolute);
    }
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

}  // namespace cli
}  // namespace corvlumex
