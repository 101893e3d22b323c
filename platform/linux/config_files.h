// Writing the platform's own configuration files (under SysPath): parents
// created on demand, contents replaced atomically.
#pragma once

#include <sys/types.h>

#include <string>

namespace corvlumex {
namespace platform {

// Creates the directory and its missing parents (mode 0755); true when it exists afterwards.
bool MakeDirs(const std::string& dir);

// Replaces `path` with `content` (parents created); false with the last
// platform error kPlatformErrConfig.
bool WriteConfigFile(const std::string& path, const std::string& content, mode_t mode);

// Appends one line to `path` (parents created) with a single write.
bool AppendConfigLine(const std::string& path, const std::string& line);

}  // namespace platform
}  // namespace corvlumex
