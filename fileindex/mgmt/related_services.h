// The neighbours of indexing: the notifier's per-share queue configuration,
// the content-extraction service, fileindexd's job and SMB Spotlight; the
// removal of a share's index data; and the setting-changed notice to
// fileindexd. None takes a lock: the calling operation holds the folder lock.
#pragma once

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

class FolderMgr;

// Application name under which the library registers its monitor queues.
constexpr char kAppName[] = "fileindex";
// Event kinds asked of the notifier for each folder (bits 1, 2 and 6 to 15).
constexpr unsigned int kMonitorMask = 65478;
// The platform's metadata folders, never watched.
constexpr char kMonitorIgnore[] = "@eaDir";

// Services named by the set-up.
constexpr char kContentExtractService[] = "corvcontentextractd";
constexpr char kFileIndexDaemonJob[] = "pkg-CorvLumex-fileindexd";
constexpr char kSambaService[] = "samba";

// SetupRelatedServices(true) when at least one folder is configured, else false.
void PrepareServices();
// Starts (true) or stops (false) Spotlight, content extraction and
// fileindexd's job. Never throws: each failed step is logged and the next runs.
void SetupRelatedServices(bool enable);

// Names the shares of `folder_mgr`'s folders as the ones whose Spotlight
// searches Samba sends to our responder, and makes samba re-read its
// configuration when that changed while Spotlight is on. Never throws.
void UpdateSpotlightShares(const FolderMgr& folder_mgr);

// Writes the share's monitor-queue configuration from the folders of
// `folder_mgr` in that share ("config" null when there are none). Error 800
// for an unknown share, 502 when the platform refuses it.
void UpsertCORVNotifydCfg(const std::string& share_name, const FolderMgr& folder_mgr);
// Removes the share's monitor-queue configuration (Error 800 / 502).
void DeleteCORVNotifydCfg(const std::string& share_name);
// The same by the queue path, for a share whose record no longer answers
// for the old place (renamed, moved); `share_name` is for the message.
void DeleteCORVNotifydCfgByQueue(const std::string& queue_path, const std::string& share_name);

// Removes the share's queue files and index database under `share_path`
// (the share's own directory) and clears its status. Error 502 when a path
// cannot be composed; it stops there.
void CleanShareIndexData(const std::string& share_name, const std::string& share_path);

// "notify_setting_changed" {"share_name", "is_upsert"} to fileindexd.
void SendSettingChanged(const std::string& share_name, bool is_upsert);

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
