// Confinement of the extraction worker, applied once at its start before it
// reads any file: resource limits, no network, no new programs or processes,
// and (when started as root) the identity of the unprivileged user "nobody".
#pragma once

#include <string>
#include <vector>

namespace corvlumex {
namespace platform {
namespace extract {

struct WorkerLimits {
  unsigned int memory_mb = 1024;  // address space
  unsigned int cpu_seconds = 22;  // CPU time per file
};

// Applies the confinement. Returns the steps that could not be applied (a
// kernel without user namespaces, a sanitizer build without an address-space
// limit); it throws only when a step that must hold fails.
std::vector<std::string> ConfineWorker(const WorkerLimits& limits);

// Gives the next file its own CPU allowance on top of what was used so far.
void RenewCpuAllowance(const WorkerLimits& limits);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
