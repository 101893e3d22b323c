// The front ends' view of the three daemons: whether each one runs (told
// at once, without the library's waits for a daemon still starting), the
// command that starts it, and fileindexd's answers (the library's
// SendCommandToDaemon drops them; "status" needs them).
#pragma once

#include <json/json.h>

#include <string>

namespace corvlumex {
namespace frontend {

enum class Daemon { kIndexer, kSearch, kNotifier };

// "fileindexd", "corvelasticd", "corvnotifyd".
const char* DaemonName(Daemon daemon);
// True when the daemon answers on its socket (fileindexd, corvelasticd) or
// holds its presence lock on its configuration folder (corvnotifyd; one
// that cannot be probed counts as running). Never waits.
bool DaemonRunning(Daemon daemon);
// What starts it: FILEINDEX_START_COMMAND when set (the run command's
// wrapper sets it to its own start command), else the systemd unit.
std::string StartCommand(Daemon daemon);
// "fileindexd is not running: start it with systemctl start ...".
std::string NotRunningText(Daemon daemon);
// Throws Error 913 (corvelasticd) or 502 (the others) with NotRunningText (and `consequence`, e.g. "nothing was
// changed", when given) when the daemon does not run.
void RequireRunning(Daemon daemon, const std::string& consequence = "");

// Throws Error 502 when fileindexd cannot be reached, or the daemon's own
// code and message when it refuses the command.
Json::Value AskDaemon(const std::string& type, const Json::Value& data);

}  // namespace frontend
}  // namespace corvlumex
