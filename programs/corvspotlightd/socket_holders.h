// Which processes hold a socket, and whether each may act as a given set of
// users. Samba's Spotlight server opens its connection while it acts as the
// SMB user (its socket belongs to that user), but keeps root as its saved
// user id to switch back: such a process is root, which no other local user
// can pretend to be. Reading other processes' descriptors needs root.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <set>
#include <vector>

namespace corvlumex {
namespace spotlightd {

// The processes with a descriptor of the socket whose inode is `inode`
// (from /proc/<pid>/fd).
std::vector<pid_t> ProcessesHoldingSocket(uint64_t inode);

// True when the process's real, effective or saved user id is one of
// `users` (from /proc/<pid>/status); false when it cannot be read.
bool ProcessMayActAs(pid_t pid, const std::set<uid_t>& users);

}  // namespace spotlightd
}  // namespace corvlumex
