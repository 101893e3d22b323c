// Folder arguments of the command line, and waiting (with a progress bar)
// until folders are indexed.
#pragma once

#include <string>
#include <vector>

namespace corvlumex {
namespace cli {

// A folder argument as the management operations want it (/share/dir): a
// path inside a share's directory is turned into that form, anything else
// is taken as already in it.
std::string ToSharePath(const std::string& path);

// Waits until the folders (share form) are indexed, drawing a progress bar
// on standard error unless `quiet`. Returns false when waiting stopped
// because indexing is paused or the folder is in error.
bool WaitForIndexing(const std::vector<std::string>& share_paths, double timeout_seconds, bool quiet);

}  // namespace cli
}  // namespace corvlumex
