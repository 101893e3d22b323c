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

// A folder argument as the management operations want it (/share/dir): a
// path inside a share's directory is turned into that form, anything else
// is taken as already in it.
std::string ToSharePath(const std::string& path);

// Waits until the folders (share form) are indexed, drawing a progress bar
// on standard error unless `quiet`. Returns false when waiting stopped
// because indexing is paused or the folder is in error.
bool WaitForIndexing(const std::vector<std::string>& share_paths, double timeout_seconds, bool quiet);

}  // namespace cli
}  // namespace corvlumex
