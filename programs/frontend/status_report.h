// The indexing status as both front ends (the command line's --json and the
// web API) report it: the pause, whether fileindexd answers, and per indexed
// share its worker's progress, its flags and what its index holds.
#pragma once

#include <json/json.h>

namespace corvlumex {
namespace frontend {

// {"resume_time": -1 running | 0 paused until resumed | epoch seconds,
//  "notifier": "running" | "not running" | "unknown",
//  "daemons": {"corvelasticd"|"corvnotifyd"|"fileindexd":
//              {"running": bool, "problem"?: text, "start"?: command}},
//  "daemon_running": bool (fileindexd answers), "daemon_error"?: text,
//  "shares": {"<share>": {"state", "done", "todo", "rate", "eta_seconds",
//             "total_done", "total_failed", ..., "flags", "events_missed",
//             "documents" (null: unknown), "index_bytes" (null: unknown)}}}
// A daemon that does not answer is reported, not thrown.
Json::Value StatusReport();

}  // namespace frontend
}  // namespace corvlumex
