// One share's event queue and its taken-over copy. Writers append to the
// live queue under its lock file; the indexing daemon takes the queue over
// by renaming it to "<queue>.tmp" under the same lock, builds the operation
// tree from the copy, applies it and deletes the copy (DeleteTmp). Writers
// never wait for indexing: new events go to a fresh live queue meanwhile.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

class Event;
class OP;
class OPTree;

class QueueMgr {
 public:
  explicit QueueMgr(const std::string& queue_path);
  // Releases the trees; deletes no file.
  ~QueueMgr();
  QueueMgr(const QueueMgr&) = delete;
  QueueMgr& operator=(const QueueMgr&) = delete;

  // Takes the live queue over (rename to the temporary name) unless an
  // earlier take-over is still pending, which is then processed first.
  // Error 502 when the rename fails.
  void PrepareTmpQueue();

  // The tree of the live (temporary) queue, built on the first call and kept.
  std::shared_ptr<OPTree> GetOPTree() const;
  std::shared_ptr<OPTree> GetOPTreeTmp() const;

  // Removes the temporary queue; unlink's result (a missing file is not an
  // error to the caller).
  int DeleteTmp();

  // Hands the surviving operations of the live queue (use_tmp false) or of
  // the taken-over queue (true, after PrepareTmpQueue) to `fn`; returns the
  // tree's count, 0 when the file does not exist. Deletes no file.
  unsigned ProcessOP(std::function<void(std::shared_ptr<OP>)> fn, bool use_tmp);

  // A pending event (live or temporary queue) names the path or something
  // below it, as its new or its old path.
  bool IsFullPathProcessing(const std::string& full_path);
  // A pending reindex covers the path: the reindexed folder is the path
  // itself or one of its ancestors.
  bool IsFullPathHasReindex(const std::string& full_path);

  // A pending crash marker (live or temporary queue): events of the share
  // were lost, and the whole share is (or is about to be) checked against
  // the disk. Errors as for the scans above.
  bool HasLostEvents();

  const std::string& GetQueuePath() const { return queue_path_; }
  const std::string& GetQueuePathTmp() const { return queue_path_tmp_; }

 private:
  // True when some event of the file `path` satisfies `predicate`; false
  // for a missing file. Error 502 when it cannot be opened, 906 (or 120)
  // for a malformed line.
  bool FindQueue(const std::function<bool(std::shared_ptr<Event>)>& predicate, const std::string& path);

  std::string queue_path_;
  std::string queue_path_tmp_;
  mutable std::shared_ptr<OPTree> op_tree_;
  mutable std::shared_ptr<OPTree> op_tree_tmp_;
};

// Appends one event line to a queue file under the queue's lock, so that a
// take-over never loses it. The file is created when missing; false when it
// cannot be opened or written (nothing is thrown for that). Error 506 when
// the lock stays held by others past its retries: the line is not written.
bool AppendQueueLine(const std::string& queue_path, const std::string& line);

// Appends `lines` (whole lines, each ended by "\n") in one write under the
// queue's lock. On failure the file is cut back to its former length, so no
// half line is left, and false is returned with `error` set.
bool AppendQueueLines(const std::string& queue_path, const std::string& lines, std::string* error);

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
