// Which files and folders of a share belong in its index, judged against a
// snapshot of the folder configuration. A path is indexed when a configured
// folder governs it, none of its components below the share directory is a
// preserved or hidden name, it lies in no recycle bin and no snapshot, and,
// for a file, the governing folder indexes the file's category (files of no
// category, and folders, are always indexed by name).
#pragma once

#include <memory>
#include <string>

#include "fileindex/state/folder.h"
#include "fileindex/state/folder_mgr.h"

namespace corvlumex {
namespace fileindexd {

struct Verdict {
  bool index = false;      // the path belongs in the index
  bool need_meta = false;  // extract the category's metadata too
  std::shared_ptr<fileindex::Folder> folder;  // the governing folder, empty when none
};

class IndexRules {
 public:
  // `share_dir` is the share's own directory (/volume1/photo).
  IndexRules(const fileindex::FolderMgr& folders, const std::string& share_dir);

  Verdict Judge(const std::string& full_path, bool is_dir) const;
  // A preserved or hidden component, a recycle bin or a snapshot: nothing at
  // or below this path is indexed, whatever the folders say. Walks stop here.
  bool IsExcluded(const std::string& full_path) const;
  // Only the name's own rules (preserved or hidden name), for a walk that
  // already checked the parent.
  static bool IsExcludedName(const std::string& name);

  // Whether the folder indexes files of this category; always true for
  // files of no category.
  static bool CategoryOn(const fileindex::Folder& folder, const std::string& full_path);
  // The category of a file as a settings key ("document", "audio", "video",
  // "photo"), or empty for no category.
  static std::string CategoryKey(const std::string& full_path);

  const fileindex::FolderMgr& folders() const { return folders_; }
  const std::string& share_dir() const { return share_dir_; }

 private:
  const fileindex::FolderMgr& folders_;
  std::string share_dir_;
};

}  // namespace fileindexd
}  // namespace corvlumex
