// The command client of fileindexd: one length-framed JSON request
// {"type", "data"} over its socket, and the wait for its reply.
#pragma once

#include <json/json.h>

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

// Sends {"type": command, "data": data} to fileindexd and waits for its reply.
void SendCommandToDaemon(const std::string& command, const Json::Value& data);

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
