// Checks the command line makes before it calls a management operation, so
// that a bad argument changes nothing and the error says what was wrong and
// what to do next. The operations keep their own checks and codes; these
// come first because some operations accept what they cannot use (a share
// that no longer exists, a volume with no share) and report success.
#pragma once

#include <string>
#include <vector>

namespace corvlumex {
namespace cli {

// Throws Error 503 naming `command` when the effective user is not root:
// the configuration and status files are root's.
void RequireRoot(const std::string& command);

// The registry's shares as "a (/volume1/a), b (/volume1/b)".
std::string KnownShares();
// Throws Error 800 "no share named X; the shares are: ..." unless `name`
// is a share of the registry.
void RequireShare(const std::string& name);

// A folder to add: FOLDER (a full path inside a share's directory, or a
// share path /share/dir) that exists on disk and is a folder. Returns its
// share path. Throws 120 for a relative path, a missing path or a file,
// 800 for an unknown share, 903 for a path outside every share.
std::string ExistingFolder(const std::string& folder);
// A folder that is configured for indexing. Returns its share path. Throws
// 120 for a relative path, 902 (listing the indexed folders) otherwise.
std::string ConfiguredFolder(const std::string& folder);
std::vector<std::string> ConfiguredFolders(const std::vector<std::string>& folders);

// The shares whose directory lies on the volume (an absolute directory).
// Throws 120 for a relative path or a volume without any share.
std::vector<std::string> SharesOnVolume(const std::string& volume);

// The reason to print for an error the operations threw: their own, or for
// one without a reason words that name what is wrong (an unknown share:
// the indexed shares the share registry no longer lists).
std::string ReasonOf(int code, const std::string& reason);

}  // namespace cli
}  // namespace corvlumex
