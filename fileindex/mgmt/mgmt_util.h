// Pieces shared by the management operations: the folder lock, the reading
// of path lists, and the small index and daemon steps they repeat.
#pragma once

#include <json/json.h>

#include <memory>
#include <string>
#include <vector>

#include "common/lock_file.h"

namespace corvlumex {
namespace fileindex {

class Folder;
class FolderMgr;

// The folder configuration lock, held by every management operation that
// reads and changes fileindex.folders.
class FolderLock {
 public:
  FolderLock();

 private:
  LockFile lock_;
};

// The share paths named by a request, an array (the caller checks that)
// whose elements are share paths or objects with a "path". Repeated paths
// count once. Error 120 for any other element, an empty path included.
std::vector<std::string> RequestPaths(const Json::Value& path_list);

// The folders of one share, in the manager's order.
std::vector<std::shared_ptr<Folder>> FoldersOfShare(const FolderMgr& folder_mgr, const std::string& share_name);

// The queue file of a share whose own directory is `share_dir` (the share
// may have left that directory already). Error 502 when it cannot be composed.
std::string ComposeQueuePath(const std::string& share_dir);

// Queues a reindex of the folder at `full_path` (and below) in its share's queue.
void QueueReindex(const std::string& full_path);

// Queues a reindex of each folder, its full path derived afresh from the
// share as it is now (not from a record made before a share moved).
void QueueFoldersReindex(const std::vector<std::shared_ptr<Folder>>& folders);

// Removes the document of `full_path` and every document below it from the
// share's index.
void IndexDelTree(const std::string& share_name, const std::string& full_path);

// Marks the share's index for a rebuild after a step failed half-way, so that
// the index is not trusted while it disagrees with the folder file. Logs;
// never throws (it runs while another error is on its way out).
void MarkNeedReindex(const std::string& share_name);

// "worker_create" / "worker_delete" {"share_name"} to fileindexd.
void SendWorkerCommand(const std::string& command, const std::string& share_name);

}  // namespace fileindex
}  // namespace corvlumex
