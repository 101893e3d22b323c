// The list of indexed folders and its file. A FolderMgr is a snapshot: the
// constructor loads the whole file, the methods change the copy in memory
// and Save() writes it whole. It takes no lock itself: writers hold the
// folder lock (kFileIndexFoldersLockPath) around load-change-save.
#pragma once

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "common/export.h"
#include "fileindex/state/folder.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

class FolderMgr {
 public:
  // Loads the folder file; a missing file is an empty list. Error 504 when
  // it is not a JSON array, 120 for a malformed entry.
  FolderMgr();

  // Writes the list as user "root", mode 0644 (Error 505 / 502).
  void Save() const;

  // The folder whose path (share form) is exactly `path`; Error 902 when none.
  void Get(std::shared_ptr<Folder>& folder, const std::string& path) const;
  bool HasFolder(const std::string& path) const;

  // Replaces the folder of the same path, or adds it; the new folder goes to
  // the end of the list. `old` receives what must be reindexed (DiffCfg
  // against the folder that governed the path before). Error 900 past
  // kFileIndexFoldersMax folders (the list then holds the new one: do not save).
  void Upsert(std::shared_ptr<Folder>& old, std::shared_ptr<Folder> folder_new);
  // Removes the folder of that path, handing it back; Error 902 when none.
  void Delete(std::shared_ptr<Folder>& removed, const std::string& path);
  // Removes every folder of a share (judged by the share component of its
  // path, so it works after the share itself is gone) and returns them.
  std::vector<std::shared_ptr<Folder>> DeleteByShare(const std::string& share);

  // One page of folders and the total count. `sort_by` is one of the stored
  // fields ("path", "name", "document", "audio", "video", "photo", "paused",
  // "privileged", "volume_to_be_clean") or empty for the list's own order;
  // `sort_direction` is "ASC", "DESC" or empty (ASC). Names and paths sort
  // ignoring ASCII case, then by bytes; ties keep the list order. `limit` 0
  // means no limit. Error 120 for another key or direction.
  void List(std::vector<std::shared_ptr<Folder>>& folders, unsigned int& total, unsigned int offset,
            unsigned int limit, const std::string& sort_by, const std::string& sort_direction) const;

  // Names of the shares holding at least one folder, sorted.
  std::set<std::string> GetIndexedShares() const;
  bool IsShareIndexed(const std::string& share) const;

  // The folder governing an absolute path: the longest folder path that is
  // the path itself or one of its ancestors ("/" boundaries); empty when none.
  std::shared_ptr<Folder> GetMostSuitableCfg(const std::string& full_path) const;
  // Some folder is the path or an ancestor of it.
  bool IsFullPathIndexed(const std::string& full_path) const;
  // Some folder is exactly this path.
  bool IsFullPathHasOwnCfg(const std::string& full_path) const;
  // The governing folder indexes the file's category (documents, audio,
  // video, images); false for other files and when no folder governs.
  bool IsFullPathNeedMeta(const std::string& full_path) const;

  // A folder of `folder_new`'s path and name whose four content flags say
  // what to reindex: the kinds switched on or off against `cfg`, or all of
  // them when `cfg` is empty. privileged and paused are false.
  static std::shared_ptr<Folder> DiffCfg(std::shared_ptr<Folder> folder_new, std::shared_ptr<Folder> cfg);

  const std::vector<std::shared_ptr<Folder>>& Folders() const { return folders_; }

 private:
  std::vector<std::shared_ptr<Folder>> folders_;
};

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
