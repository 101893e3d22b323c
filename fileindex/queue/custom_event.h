// Events the library itself queues for the indexing daemon, and the
// administrators' desktop notifications when indexing cannot go on.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

// Appends {"event", "path", "path_old", "data"} as one line to the queue of
// the share holding `full_path`, under the queue's lock, unless a pending
// reindex already covers the path. When the share or its queue cannot be
// resolved, the share is marked for a full reindex and the Error is
// rethrown. A queue file that cannot be opened loses the event silently; a
// queue lock that cannot be taken is Error 506 (the event is not written).
void AddCustomEvent(int event, const std::string& full_path, const std::string& path_old, const Json::Value& data);

// Runs the administrators' notification tool with `args`, without a shell;
// waits for it only with `wait`. Never throws: the tool's result, or negative.
int RunAdminNotifier(const std::vector<std::string>& args, bool wait);

// "error:index_no_space" to the administrators; the notification tool's result.
int SendVXMNotify();
// "error:lack_of_memory" to the administrators; the notification tool's result.
int NotifyLackOfMemory();

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
