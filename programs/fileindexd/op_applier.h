// Applies the operations of a share's queue to the share's index. The table
// from operation kind to index commands is in docs/system.md; in short:
//
//   upsert      the file is extracted and stored (deleted when it vanished
//               or is no longer to be indexed)
//   attr        its file-system fields are refreshed
//   delete      its document is deleted
//   rename      the documents move (IndexRename), then a folder is checked
//               against the disk, so a chain of renames folded by the queue
//               still ends with exactly what is on disk
//   reindex     the folder is walked: what is there is stored, documents
//               of what is no longer there are deleted
//   settings    the files of the categories switched on are stored, those
//               of the categories switched off are deleted
//   full        every folder of the share is walked
//
// Errors of one file are logged and skipped; errors of the search daemon
// itself (unreachable, index missing or broken) leave Apply so the batch is
// tried again, since skipping them would lose work.
#pragma once

#include <json/json.h>

#include <functional>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "common/error.h"
#include "fileindex/queue/optree.h"
#include "programs/fileindexd/document_sender.h"
#include "programs/fileindexd/index_rules.h"
#include "programs/fileindexd/progress.h"
#include "programs/fileindexd/settle_tracker.h"

namespace corvlumex {
namespace fileindexd {

// Thrown from the interrupt check when the worker must stop or pause.
struct BatchInterrupted {};

// True for failures that concern the whole index or the search daemon
// rather than one file: the batch must be retried, not skipped.
bool IsBatchError(const Error& error);

class OpApplier {
 public:
  OpApplier(const std::string& share, const IndexRules& rules, ProgressBoard& progress, SettleTracker& settle);

  // Called between files of long walks; throws BatchInterrupted to stop.
  // It is called from several threads at once.
  void SetInterruptCheck(std::function<void()> check) { interrupt_check_ = std::move(check); }
  // Threads that extract and store the files a walk finds (at least 1):
  // extraction, which runs in its own process, then overlaps the storing.
  void SetWalkThreads(unsigned threads) { walk_threads_ = threads < 1 ? 1 : threads; }

  // One operation of the queue. Throws only batch errors and BatchInterrupted.
  void Apply(const fileindex::OP& op);

  void Upsert(const std::string& path);
  void Attr(const std::string& path);
  void Delete(const std::string& path);
  void Rename(const std::string& from, const std::string& to);
  void Reindex(const std::string& path);
  void UpdateCfg(const std::string& path, const Json::Value& changed);
  void FullReindex();
  // A file whose settle interval has passed.
  void UpsertSettled(const std::string& path);
  // A file named by a fresh event, ahead of its turn in the queue: stored,
  // or its document deleted, by what the disk has now. Folders are left to
  // their own operations, and the settle state to the in-order pass, so
  // this may run on another thread beside that pass's applier.
  void Refresh(const std::string& path);

 public:
  enum class Kind { kMissing, kFile, kDir };

 private:
  // Deletes what the index holds of a path that is gone or not to be
  // indexed; true, with its kind and verdict, when it is to be indexed.
  bool DeleteUnlessIndexable(const std::string& path, Kind* kind, Verdict* verdict);
  struct Stamp {
    long long mtime = -1, ctime = -1, size = -1;
  };
  // Runs one file's step; a per-file error is logged and counted and the
  // file skipped, a batch error goes on up.
  void RunOrSkipFile(const std::string& what, const std::string& path, const std::function<void()>& step);
  // False when the settle interval deferred it.
  bool UpsertFile(const std::string& path, bool need_meta, bool settle);
  // A file with hard links changed through `path`: its other names that the
  // index holds get the new document too (only its attributes when
  // `attributes_only`), since no event names them.
  void ReachOtherNames(const std::string& path, bool attributes_only);
  struct Pending {
    std::string path;
    bool need_meta = false;
  };
  // Upserts the files a walk found: extracted on walk_threads_ threads and
  // stored, several to a request, by a DocumentSender meanwhile; each counts
  // as done. The first batch error or interruption stops them all and leaves
  // (after what was extracted is stored, when it was an interruption).
  void UpsertMany(const std::vector<Pending>& work);
  // Stores one batch of the sender; a file the daemon refuses is logged,
  // counted and skipped, a batch error goes on up.
  void StoreBatch(std::vector<DocumentSender::Document>& batch);
  void DeleteTree(const std::string& path);
  void DeleteDocument(const std::string& path);
  // Walks `roots` and makes the documents below `index_prefix` match them.
  void Resync(const std::vector<std::string>& roots, const std::string& index_prefix);
  std::unordered_map<std::string, Stamp> LoadIndexed(const std::string& prefix);
  // A file renamed from `a` to `b` keeps its document as it is.
  bool SameSettings(const std::string& a, const std::string& b) const;
  void CheckInterrupt() {
    if (interrupt_check_) interrupt_check_();
  }

  std::string share_;
  const IndexRules& rules_;
  ProgressBoard& progress_;
  SettleTracker& settle_;
  std::function<void()> interrupt_check_;
  unsigned walk_threads_ = 1;
};

}  // namespace fileindexd
}  // namespace corvlumex
