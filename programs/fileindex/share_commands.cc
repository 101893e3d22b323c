// share list|pause|resume|rename|migrate|check-recycle: one function per
// subcommand. The share hooks do nothing for a share without indexed
// folders; the command line says so and fails instead of reporting a
// change that did not happen.
#include <json/json.h>

#include <iostream>

#include "common/error.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "programs/fileindex/argument_checks.h"
#include "programs/fileindex/commands.h"
#include "sdk/share.h"

namespace corvlumex {
namespace cli {
namespace {

std::string IndexedShares() {
  std::string list;
  for (const std::string& name : fileindex::FolderMgr().GetIndexedShares()) list += (list.empty() ? "" : ", ") + name;
  return list.empty() ? "none" : list;
}

void RequireIndexedShare(const std::string& name, const std::string& nothing_to) {
  if (fileindex::FolderMgr().IsShareIndexed(name)) return;
  throw Error(kErrorFolderNotFound, "no folder of share " + name + " is indexed: nothing to " + nothing_to +
                                        "; the indexed shares are: " + IndexedShares());
}

void AddList(CLI::App* share, Output& output) {
  share->add_subcommand("list", "the shares and whether they are indexed")->callback([&output] {
    const fileindex::FolderMgr folders;
    const fileindex::StatusMgr status;
    Json::Value out(Json::arrayValue);
    std::vector<std::vector<std::string>> rows;
    for (const std::string& name : sdk::SDKShare::Enum()) {
      const sdk::SDKShare record(name);
      Json::Value entry(Json::objectValue);
      entry["name"] = name;
      entry["path"] = record.GetPath();
      entry["indexed"] = folders.IsShareIndexed(name);
      entry["flags"] = status.GetShareStatus(name);
      out.append(entry);
      rows.push_back({name, record.GetPath(), YesNo(folders.IsShareIndexed(name)), ShareFlags(status.GetShareStatus(name))});
    }
    if (output.json) return PrintJson(out);
    PrintTable({"SHARE", "PATH", "INDEXED", "FLAGS"}, rows);
  });
}

void ChangeShare(const Output& output, const std::string& name, bool pause) {
  PrepareChange(pause ? "share pause" : "share resume");
  RequireShare(name);
  const bool was_paused = fileindex::StatusMgr().GetShareStatus(name) & fileindex::kShareStatusPaused;
  if (pause) fileindex::SharePause(name);
  else fileindex::ShareResume(name);
  const std::string note = fileindex::FolderMgr().IsShareIndexed(name) ? "" : " (no folder of it is indexed yet)";
  if (was_paused == pause) return Done(output, "share " + name + (pause ? " was already paused" : " was not paused") + note);
  Done(output, "share " + name + (pause ? " paused" : " resumed") + note);
}

void AddRename(CLI::App* share, Output& output) {
  static std::string from, to;
  CLI::App* command = share->add_subcommand("rename", "follow a share renamed in the share registry");
  command->add_option("from", from, "the old name")->required();
  command->add_option("to", to, "the new name")->required();
  command->callback([&output] {
    PrepareChange("share rename");
    if (from == to) throw Error(kErrorBadArgument, "the old and the new share name are the same: " + from);
    RequireShare(to);
    const bool has_flags = fileindex::StatusMgr().GetShareStatus(from) != 0;
    if (!has_flags) RequireIndexedShare(from, "follow");
    size_t folders = 0;
    const fileindex::FolderMgr configured;
    for (const auto& folder : configured.Folders()) folders += folder->GetShare() == from ? 1 : 0;
    fileindex::ShareRename(from, to);
    Done(output, folders == 0 ? "the status of share " + from + " now belongs to " + to
                              : "the " + std::to_string(folders) + " indexed folder(s) of share " + from +
                                    " now belong to " + to + " (indexed again from disk)");
  });
}

void AddMigrate(CLI::App* share, Output& output) {
  static std::string name, from, to;
  CLI::App* command = share->add_subcommand("migrate", "follow a share moved to another volume");
  command->add_option("name", name, "the share")->required();
  command->add_option("from", from, "its old directory")->required();
  command->add_option("to", to, "its new directory")->required();
  command->callback([&output] {
    PrepareChange("share migrate");
    RequireShare(name);
    for (const std::string* path : {&from, &to}) {
      if (path->empty() || (*path)[0] != '/') throw Error(kErrorBadArgument, "\"" + *path + "\" is a relative path: give the directory's full path");
    }
    if (from == to) throw Error(kErrorBadArgument, "the old and the new directory are the same: " + from);
    RequireIndexedShare(name, "move");
    const std::string now = sdk::SDKShare(name).GetPath();
    if (now != to) {
      throw Error(kErrorBadArgument, "the share registry puts " + name + " at " + now + ", not at " + to +
                                         ": move the share in the registry first");
    }
    fileindex::ShareMigrate(name, from, to);
    Done(output, "share " + name + " moved from " + from + " to " + to + " (indexed again from disk)");
  });
}

void AddCheckRecycle(CLI::App* share, Output& output) {
  static std::string name;
  CLI::App* command = share->add_subcommand("check-recycle", "follow a share's recycle bin switched on or off");
  command->add_option("name", name, "the share")->required();
  command->callback([&output] {
    PrepareChange("share check-recycle");
    RequireShare(name);
    RequireIndexedShare(name, "check");
    fileindex::ShareCheckRecycle(name);
    Done(output, "recycle bin of " + name + " checked: its documents follow the bin's setting");
  });
}

}  // namespace

std::string ShareFlags(unsigned int flags) {
  std::string text;
  auto add = [&text](const char* word) { text += text.empty() ? word : std::string(", ") + word; };
  if (flags & fileindex::kShareStatusNeedReindex) add("needs reindex");
  if (flags & fileindex::kShareStatusPaused) add("paused (fileindex share resume)");
  if (flags & fileindex::kShareStatusVolumePaused) add("volume paused (fileindex volume resume)");
  if (flags & fileindex::kShareStatusHomeDisabled) add("home service off");
  return text.empty() ? "-" : text;
}

void AddShareCommands(CLI::App& app, Output& output) {
  static std::string name;
  CLI::App* share = AddCommandGroup(app, "share", "share operations: list, pause, resume, rename, migrate, check-recycle");
  AddList(share, output);
  AddPauseAndResume(share, "pause indexing of one share", "resume indexing of one share", "name", "the share", name,
                    ChangeShare, output);
  AddRename(share, output);
  AddMigrate(share, output);
  AddCheckRecycle(share, output);
}

}  // namespace cli
}  // namespace corvlumex
