// Path rules: full paths (/volume1/photo/a.jpg) and share paths (/photo/a.jpg),
// share names, share replacement inside a path, and whether a path may be
// indexed at all. Free functions without state; the share answers come from
// the platform through sdk::SDKShare.
#pragma once

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

// The first component of a share path ("/photo/x" and "/photo/" give
// "photo", "/" gives ""). Throws Error 120 for an empty path or one without
// the leading "/".
void GetShareNameByPath(std::string& share_name, const std::string& share_path);

// The full path of a share path: the share's volume followed by the share
// path. Throws Error 120 as above, 800 for an unknown share.
void GetFullPath(std::string& full_path, const std::string& share_path);

// The share holding a full path: its name and its own directory
// (/volume1/photo). Throws Error 502 when no share holds the path.
void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path, const std::string& full_path);

// Replaces the first "/<old_share>/" (the path's end counts as "/") with
// "/<new_share>/". Throws Error 120 when the old share does not occur.
std::string ReplacePathShare(const std::string& path, const std::string& new_share, const std::string& old_share);

// Inside a share's "#recycle" or a user's recycle bin in the home folders.
// Throws Error 502 when no share holds the path.
bool IsFullPathInRecycleBin(const std::string& full_path);

// Whether the full path may be indexed: not a snapshot, not on a remote,
// image or pseudo file system, in a share that can be indexed, not in a
// recycle bin, not a mount point (unless the share is encrypted), and in
// canonical form without symbolic links. Throws only when the path's share
// cannot be resolved (502) or opened (800).
bool CanFullPathBeIndexed(const std::string& full_path);

// CanFullPathBeIndexed of the share path's full path.
bool CanPathBeIndexed(const std::string& share_path);

// Names the indexer never touches: the platform's hidden metadata folders
// and ".TemporaryItems", ".CORVPPSDB", ".DS_Store" (exact, case-sensitive).
bool IsSystemPreservedFileName(const std::string& name);

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
