// The worker's side of the conversation (worker_protocol.h): confine the
// process, then answer one request after the other until the socket closes.
#pragma once

#include "platform/linux/extract/worker_sandbox.h"

namespace corvlumex {
namespace platform {
namespace extract {

// Serves requests on `socket`; returns the process exit status (0 when the
// library closed the socket, 1 on a broken conversation or confinement).
int RunWorker(int socket, const WorkerLimits& limits);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
