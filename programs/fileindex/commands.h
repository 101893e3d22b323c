// The subcommands of the command line, each group registering itself on
// the application. Every action throws corvlumex::Error on failure; main()
// prints it with its code and reason and exits non-zero.
#pragma once

#include <CLI/CLI.hpp>

#include "programs/fileindex/cli_output.h"

namespace corvlumex {
namespace cli {

// folder list|get|add|set|delete|reindex
void AddFolderCommands(CLI::App& app, Output& output);
// pause, resume, volume ..., home ..., user rename
void AddAdminCommands(CLI::App& app, Output& output);
// share list|pause|resume|rename|migrate|check-recycle
void AddShareCommands(CLI::App& app, Output& output);
// status
void AddStatusCommand(CLI::App& app, Output& output);
// search, suggest, extract
void AddSearchCommands(CLI::App& app, Output& output);

// A command that only groups subcommands ("folder", "share"): one of them
// must be given.
CLI::App* AddCommandGroup(CLI::App& app, const std::string& name, const std::string& description);
// "pause" and "resume" under `group`, each taking the argument `arg` into
// `value` and calling `change(output, value, pause)`.
using PauseChange = void (*)(const Output& output, const std::string& value, bool pause);
void AddPauseAndResume(CLI::App* group, const std::string& pause_help, const std::string& resume_help,
                       const std::string& arg, const std::string& arg_help, std::string& value, PauseChange change,
                       Output& output);

// Root and a running fileindexd, before a command that changes the
// configuration and tells fileindexd: a refusal changes nothing.
void PrepareChange(const std::string& command);
// A share's status bits in words ("paused (fileindex share resume)").
std::string ShareFlags(unsigned int flags);
// "share X paused" for people, {"success": true, "message"} with --json.
void Done(const Output& output, const std::string& message);

}  // namespace cli
}  // namespace corvlumex
