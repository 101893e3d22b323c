#include <json/json.h>
#include <time.h>

#include <iostream>

#include "common/error.h"
#include "fileindex/constants.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindex/commands.h"
#include "programs/frontend/status_report.h"
#include "sdk/share.h"

namespace corvlumex {
namespace cli {
namespace {

void Done(const Output& output, const std::string& message) {
  if (output.json) {
    Json::Value out(Json::objectValue);
    out["success"] = true;
    return PrintJson(out);
  }
  std::cout << message << "\n";
}

std::string PauseText(long long resume_time) {
  if (resume_time == 0) return "paused until resumed";
  if (resume_time > 0 && resume_time > static_cast<long long>(time(nullptr))) {
    return "paused until " + HumanTime(resume_time);
  }
  return "running";
}

std::string ShareFlags(unsigned int flags) {
  std::string text;
  auto add = [&text](const char* word) { text += text.empty() ? word : std::string(", ") + word; };
  if (flags & fileindex::kShareStatusNeedReindex) add("needs reindex");
  if (flags & fileindex::kShareStatusPaused) add("paused");
  if (flags & fileindex::kShareStatusVolumePaused) add("volume paused");
  if (flags & fileindex::kShareStatusHomeDisabled) add("home service off");
  return text.empty() ? "-" : text;
}

void Status(const Output& output) {
  const Json::Value out = frontend::StatusReport();
  const Json::Value& shares = out["shares"];
  const long long resume_time = out["resume_time"].asInt64();
  if (output.json) return PrintJson(out);

  std::cout << "indexing: " << PauseText(resume_time) << "\n";
  std::cout << "fileindexd: " << (out["daemon_running"].asBool() ? "running" : out["daemon_error"].asString()) << "\n";
  std::cout << "corvnotifyd: " << out["notifier"].asString();
  if (out["notifier"].asString() == "not running") {
    std::cout << ": changes on disk are not seen now; when it starts again, every indexed share is checked "
                 "against the disk";
  }
  std::cout << "\n";
  std::vector<std::vector<std::string>> rows;
  for (const std::string& share : shares.getMemberNames()) {
    const Json::Value& entry = shares[share];
    const bool busy = entry["state"].asString() == "indexing";
    rows.push_back({share, entry["state"].asString(),
                    busy ? std::to_string(entry["done"].asUInt64()) + "/" + std::to_string(entry["todo"].asUInt64()) : "-",
                    busy ? HumanDuration(entry["eta_seconds"].asDouble()) : "-",
                    std::to_string(entry["total_done"].asUInt64()), std::to_string(entry["total_failed"].asUInt64()),
                    HumanSize(entry["queued_bytes"].asInt64()), ShareFlags(entry["flags"].asUInt())});
  }
  if (rows.empty()) {
    std::cout << "no folder is indexed (fileindex folder add PATH)\n";
    return;
  }
  PrintTable({"SHARE", "STATE", "DONE/TODO", "LEFT", "INDEXED", "FAILED", "QUEUED", "FLAGS"}, rows);
  for (const std::string& share : shares.getMemberNames()) {
    const Json::Value& entry = shares[share];
    if (!entry["events_missed"].asBool()) continue;
    std::cout << share << ": " << (entry["state"].asString() == "indexing" ? "being checked" : "waiting to be checked")
              << " against the disk: changes may have been missed while the change notifier was not running "
                 "(or could not keep up)\n";
  }
}

}  // namespace

void AddAdminCommands(CLI::App& app, Output& output) {
  static int hours = 0;
  CLI::App* pause = app.add_subcommand("pause", "pause indexing (changes are kept and indexed on resume)");
  pause->add_option("--hours", hours, "resume by itself after this many hours (0: until resumed)")
      ->check(CLI::NonNegativeNumber);
  pause->callback([&output] {
    fileindex::StatusMgr().Pause(hours);
    Done(output, hours == 0 ? "indexing paused until resumed" : "indexing paused for " + std::to_string(hours) + " hour(s)");
  });
  app.add_subcommand("resume", "resume indexing")->callback([&output] {
    fileindex::StatusMgr().Resume();
    Done(output, "indexing resumed");
  });
  app.add_subcommand("status", "pause state and each share's indexing progress")->callback([&output] { Status(output); });

  // Shares.
  CLI::App* share = app.add_subcommand("share", "share operations: list, pause, resume, rename, migrate, check-recycle");
  share->require_subcommand(1);
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
  static std::string share_name, share_to, path_from, path_to;
  CLI::App* share_pause = share->add_subcommand("pause", "pause indexing of one share");
  share_pause->add_option("name", share_name, "the share")->required();
  share_pause->callback([&output] {
    fileindex::SharePause(share_name);
    Done(output, "share " + share_name + " paused");
  });
  CLI::App* share_resume = share->add_subcommand("resume", "resume indexing of one share");
  share_resume->add_option("name", share_name, "the share")->required();
  share_resume->callback([&output] {
    fileindex::ShareResume(share_name);
    Done(output, "share " + share_name + " resumed");
  });
  CLI::App* share_rename = share->add_subcommand("rename", "follow a share renamed in the share registry");
  share_rename->add_option("from", share_name, "the old name")->required();
  share_rename->add_option("to", share_to, "the new name")->required();
  share_rename->callback([&output] {
    fileindex::ShareRename(share_name, share_to);
    Done(output, "share " + share_name + " is now " + share_to);
  });
  CLI::App* share_migrate = share->add_subcommand("migrate", "follow a share moved to another volume");
  share_migrate->add_option("name", share_name, "the share")->required();
  share_migrate->add_option("from", path_from, "its old directory")->required();
  share_migrate->add_option("to", path_to, "its new directory")->required();
  share_migrate->callback([&output] {
    fileindex::ShareMigrate(share_name, path_from, path_to);
    Done(output, "share " + share_name + " moved to " + path_to);
  });
  CLI::App* share_recycle = share->add_subcommand("check-recycle", "follow a share's recycle bin switched on or off");
  share_recycle->add_option("name", share_name, "the share")->required();
  share_recycle->callback([&output] {
    fileindex::ShareCheckRecycle(share_name);
    Done(output, "recycle bin of " + share_name + " checked");
  });

  // Volumes, home folders, users.
  static std::string volume_path;
  CLI::App* volume = app.add_subcommand("volume", "pause or resume indexing of every share on a volume");
  volume->require_subcommand(1);
  CLI::App* volume_pause = volume->add_subcommand("pause", "pause the shares of a volume");
  volume_pause->add_option("path", volume_path, "the volume's directory (/volume1)")->required();
  volume_pause->callback([&output] {
    fileindex::VolumePause(volume_path);
    Done(output, "shares on " + volume_path + " paused");
  });
  CLI::App* volume_resume = volume->add_subcommand("resume", "resume the shares of a volume");
  volume_resume->add_option("path", volume_path, "the volume's directory (/volume1)")->required();
  volume_resume->callback([&output] {
    fileindex::VolumeResume(volume_path);
    Done(output, "shares on " + volume_path + " resumed");
  });
  CLI::App* home = app.add_subcommand("home", "follow the home folder service switched on or off");
  home->require_subcommand(1);
  home->add_subcommand("enable", "the home service was switched on")->callback([&output] {
    fileindex::HomeEnable();
    Done(output, "home folders indexed again");
  });
  home->add_subcommand("disable", "the home service was switched off")->callback([&output] {
    fileindex::HomeDisable();
    Done(output, "home folders suspended");
  });
  static std::string user_from, user_to;
  CLI::App* user = app.add_subcommand("user", "follow a renamed user");
  user->require_subcommand(1);
  CLI::App* user_rename = user->add_subcommand("rename", "the user's home folder moved with the new name");
  user_rename->add_option("from", user_from, "the old user name")->required();
  user_rename->add_option("to", user_to, "the new user name")->required();
  user_rename->callback([&output] {
    fileindex::UserRename(user_from, user_to);
    Done(output, "folders of " + user_from + " moved to " + user_to);
  });
}

}  // namespace cli
}  // namespace corvlumex
