// The management operations: what the web API, the command line and the
// appliance's hooks call to list, read, add, change, reindex and delete
// indexed folders, and to follow share, volume, home and user events.
//
// Every changing operation holds the folder lock (kFileIndexFoldersLockPath)
// for its whole run, checks its whole request before it changes anything (a
// refused request leaves every file, service, index and daemon untouched),
// and reports failure by throwing Error. docs/management.md describes each
// operation's steps and the state it leaves behind.
#pragma once

#include <json/json.h>

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

// Share status bits set by the pause operations, beside kShareStatusNeedReindex
// (1). The share's worker in fileindexd runs only while none of them is set.
constexpr unsigned int kShareStatusPaused = 2;          // SharePause
constexpr unsigned int kShareStatusVolumePaused = 4;    // VolumePause of the share's volume
constexpr unsigned int kShareStatusHomeDisabled = 8;    // HomeDisable ("homes" only)
constexpr unsigned int kShareStatusPauseMask =
    kShareStatusPaused | kShareStatusVolumePaused | kShareStatusHomeDisabled;

// The share that holds the users' home folders.
constexpr char kHomesShare[] = "homes";

// --- Folders ---------------------------------------------------------------

// {"folder": [...], "total": n, "offset": offset}: one page of folders, each
// with the extras named in `additional` (an array, e.g. ["status"]).
void FolderList(Json::Value& out, unsigned int offset, unsigned int limit, const std::string& sort_by,
                const std::string& sort_direction, const Json::Value& additional);
// The stored form of the folder whose share path is `path` (Error 902).
void FolderGet(Json::Value& out, const std::string& path);

// Adds / changes folders given as an array of folder objects. Updater mode
// (re-applying a saved configuration) skips the indexability check and the
// reindex events.
void FolderAdd(const Json::Value& folder_list, bool updater_mode);
void FolderSet(const Json::Value& folder_list, bool updater_mode);
void FolderUpsert(const Json::Value& folder_list, bool create, bool updater_mode);

// Queues one reindex event for each configured folder of `path_list` (an
// array of share paths, or of objects with a "path").
void FolderReindex(const Json::Value& path_list);
// Removes the folders of `path_list` (as above) and everything that indexed
// them: their documents leave the index or follow the folder that now
// governs them, a share left without folders loses its index, monitor
// configuration and index data, and the services stop when nothing is
// indexed any more.
void FolderDelete(const Json::Value& path_list);

// Rebuilds the term suggestions of every indexed share's index.
void UpdateTermSuggestion();

// --- Shares ----------------------------------------------------------------
// Called by the appliance's hooks once the change is made: the share record
// already carries the new name or directory.

// The share `share_from` is now called `share_to`.
void ShareRename(const std::string& share_from, const std::string& share_to);
// The share `share_name` moved from the directory `path_from` (on one
// volume) to `path_to` (on another); its index database follows.
void ShareMigrate(const std::string& share_name, const std::string& path_from, const std::string& path_to);
// The share's recycle bin was switched on or off: what lies in it leaves or
// enters the index as the path rules now decide.
void ShareCheckRecycle(const std::string& share_name);

// --- Pausing by share and by volume --------------------------------------
// Pause sets the status bit and, for an indexed share, asks fileindexd to
// stop the share's worker ("worker_delete"); resume clears it and asks for
// a worker again ("worker_create") once no pause bit is left. ClearPaused
// forgets the bits without telling the daemon (the share or volume is gone).
void SharePause(const std::string& share_name);
void ShareResume(const std::string& share_name);
void ShareClearPaused(const std::string& share_name);
// `volume_path` is the volume's directory (/volume1); the shares whose
// directory lies on it are paused or resumed.
void VolumePause(const std::string& volume_path);
void VolumeResume(const std::string& volume_path);
void VolumeClearPaused(const std::string& volume_path);

// --- Home folders and users -----------------------------------------------

// The users' home service was switched on / off: the folders configured in
// the "homes" share are watched and indexed again / suspended (kept, with
// their index, but not watched and without a worker).
void HomeEnable();
void HomeDisable();
// The user `user_from` is now `user_to`: folders in the old home folder
// (/homes/<user_from>...) move to the new one.
void UserRename(const std::string& user_from, const std::string& user_to);

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
