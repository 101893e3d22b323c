#include <json/json.h>
#include <stdlib.h>
#include <unistd.h>

#include <iostream>

#include "common/error.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/file_type.h"
#include "platform/platform.h"
#include "programs/fileindex/commands.h"
#include "programs/frontend/search_request.h"

namespace corvlumex {
namespace cli {
namespace {

namespace elastic = fileindex::elastic;

struct SearchArgs {
  std::string query;
  bool name = false;
  bool content = false;
  std::vector<std::string> shares;
  std::string type;
  unsigned from = 0;
  unsigned size = 20;
};

Json::Value MatchClause(const std::string& field, const std::string& text) {
  Json::Value clause(Json::objectValue);
  clause["match"][field]["query"] = text;
  clause["match"][field]["operator"] = "and";
  return clause;
}

// The request of corvelasticd's "search" command for these arguments.
Json::Value SearchRequest(const SearchArgs& args) {
  frontend::SearchSpec spec;
  spec.qsl = MatchClause(args.name ? elastic::kFieldSearchFileName : args.content ? "CORVMDTextContent" : "_all", args.query);
  spec.shares = args.shares;
  spec.category = args.type;
  spec.from = args.from;
  spec.size = args.size;
  if (!args.name) {
    // Matched words in bold on a terminal, in [brackets] otherwise.
    const bool tty = isatty(STDOUT_FILENO) == 1;
    spec.highlight = true;
    spec.highlight_size = 80;
    spec.highlight_pre = tty ? "\033[1m" : "[";
    spec.highlight_post = tty ? "\033[0m" : "]";
  }
  return frontend::SearchRequest(spec);
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
    std::cout << "  " << hit["fields"][elastic::kFieldPath].asString() << ": " << snippet << "\n";
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
  search_cmd->add_option("query", search.query, "the words to look for")->required();
  auto* name = search_cmd->add_flag("--name", search.name, "search file names only");
  search_cmd->add_flag("--content", search.content, "search file content only")->excludes(name);
  search_cmd->add_option("--share", search.shares, "only in this share (repeatable)");
  search_cmd->add_option("--type", search.type, "only files of this category")
      ->check(CLI::IsMember({"document", "audio", "video", "image"}));
  search_cmd->add_option("--from", search.from, "skip this many results (paging)");
  search_cmd->add_option("--size", search.size, "show at most this many results (1-1000)")->check(CLI::Range(1, 1000));
  search_cmd->callback([&output] {
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
  suggest_cmd->add_option("--share", suggest.shares, "only in this share (repeatable)");
  suggest_cmd->add_option("--size", suggest.size, "at most this many (1-100)")->check(CLI::Range(1, 100));
  suggest_cmd->callback([&output] {
    Json::Value request(Json::objectValue);
    request["command"] = "suggest";
    if (!suggest.shares.empty()) request["data"]["ids"] = frontend::IndexIds(suggest.shares);
    request["data"]["field"] = elastic::kFieldSearchFileName;
    request["data"]["text"] = suggest.text;
    request["data"]["size"] = suggest.size;
    Json::Value answer;
    elastic::SendRequestWithRetry(answer, request);
    if (output.json) return PrintJson(answer["data"]);
    for (const Json::Value& item : answer["data"]["suggestions"]) {
      std::cout << item["term"].asString() << "  (" << item["freq"].asInt64() << ")\n";
    }
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
