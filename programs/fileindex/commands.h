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
// pause, resume, status, share ..., volume ..., home ..., user rename
void AddAdminCommands(CLI::App& app, Output& output);
// search, suggest, extract
void AddSearchCommands(CLI::App& app, Output& output);

}  // namespace cli
}  // namespace corvlumex
