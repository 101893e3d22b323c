// folder list|get|add|set|delete|reindex: one function per subcommand. Each
// changing command checks its arguments and that fileindexd runs before it
// calls the operation, so a refusal leaves everything as it was.
#include <json/json.h>

#include <iostream>
#include <optional>

#include "common/error.h"
#include "common/file_util.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/folder_mgr.h"
#include "programs/fileindex/argument_checks.h"
#include "programs/fileindex/commands.h"
#include "programs/fileindex/folder_support.h"
#include "programs/frontend/daemon_client.h"
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

void AddWaitOptions(CLI::App* command, FolderArgs& args, const std::string& what) {
  command->add_flag("--wait", args.wait, "wait until " + what + ", showing progress");
  command->add_option("--timeout", args.timeout, "with --wait: give up after this many seconds (0: never)")
      ->check(CLI::NonNegativeNumber);
}

// A subcommand for one folder's settings: the folder, --name, the
// categories and --wait.
CLI::App* AddSettingsCommand(CLI::App* folder, const std::string& name, const std::string& description,
                             FolderArgs& args, const std::string& name_help, const std::string& wait_until) {
  CLI::App* command = folder->add_subcommand(name, description);
  command->add_option("path", args.path, "the folder (/share/dir or its full path)")->required();
  command->add_option("--name", args.name, name_help);
  AddCategoryOptions(command, args);
  AddWaitOptions(command, args, wait_until);
  return command;
}

void PrintFolders(const Json::Value& folders, bool with_status) {
  std::vector<std::vector<std::string>> rows;
  for (const Json::Value& folder : folders) {
    std::vector<std::string> row = {folder["path"].asString(), folder["name"].asString(),
                                    YesNo(folder["document"].asBool()), YesNo(folder["audio"].asBool()),
                                    YesNo(folder["video"].asBool()), YesNo(folder["photo"].asBool())};
    if (with_status) row.push_back(folder["additional"]["status"]["text"].asString());
    rows.push_back(row);
  }
  std::vector<std::string> header = {"PATH", "NAME", "DOCUMENT", "AUDIO", "VIDEO", "PHOTO"};
  if (with_status) header.push_back("STATUS");
  PrintTable(header, rows);
}

Json::Value JsonList(const std::vector<std::string>& paths) {
  Json::Value list(Json::arrayValue);
  for (const std::string& path : paths) list.append(path);
  return list;
}

// What a changing command did, then (with --wait) the wait: one line per
// folder for people, {"success", "paths", "indexed"} for scripts. Throws
// when the wait ended before the folders were indexed.
void Finish(const Output& output, const std::string& verb, const std::vector<std::string>& paths,
            const FolderArgs& args) {
  if (!output.json) {
    for (const std::string& path : paths) std::cout << verb << " " << path << "\n";
  }
  const bool indexed = !args.wait || WaitForIndexing(paths, args.timeout, output.json);
  if (output.json) {
    Json::Value out(Json::objectValue);
    out["success"] = true;
    out["paths"] = JsonList(paths);
    if (paths.size() == 1) out["path"] = paths[0];  // as scripts read a single folder's answer
    if (args.wait) out["indexed"] = indexed;
    PrintJson(out);
  }
  if (!indexed) {
    throw Error(kErrorUnexpected, "stopped waiting before " + (paths.size() == 1 ? paths[0] + " was" : "the folders were") +
                                      " indexed; indexing goes on (fileindex status shows it)");
  }
}

void AddList(CLI::App* folder, Output& output) {
  static struct {
    unsigned offset = 0, limit = 0;
    std::string sort;
    bool desc = false;
  } list;
  CLI::App* command = folder->add_subcommand("list", "list the indexed folders with their status");
  command->add_option("--offset", list.offset, "skip this many folders");
  command->add_option("--limit", list.limit, "show at most this many (0: all)");
  command->add_option("--sort", list.sort, "sort by this key")
      ->check(CLI::IsMember({"path", "name", "document", "audio", "video", "photo", "paused"}));
  command->add_flag("--desc", list.desc, "sort descending");
  command->callback([&output] {
    Json::Value out, additional(Json::arrayValue);
    additional.append("status");
    fileindex::FolderList(out, list.offset, list.limit, list.sort, list.sort.empty() ? "" : (list.desc ? "DESC" : "ASC"),
                          additional);
    if (output.json) return PrintJson(out);
    if (out["total"].asUInt() == 0) {
      std::cout << "no folder is indexed (fileindex folder add FOLDER)\n";
      return;
    }
    PrintFolders(out["folder"], true);
    std::cout << out["total"].asUInt() << " folder(s)\n";
  });
}

