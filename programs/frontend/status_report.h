// The indexing status as both front ends (the command line's --json and the
// web API) report it: the pause, whether fileindexd answers, and per indexed
// share its worker's progress and the share's flags.
#pragma once

#include <json/json.h>

namespace corvlumex {
namespace frontend {

// {"resume_time": -1 running | 0 paused until resumed | epoch seconds,
//  "daemon_running": bool, "daemon_error"?: text,
//  "shares": {"<share>": {"state", "done", "todo", "rate", "eta_seconds",
//             "total_done", "total_failed", ..., "flags"}}}
// A daemon that does not answer is reported, not thrown.
Json::Value StatusReport();

}  // namespace frontend
}  // namespace corvlumex
