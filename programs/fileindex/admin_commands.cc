// pause, resume, volume pause|resume, home enable|disable, user rename: one
// function per subcommand. Each says what it changed, and what it found
// already so.
#include <json/json.h>
#include <time.h>

#include <iostream>

#include "common/error.h"
#include "common/path_below.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/state/folder_mgr.h"
#include "fileindex/state/status_mgr.h"
#include "programs/fileindex/argument_checks.h"
#include "programs/fileindex/commands.h"
#include "programs/frontend/daemon_client.h"

namespace corvlumex {
namespace cli {
namespace {

std::string Joined(const std::vector<std::string>& names) {
  std::string text;
  for (const std::string& name : names) text += (text.empty() ? "" : ", ") + name;
  return text;
}

void AddPause(CLI::App& app, Output& output) {
  static int hours = 0;
  CLI::App* command = app.add_subcommand("pause", "pause indexing (changes are kept and indexed on resume)");
  command->add_option("--hours", hours, "resume by itself after this many hours (0: until resumed)")
      ->check(CLI::NonNegativeNumber);
  command->callback([&output] {
    PrepareChange("pause");
    fileindex::StatusMgr().Pause(hours);
    const long long until = fileindex::StatusMgr().GetPauseInfo();
    Done(output, hours == 0 ? "indexing paused until resumed (fileindex resume)"
                            : "indexing paused until " + HumanTime(until) + " (fileindex resume ends it sooner)");
  });
}

void AddResume(CLI::App& app, Output& output) {
  app.add_subcommand("resume", "resume indexing")->callback([&output] {
    PrepareChange("resume");
    const long long before = fileindex::StatusMgr().GetPauseInfo();
    const bool was_paused = before == 0 || (before > 0 && before > static_cast<long long>(time(nullptr)));
    fileindex::StatusMgr().Resume();
    Done(output, was_paused ? "indexing resumed" : "indexing was not paused; it goes on");
  });
}

// Pauses or resumes every share on a volume, saying which changed.
void ChangeVolume(const Output& output, const std::string& volume, bool pause) {
  PrepareChange(pause ? "volume pause" : "volume resume");
  const std::vector<std::string> shares = SharesOnVolume(volume);
  std::vector<std::string> changed, unchanged;
  const fileindex::StatusMgr before;
  for (const std::string& share : shares) {
    const bool paused = before.GetShareStatus(share) & fileindex::kShareStatusVolumePaused;
    (paused == pause ? unchanged : changed).push_back(share);
  }
  if (pause) fileindex::VolumePause(volume);
  else fileindex::VolumeResume(volume);
  const std::string verb = pause ? "paused" : "resumed";
  std::string message;
  if (!changed.empty()) message = verb + " the shares on " + volume + ": " + Joined(changed);
  if (!unchanged.empty()) {
    message += (message.empty() ? "" : "; ") + std::string(pause ? "already paused: " : "not paused by the volume: ") +
               Joined(unchanged);
  }
  Done(output, message);
}

void AddVolume(CLI::App& app, Output& output) {
  static std::string path;
  CLI::App* volume = AddCommandGroup(app, "volume", "pause or resume indexing of every share on a volume");
  AddPauseAndResume(volume, "pause the shares of a volume", "resume the shares of a volume", "path",
                    "the volume's directory (/volume1)", path, ChangeVolume, output);
}

void AddHome(CLI::App& app, Output& output) {
  CLI::App* home = AddCommandGroup(app, "home", "follow the home folder service switched on or off");
  auto change = [&output](bool enable) {
    PrepareChange(enable ? "home enable" : "home disable");
    const bool indexed = fileindex::FolderMgr().IsShareIndexed(fileindex::kHomesShare);
    const bool disabled = fileindex::StatusMgr().GetShareStatus(fileindex::kHomesShare) & fileindex::kShareStatusHomeDisabled;
    if (enable) fileindex::HomeEnable();
    else fileindex::HomeDisable();
    if (!indexed) return Done(output, "no home folder is indexed: nothing to " + std::string(enable ? "resume" : "suspend"));
    if (enable == !disabled) return Done(output, std::string("home folders were already ") + (enable ? "indexed" : "suspended"));
    Done(output, enable ? "home folders indexed again" : "home folders suspended");
  };
  home->add_subcommand("enable", "the home service was switched on")->callback([change] { change(true); });
  home->add_subcommand("disable", "the home service was switched off")->callback([change] { change(false); });
}

void AddUser(CLI::App& app, Output& output) {
  static std::string from, to;
  CLI::App* user = AddCommandGroup(app, "user", "follow a renamed user");
  CLI::App* rename = user->add_subcommand("rename", "the user's home folder moved with the new name");
  rename->add_option("from", from, "the old user name")->required();
  rename->add_option("to", to, "the new user name")->required();
  rename->callback([&output] {
    PrepareChange("user rename");
    if (from == to) throw Error(kErrorBadArgument, "the old and the new user name are the same: " + from);
    const std::string home = std::string("/") + fileindex::kHomesShare + "/" + from;
    size_t moved = 0;
    const fileindex::FolderMgr configured;
    for (const auto& folder : configured.Folders()) {
      const std::string& path = folder->GetPath();
      if (IsPathAtOrBelow(path, home)) ++moved;
    }
    if (moved == 0) throw Error(kErrorFolderNotFound, "no indexed folder lies in the home of " + from + " (" + home + ")");
    fileindex::UserRename(from, to);
    Done(output, "moved " + std::to_string(moved) + " folder(s) of " + from + " to the home of " + to);
  });
}

}  // namespace

CLI::App* AddCommandGroup(CLI::App& app, const std::string& name, const std::string& description) {
  CLI::App* group = app.add_subcommand(name, description);
  group->require_subcommand(1);
  return group;
}

void AddPauseAndResume(CLI::App* group, const std::string& pause_help, const std::string& resume_help,
                       const std::string& arg, const std::string& arg_help, std::string& value, PauseChange change,
                       Output& output) {
  CLI::App* pause = group->add_subcommand("pause", pause_help);
  pause->add_option(arg, value, arg_help)->required();
  pause->callback([&output, &value, change] { change(output, value, true); });
  CLI::App* resume = group->add_subcommand("resume", resume_help);
  resume->add_option(arg, value, arg_help)->required();
  resume->callback([&output, &value, change] { change(output, value, false); });
}

void PrepareChange(const std::string& command) {
  RequireRoot(command);
  frontend::RequireRunning(frontend::Daemon::kIndexer, "nothing was changed");
}

void Done(const Output& output, const std::string& message) {
  if (output.json) {
    Json::Value out(Json::objectValue);
    out["success"] = true;
    out["message"] = message;
    return PrintJson(out);
  }
  std::cout << message << "\n";
}

void AddAdminCommands(CLI::App& app, Output& output) {
  AddPause(app, output);
  AddResume(app, output);
  AddVolume(app, output);
  AddHome(app, output);
  AddUser(app, output);
}

}  // namespace cli
}  // namespace corvlumex