void AddGet(CLI::App* folder, Output& output) {
  static std::string path;
  CLI::App* command = folder->add_subcommand("get", "show one indexed folder");
  command->add_option("path", path, "the folder (/share/dir or its full path)")->required();
  command->callback([&output] {
    Json::Value out;
    fileindex::FolderGet(out, ConfiguredFolder(path));
    if (output.json) return PrintJson(out);
    Json::Value list(Json::arrayValue);
    list.append(out);
    PrintFolders(list, false);
  });
}

void AddAdd(CLI::App* folder, Output& output) {
  static FolderArgs add;
  CLI::App* command = AddSettingsCommand(folder, "add", "index a folder (every category on unless switched off)", add,
                                         "display name (default: the folder's name)", "the folder is indexed");
  command->callback([&output] {
    // Only the first folder may be added while fileindexd is down: the
    // library starts the services then.
    RequireRoot("folder add");
    if (!fileindex::FolderMgr().Folders().empty()) PrepareChange("folder add");
    const std::string path = ExistingFolder(add.path);
    if (fileindex::FolderMgr().HasFolder(path)) {
      throw Error(kErrorDuplicatedId, path + " is already indexed (fileindex folder set " + path +
                                          " changes it, fileindex folder reindex " + path + " indexes it again)");
    }
    Json::Value list(Json::arrayValue);
    list.append(frontend::NewFolderRecord(path, Choice(add)));
    try {
      fileindex::FolderAdd(list, false);
    } catch (const Error& error) {
      // The first folder starts fileindexd; when it did not come up, the
      // folder is configured all the same and is indexed once it runs.
      if (!fileindex::FolderMgr().HasFolder(path) || frontend::DaemonRunning(frontend::Daemon::kIndexer)) throw;
      throw Error(error.code, path + " was added to the configuration, but " + frontend::NotRunningText(frontend::Daemon::kIndexer) +
                                  "; it indexes the folder when it starts");
    }
    Finish(output, "added", {path}, add);
  });
}

void AddSet(CLI::App* folder, Output& output) {
  static FolderArgs set;
  CLI::App* command = AddSettingsCommand(folder, "set", "change an indexed folder's name or categories", set,
                                         "new display name", "the change is applied");
  command->callback([&output] {
    PrepareChange("folder set");
    const std::string path = ConfiguredFolder(set.path);
    Json::Value current;
    fileindex::FolderGet(current, path);
    Json::Value list(Json::arrayValue);
    list.append(frontend::ChangedFolderRecord(current, Choice(set)));
    fileindex::FolderSet(list, false);
    Finish(output, "changed", {path}, set);
  });
}

void AddDelete(CLI::App* folder, Output& output) {
  static std::vector<std::string> paths;
  CLI::App* command = folder->add_subcommand("delete", "stop indexing folders and remove their documents");
  command->add_option("paths", paths, "the folders (/share/dir or full paths)")->required();
  command->callback([&output] {
    PrepareChange("folder delete");
    const std::vector<std::string> checked = ConfiguredFolders(paths);
    fileindex::FolderDelete(JsonList(checked));
    Finish(output, "deleted", checked, FolderArgs());
  });
}

void AddReindex(CLI::App* folder, Output& output) {
  static FolderArgs reindex;
  static std::vector<std::string> paths;
  CLI::App* command = folder->add_subcommand("reindex", "index folders again from what is on disk");
  command->add_option("paths", paths, "the folders (/share/dir or full paths)")->required();
  AddWaitOptions(command, reindex, "they are indexed");
  command->callback([&output] {
    PrepareChange("folder reindex");
    const std::vector<std::string> checked = ConfiguredFolders(paths);
    fileindex::FolderReindex(JsonList(checked));
    Finish(output, "reindexing", checked, reindex);
  });
}

}  // namespace

void AddFolderCommands(CLI::App& app, Output& output) {
  CLI::App* folder = AddCommandGroup(app, "folder", "indexed folders: list, get, add, set, delete, reindex");
  AddList(folder, output);
  AddGet(folder, output);
  AddAdd(folder, output);
  AddSet(folder, output);
  AddDelete(folder, output);
  AddReindex(folder, output);
}

}  // namespace cli
}  // namespace corvlumex
