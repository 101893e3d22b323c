// Fixed paths and limits of the indexing state. Every absolute path here is
// a system path: callers pass it through SysPath() at the point of use, so a
// sandbox root relocates it.
#pragma once

#include <cstddef>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

// The indexed folders, a JSON array, and the lock its writers hold.
constexpr char kFileIndexFoldersCfgPath[] = "/var/packages/CorvLumex/etc/fileindex.folders";
constexpr char kFileIndexFoldersLockPath[] = "/tmp/corvlumex_cfg_folder.lock";
constexpr size_t kFileIndexFoldersMax = 1000;

// Pause state and per-share flags, a JSON object, and its writers' lock.
constexpr char kFileIndexStatusCfgPath[] = "/var/packages/CorvLumex/etc/fileindex.status";
constexpr char kFileIndexStatusLockPath[] = "/tmp/corvlumex_cfg_fi_status.lock";
// Share status bit: the share's index must be rebuilt.
constexpr unsigned int kShareStatusNeedReindex = 1;

// Command socket of fileindexd.
constexpr char kFileIndexDaemonSocketPath[] = "/var/run/fileindexd.sock";

// The platform's desktop-notification tool.
constexpr char kVXMNotifyPath[] = "/usr/corv/bin/corvvxmnotify";

// Memory counters (names of /proc/meminfo lines) that callers of
// NotifyLackOfMemory judge; this library does not read them itself.
constexpr char kMemTotal[] = "MemTotal";
constexpr char kMemFree[] = "MemFree";
constexpr char kMemCached[] = "Cached";
constexpr char kSwapTotal[] = "SwapTotal";
constexpr char kSwapFree[] = "SwapFree";

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
