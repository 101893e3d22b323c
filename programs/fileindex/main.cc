// fileindex: the command line over the management operations, the daemons'
// status and search.
#include <signal.h>

#include <CLI/CLI.hpp>
#include <iostream>

#include "common/error.h"
#include "common/log.h"
#include "programs/fileindex/argument_checks.h"
#include "programs/fileindex/cli_output.h"
#include "programs/fileindex/command_names.h"
#include "programs/fileindex/commands.h"

#ifndef FILEINDEX_VERSION
#error "FILEINDEX_VERSION comes from the build"
#endif

int main(int argc, char** argv) {
  using namespace corvlumex;
  signal(SIGPIPE, SIG_IGN);
  cli::Output output;
  bool verbose = false;
  CLI::App app{"fileindex: manage indexed folders, watch indexing and search the index", "fileindex"};
  app.require_subcommand(1);
  app.fallthrough();
  app.set_version_flag("--version", "fileindex " FILEINDEX_VERSION);
  app.add_flag("--json", output.json, "print JSON instead of tables (for scripts)");
  app.add_flag("-v,--verbose", verbose, "print the library's log lines on standard error");
  app.parse_complete_callback([&verbose] {
    if (verbose) {
      LogToStderr("fileindex");
    } else {
      // The library's failure lines repeat what the error message says.
      SetLogSink([](int, const std::string&) {});
    }
  });
  cli::AddFolderCommands(app, output);
  cli::AddAdminCommands(app, output);
  cli::AddShareCommands(app, output);
  cli::AddStatusCommand(app, output);
  cli::AddSearchCommands(app, output);
  if (argc == 1) {
    // Alone, the command line shows what it can do.
    std::cout << app.help();
    return 0;
  }
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    const std::string suggestion = cli::SuggestCommand(app, argc, argv);
    if (!suggestion.empty()) {
      std::cerr << "fileindex: " << suggestion << std::endl;
      return error.get_exit_code() == 0 ? 1 : error.get_exit_code();
    }
    return app.exit(error);
  } catch (const Error& error) {
    cli::PrintError(output, error.code, cli::ReasonOf(error.code, error.reason));
    return 1;
  } catch (const std::exception& error) {
    cli::PrintError(output, kErrorUnexpected, error.what());
    return 1;
  }
  return 0;
}
