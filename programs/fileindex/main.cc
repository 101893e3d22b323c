// fileindex: the command line over the management operations, the daemons'
// status and search.
#include <signal.h>

#include <CLI/CLI.hpp>
#include <iostream>

#include "common/error.h"
#include "common/log.h"
#include "programs/fileindex/cli_output.h"
#include "programs/fileindex/commands.h"

int main(int argc, char** argv) {
  using namespace corvlumex;
  signal(SIGPIPE, SIG_IGN);
  cli::Output output;
  bool verbose = false;
  CLI::App app{"fileindex: manage indexed folders, watch indexing and search the index"};
  app.require_subcommand(1);
  app.fallthrough();
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
  cli::AddSearchCommands(app, output);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error);
  } catch (const Error& error) {
    cli::PrintError(output, error.code, error.reason);
    return 1;
  } catch (const std::exception& error) {
    cli::PrintError(output, kErrorUnexpected, error.what());
    return 1;
  }
  return 0;
}
