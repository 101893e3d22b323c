// The kernel's table of mounts as this process sees it (/proc/self/mountinfo).
#pragma once

#include <string>

namespace corvlumex {
namespace platform {

struct MountEntry {
  std::string mount_point;
  std::string type;    // "ext4", "fuse.sshfs", "nfs4"...
  std::string source;  // "/dev/sda1", "server:/export"...
};

// The mount that holds `path` (same device number); false when none is found.
bool FindMountOf(const std::string& path, MountEntry* entry);

// Undoes the octal escapes ("\040" for a space) of a mountinfo field.
std::string UnescapeMountField(const std::string& field);

}  // namespace platform
}  // namespace corvlumex
