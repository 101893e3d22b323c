// The share registry of the Linux platform: SysPath("/etc/corvlumex/shares.json"),
// a JSON array of {"name", "path", "readonly", "encrypted", "recycle_bin",
// "hide_unreadable", "ftp_privilege", "privileges"}. It is read afresh at
// every question, so an administrator's edit counts at once.
#pragma once

#include <string>
#include <vector>

#include "platform/platform.h"

namespace corvlumex {
namespace platform {

std::string ShareRegistryPath();

// Loads and checks the whole registry. A missing file is an empty registry.
// An invalid one is refused as a whole (false, last error
// kPlatformErrRegistry with a message naming the entry and what is wrong,
// also logged), so a typo never silently hides or exposes a share.
bool LoadShareRegistry(std::vector<ShareInfo>* shares);

// Checks one registry text; `source` names it in messages. Used by LoadShareRegistry.
bool ParseShareRegistry(const std::string& text, const std::string& source, std::vector<ShareInfo>* shares,
                        std::string* problem);

// The share whose directory is `full_path` or holds it (longest match), or null.
const ShareInfo* FindShareByFullPath(const std::vector<ShareInfo>& shares, const std::string& full_path);

}  // namespace platform
}  // namespace corvlumex
