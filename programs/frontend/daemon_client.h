// Asks fileindexd one command and returns its answer's data (the library's
// SendCommandToDaemon drops the answer; "status" needs it).
#pragma once

#include <json/json.h>

#include <string>

namespace corvlumex {
namespace frontend {

// Throws Error 502 when the daemon cannot be reached, or the daemon's own
// code and message when it refuses the command.
Json::Value AskDaemon(const std::string& type, const Json::Value& data);

}  // namespace frontend
}  // namespace corvlumex
