#include <json/json.h>

#include <iostream>
#include <optional>

#include "common/error.h"
#include "common/file_util.h"
#include "fileindex/index_mgr.h"
#include "programs/fileindex/commands.h"
#include "programs/fileindex/folder_support.h"
#include "programs/frontend/folder_request.h"

namespace corvlumex {
namespace cli {
namespace {

struct FolderArgs {
  std::string path;
  std::string name;
  // "on"/"off" as given; empty when not given.
  std::string document, audio, video, photo;
  bool wait = false;
  double timeout = 0;
};

std::optional<bool> OnOff(const std::string& value) {
  if (value.empty()) return std::nullopt;
  return value == "on" || value == "yes" || value == "true" || value == "1";
}

frontend::FolderChoice Choice(const FolderArgs& args) {
  frontend::FolderChoice choice;
  choice.name = args.name;
  choice.document = OnOff(args.document);
  choice.audio = OnOff(args.audio);
  choice.video = OnOff(args.video);
  choice.photo = OnOff(args.photo);
  return choice;
}

void AddCategoryOptions(CLI::App* command, FolderArgs& args) {
  const auto check = CLI::IsMember({"on", "off", "yes", "no", "true", "false", "1", "0"});
  command->add_option("--document", args.document, "index documents (text, office, PDF, e-books): on|off")->check(check);
  command->add_option("--audio", args.audio, "index music: on|off")->check(check);
  command->add_option("--video", args.video, "index videos: on|off")->check(check);
  command->add_option("--photo", args.photo, "index photos: on|off")->check(check);
}

void PrintFolders(const Output& output, const Json::Value& folders, bool with_status) {
  std::vector<std::vector<std::string>> rows;
  for (const Json::Value& folder : folders) {
    std::vector<std::string> row = {folder["path"].asString(), folder["name"].asString(),
                                    YesNo(folder["document"].asBool()), YesNo(folder["audio"].asBool()),
                                    YesNo(folder["video"].asBool()), YesNo(folder["photo"].asBool())};
    if (with_status) row.push_back(folder["additional"]["status"]["text"].asString());
    rows.push_back(row);
  }
  (void)output;
  std::vector<std::string> header = {"PATH", "NAME", "DOCUMENT", "AUDIO", "VIDEO", "PHOTO"};
  if (with_status) header.push_back("STATUS");
  PrintTable(header, rows);
}

Json::Value PathList(const std::vector<std::string>& paths) {
  Json::Value list(Json::arrayValue);
  for (const std::string& path : paths) list.append(ToSharePath(path));
  return list;
}

}  // namespace

void AddFolderCommands(CLI::App& app, Output& output) {
  CLI::App* folder = app.add_subcommand("folder", "indexed folders: list, get, add, set, delete, reindex");
  folder->require_subcommand(1);

  static struct {
    unsigned offset = 0, limit = 0;
    std::string sort;
    bool desc = false;
  } list;
  CLI::App* list_cmd = folder->add_subcommand("list", "list the indexed folders with their status");
  list_cmd->add_option("--offset", list.offset, "skip this many folders");
  list_cmd->add_option("--limit", list.limit, "show at most this many (0: all)");
  list_cmd->add_option("--sort", list.sort, "sort by path, name, document, audio, video, photo, paused");
  list_cmd->add_flag("--desc", list.desc, "sort descending");
  list_cmd->callback([&output] {
    Json::Value out, additional(Json::arrayValue);
    additional.append("status");
    fileindex::FolderList(out, list.offset, list.limit, list.sort, list.sort.empty() ? "" : (list.desc ? "DESC" : "ASC"),
                          additional);
    if (output.json) return PrintJson(out);
    PrintFolders(output, out["folder"], true);
    std::cout << out["total"].asUInt() << " folder(s)\n";
  });

  static std::string get_path;
  CLI::App* get_cmd = folder->add_subcommand("get", "show one indexed folder");
  get_cmd->add_option("path", get_path, "the folder (/share/dir or its full path)")->required();
  get_cmd->callback([&output] {
    Json::Value out;
    fileindex::FolderGet(out, ToSharePath(get_path));
    if (output.json) return PrintJson(out);
    Json::Value list(Json::arrayValue);
    list.append(out);
    PrintFolders(output, list, false);
  });

  static FolderArgs add;
  CLI::App* add_cmd = folder->add_subcommand("add", "index a folder (every category on unless switched off)");
  add_cmd->add_option("path", add.path, "the folder (/share/dir or its full path)")->required();
  add_cmd->add_option("--name", add.name, "display name (default: the folder's name)");
  AddCategoryOptions(add_cmd, add);
  add_cmd->add_flag("--wait", add.wait, "wait until the folder is indexed, showing progress");
  add_cmd->add_option("--timeout", add.timeout, "with --wait: give up after this many seconds (0: never)");
  add_cmd->callback([&output] {
    const std::string path = ToSharePath(add.path);
    Json::Value list(Json::arrayValue);
    list.append(frontend::NewFolderRecord(path, Choice(add)));
    fileindex::FolderAdd(list, false);
    if (!output.json) std::cout << "added " << path << "\n";
    const bool done = !add.wait || WaitForIndexing({path}, add.timeout, output.json);
    if (output.json) {
      Json::Value out(Json::objectValue);
      out["success"] = true;
      out["path"] = path;
      if (add.wait) out["indexed"] = done;
      PrintJson(out);
    }
    if (!done) throw Error(kErrorUnexpected, "stopped waiting before " + path + " was indexed");
  });

  static FolderArgs set;
  CLI::App* set_cmd = folder->add_subcommand("set", "change an indexed folder's name or categories");
  set_cmd->add_option("path", set.path, "the folder (/share/dir or its full path)")->required();
  set_cmd->add_option("--name", set.name, "new display name");
  AddCategoryOptions(set_cmd, set);
  set_cmd->add_flag("--wait", set.wait, "wait until the change is applied, showing progress");
  set_cmd->add_option("--timeout", set.timeout, "with --wait: give up after this many seconds (0: never)");
  set_cmd->callback([&output] {
    const std::string path = ToSharePath(set.path);
    Json::Value current;
    fileindex::FolderGet(current, path);
    Json::Value list(Json::arrayValue);
    list.append(frontend::ChangedFolderRecord(current, Choice(set)));
    fileindex::FolderSet(list, false);
    if (!output.json) std::cout << "changed " << path << "\n";
    const bool done = !set.wait || WaitForIndexing({path}, set.timeout, output.json);
    if (output.json) {
      Json::Value out(Json::objectValue);
      out["success"] = true;
      out["path"] = path;
      PrintJson(out);
    }
    if (!done) throw Error(kErrorUnexpected, "stopped waiting before " + path + " was indexed");
  });

  static std::vector<std::string> delete_paths;
  CLI::App* delete_cmd = folder->add_subcommand("delete", "stop indexing folders and remove their documents");
  delete_cmd->add_option("paths", delete_paths, "the folders (/share/dir or full paths)")->required();
  delete_cmd->callback([&output] {
    fileindex::FolderDelete(PathList(delete_paths));
    if (output.json) {
      Json::Value out(Json::objectValue);
      out["success"] = true;
      return PrintJson(out);
    }
    for (const auto& path : delete_paths) std::cout << "deleted " << ToSharePath(path) << "\n";
  });

  static FolderArgs reindex;
  static std::vector<std::string> reindex_paths;
  CLI::App* reindex_cmd = folder->add_subcommand("reindex", "index folders again from what is on disk");
  reindex_cmd->add_option("paths", reindex_paths, "the folders (/share/dir or full paths)")->required();
  reindex_cmd->add_flag("--wait", reindex.wait, "wait until they are indexed, showing progress");
  reindex_cmd->add_option("--timeout", reindex.timeout, "with --wait: give up after this many seconds (0: never)");
  reindex_cmd->callback([&output] {
    const Json::Value list = PathList(reindex_paths);
    fileindex::FolderReindex(list);
    std::vector<std::string> paths;
    for (const Json::Value& path : list) paths.push_back(path.asString());
    if (!output.json) std::cout << "reindexing " << paths.size() << " folder(s)\n";
    const bool done = !reindex.wait || WaitForIndexing(paths, reindex.timeout, output.json);
    if (output.json) {
      Json::Value out(Json::objectValue);
      out["success"] = true;
      PrintJson(out);
    }
    if (!done) throw Error(kErrorUnexpected, "stopped waiting before the folders were indexed");
  });
}

}  // namespace cli
}  // namespace corvlumex
