#include "programs/fileindexd/op_applier.h"

#include <malloc.h>
#include <sys/stat.h>

#include <atomic>
#include <cerrno>
#include <exception>
#include <mutex>
#include <thread>
#include <unordered_set>

#include "common/file_util.h"
#include "common/json_util.h"
#include "common/log.h"
#include "fileindex/elastic/daemon_codes.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "programs/fileindexd/folder_walker.h"

namespace corvlumex {
namespace fileindexd {
namespace elastic = fileindex::elastic;

namespace {

using Kind = OpApplier::Kind;

Kind KindOf(const std::string& path) {
  struct stat st;
  if (lstat(path.c_str(), &st) != 0) {
    errno = 0;
    return Kind::kMissing;
  }
  return S_ISDIR(st.st_mode) ? Kind::kDir : Kind::kFile;
}

long long IntField(const Json::Value& doc, const char* name) {
  const Json::Value& value = doc[name];
  return value.isIntegral() ? value.asInt64() : -1;
}

// A large document passes through several copies (its JSON value, its
// text, the answer) on the walk's and the sender's threads; the heap would
// keep that peak for good. Handing it back costs little beside the request.
class TrimAfterLargeBatch {
 public:
  explicit TrimAfterLargeBatch(size_t bytes) : large_(bytes >= kLargeBatchBytes) {}
  ~TrimAfterLargeBatch() {
    if (large_) malloc_trim(0);
  }
  TrimAfterLargeBatch(const TrimAfterLargeBatch&) = delete;
  TrimAfterLargeBatch& operator=(const TrimAfterLargeBatch&) = delete;

 private:
  static constexpr size_t kLargeBatchBytes = size_t{1} << 20;
  bool large_;
};

}  // namespace

bool IsBatchError(const Error& error) {
  switch (static_cast<int>(error.code)) {
    case kErrorSearchRequest:  // the daemon cannot be reached or answered nonsense
    case kErrorNoSpace:
    // the search daemon's codes that concern the index as a whole
    case elasticd::kCodeBusy:
    case elasticd::kCodeOpening:
    case elasticd::kCodeIndexNotFound:
    case elasticd::kCodeIndexFailed:
    case elasticd::kCodeStorage:
    case elasticd::kCodeNoSpace:
      return true;
    default:
      return false;
  }
}

OpApplier::OpApplier(const std::string& share, const IndexRules& rules, ProgressBoard& progress,
                     SettleTracker& settle)
    : share_(share), rules_(rules), progress_(progress), settle_(settle) {}

void OpApplier::RunOrSkipFile(const std::string& what, const std::string& path, const std::function<void()>& step) {
  try {
    step();
  } catch (const Error& error) {
    if (IsBatchError(error)) throw;
    progress_.Failed(share_, path, what + ": " + error.reason);
    CORV_LOG("%s of %s skipped: code=%d, reason=%s", what.c_str(), path.c_str(), error.code, error.reason.c_str());
  }
}

void OpApplier::Apply(const fileindex::OP& op) {
  const std::string path = op.node_->GetPath();
  switch (op.op_) {
    case fileindex::kOPUpsert: Upsert(path); break;
    case fileindex::kOPAttr: Attr(path); break;
    case fileindex::kOPDelete: Delete(path); break;
    case fileindex::kOPRename: Rename(op.path_, path); break;
    case fileindex::kOPReindex: Reindex(path); break;
    case fileindex::kOPUpdateCfg: UpdateCfg(path, op.data_); break;
    case fileindex::kOPFullReindex: FullReindex(); break;
    default: break;
  }
  progress_.Done(share_);
}

bool OpApplier::UpsertFile(const std::string& path, bool need_meta, bool settle) {
  if (settle && !settle_.Admit(path, SettleTracker::Clock::now())) return false;  // its turn comes later
  RunOrSkipFile("upsert", path, [&] {
    elastic::IndexUpsert(share_, path, need_meta);
    progress_.Extracted(share_);
  });
  return true;
}

void OpApplier::ReachOtherNames(const std::string& path, bool attributes_only) {
  struct stat st;
  if (lstat(path.c_str(), &st) != 0 || S_ISDIR(st.st_mode) || st.st_nlink < 2) {
    errno = 0;
    return;
  }
  RunOrSkipFile("update of the other names of", path, [&] {
    for (const std::string& other : elastic::IndexPathsOfFile(share_, st.st_dev, st.st_ino)) {
      struct stat other_st;
      const bool same_file = other != path && lstat(other.c_str(), &other_st) == 0 && other_st.st_dev == st.st_dev &&
                             other_st.st_ino == st.st_ino;
      errno = 0;
      if (!same_file) continue;  // moved or replaced since: its own events say what became of it
      const Verdict verdict = rules_.Judge(other, false);
      if (!verdict.index) continue;
      RunOrSkipFile(attributes_only ? "attribute update" : "upsert", other, [&] {
        if (attributes_only) {
          elastic::IndexAttr(share_, other);
        } else {
          elastic::IndexUpsert(share_, other, verdict.need_meta);
        }
        progress_.Extracted(share_);
      });
    }
  });
}

void OpApplier::DeleteTree(const std::string& path) {
  settle_.Forget(path);
  RunOrSkipFile("delete", path, [&] {
    elastic::IndexDel(share_, path);
    elastic::IndexDelDir(share_, path);
  });
}

bool OpApplier::DeleteUnlessIndexable(const std::string& path, Kind* kind, Verdict* verdict) {
  *kind = KindOf(path);
  if (*kind == Kind::kMissing) {
    // Gone again since the event; whatever the index holds of it goes too.
    DeleteTree(path);
    return false;
  }
  *verdict = rules_.Judge(path, *kind == Kind::kDir);
  if (!verdict->index) {
    Delete(path);
    return false;
  }
  return true;
}

void OpApplier::Upsert(const std::string& path) {
  Kind kind;
  Verdict verdict;
  if (!DeleteUnlessIndexable(path, &kind, &verdict)) return;
  if (UpsertFile(path, verdict.need_meta, kind == Kind::kFile) && kind == Kind::kFile) ReachOtherNames(path, false);
}

void OpApplier::UpsertSettled(const std::string& path) {
  const Kind kind = KindOf(path);
  if (kind == Kind::kMissing) return;  // its delete was (or will be) queued
  const Verdict verdict = rules_.Judge(path, kind == Kind::kDir);
  if (!verdict.index) return;
  UpsertFile(path, verdict.need_meta, false);
  if (kind == Kind::kFile) ReachOtherNames(path, false);
}

void OpApplier::Attr(const std::string& path) {
  Kind kind;
  Verdict verdict;
  if (!DeleteUnlessIndexable(path, &kind, &verdict)) return;
  if (kind == Kind::kFile && !settle_.Admit(path, SettleTracker::Clock::now())) return;
  RunOrSkipFile("attribute update", path, [&] {
    try {
      elastic::IndexAttr(share_, path);
      progress_.Extracted(share_);
    } catch (const Error& error) {
      // Never stored (its category was off, or its create was lost): store it whole.
      if (error.code != elasticd::kCodeDocumentNotFound) throw;
      elastic::IndexUpsert(share_, path, verdict.need_meta);
      progress_.Extracted(share_);
    }
  });
  if (kind == Kind::kFile) ReachOtherNames(path, true);
}

void OpApplier::Delete(const std::string& path) {
  settle_.Forget(path);
  DeleteDocument(path);
}

void OpApplier::DeleteDocument(const std::string& path) {
  RunOrSkipFile("delete", path, [&] { elastic::IndexDel(share_, path); });
}

void OpApplier::Refresh(const std::string& path) {
  const Kind kind = KindOf(path);
  if (kind == Kind::kMissing) {
    DeleteDocument(path);
    return;
  }
  if (kind == Kind::kDir) return;
  const Verdict verdict = rules_.Judge(path, false);
  if (verdict.index) UpsertFile(path, verdict.need_meta, false);
}

bool OpApplier::SameSettings(const std::string& a, const std::string& b) const {
  const auto folder_a = rules_.folders().GetMostSuitableCfg(a);
  const auto folder_b = rules_.folders().GetMostSuitableCfg(b);
  if (!folder_a || !folder_b) return false;
  // A file keeps its document when the category of its new name is treated
  // alike; a changed category (a.txt -> a.mp3) asks for a fresh extraction.
  return IndexRules::CategoryKey(a) == IndexRules::CategoryKey(b) &&
         IndexRules::CategoryOn(*folder_a, a) == IndexRules::CategoryOn(*folder_b, b);
}

void OpApplier::Rename(const std::string& from, const std::string& to) {
  const Kind kind = KindOf(to);
  const bool is_dir = kind == Kind::kDir;
  const bool from_indexed = rules_.folders().GetMostSuitableCfg(from) && !rules_.IsExcluded(from);
  const Verdict verdict = rules_.Judge(to, is_dir);
  settle_.Forget(from);
  if (kind != Kind::kMissing && !verdict.index) {
    // Moved where nothing is indexed (a recycle bin, a hidden folder, a
    // category switched off): its documents leave the index.
    DeleteTree(from);
    DeleteTree(to);
    return;
  }
  bool moved = false;
  if (from_indexed) {
    RunOrSkipFile("rename", from, [&] {
      try {
        elastic::IndexRename(share_, from, to);
        moved = true;
      } catch (const Error& error) {
        // Nothing stored under the old name (it was never indexed, or the
        // queue folded a chain of renames): the new place is read from disk.
        if (error.code != elasticd::kCodeDocumentNotFound) throw;
      }
    });
  }
  // Documents still held under an old name the disk no longer has are
  // ghosts: a rename cut short by a crash and replayed, or moves of a killed
  // indexer's last request that the search daemon finished after it. No later
  // event names that path again, so they go now.
  const bool from_gone = KindOf(from) == Kind::kMissing;
  if (from_gone) DeleteTree(from);
  if (kind == Kind::kMissing) {
    // Moved on again already; the event that moved it is queued behind this one.
    return;
  }
  if (!moved) {
    if (!from_gone) DeleteTree(from);
    if (is_dir) {
      Reindex(to);
    } else {
      Upsert(to);
    }
    return;
  }
  if (is_dir) {
    // Checks the moved documents against the disk; unchanged files are not
    // extracted again, so this costs a walk and one query.
    Reindex(to);
  } else if (!SameSettings(from, to)) {
    Upsert(to);
  }
}

std::unordered_map<std::string, OpApplier::Stamp> OpApplier::LoadIndexed(const std::string& prefix) {
  const Json::Value docs =
      elastic::IndexDocumentsBelow(share_, prefix, {kFieldPath, kFieldContentChangeDate, kFieldAttributeChangeDate, kFieldFSSize});
  std::unordered_map<std::string, Stamp> indexed;
  indexed.reserve(docs.size());
  for (const Json::Value& doc : docs) {
    if (!doc[kFieldPath].isString()) continue;
    indexed[doc[kFieldPath].asString()] =
        Stamp{IntField(doc, kFieldContentChangeDate), IntField(doc, kFieldAttributeChangeDate), IntField(doc, kFieldFSSize)};
  }
  return indexed;
}

void OpApplier::Resync(const std::vector<std::string>& roots, const std::string& index_prefix) {
  std::unordered_map<std::string, Stamp> indexed = LoadIndexed(index_prefix);
  std::unordered_set<std::string> keep;
  const auto skip_dir = [this](const std::string& dir) { return rules_.IsExcluded(dir); };
  for (const std::string& root : roots) {
    const std::vector<DiskEntry> entries = WalkFolder(root, skip_dir);
    if (entries.empty()) continue;
    progress_.AddTodo(share_, entries.size());
    std::vector<Pending> work;
    for (const DiskEntry& entry : entries) {
      CheckInterrupt();
      const Verdict verdict = rules_.Judge(entry.path, entry.is_dir);
      bool unchanged = true;
      if (verdict.index) {
        keep.insert(entry.path);
        struct stat st;
        const auto stored = indexed.find(entry.path);
        unchanged = stored != indexed.end() && lstat(entry.path.c_str(), &st) == 0 &&
                    stored->second.mtime == st.st_mtime && stored->second.ctime == st.st_ctime &&
                    stored->second.size == st.st_size;
        errno = 0;
      }
      if (unchanged) {
        progress_.Done(share_);
      } else {
        work.push_back(Pending{entry.path, verdict.need_meta});
      }
    }
    UpsertMany(work);
  }
  for (const auto& [path, stamp] : indexed) {
    if (keep.count(path) != 0) continue;
    CheckInterrupt();
    Delete(path);
  }
}

void OpApplier::Reindex(const std::string& path) {
  const Kind kind = KindOf(path);
  if (kind == Kind::kMissing || !rules_.Judge(path, kind == Kind::kDir).index) {
    DeleteTree(path);
    return;
  }
  if (kind == Kind::kFile) {
    Upsert(path);
    return;
  }
  Resync({path}, path);
}

void OpApplier::UpdateCfg(const std::string& path, const Json::Value& changed) {
  bool all = true;
  std::unordered_set<std::string> categories;
  for (const char* key : {"document", "audio", "video", "photo"}) {
    bool on = false;
    GetJsonValue(on, changed, key, false);
    if (on) categories.insert(key);
    all = all && on;
  }
  if (all) {
    // A new folder: everything in it, with the files of no category.
    Reindex(path);
    return;
  }
  const auto skip_dir = [this](const std::string& dir) { return rules_.IsExcluded(dir); };
  const std::vector<DiskEntry> entries = WalkFolder(path, skip_dir);
  progress_.AddTodo(share_, entries.size());
  std::vector<Pending> work;
  for (const DiskEntry& entry : entries) {
    CheckInterrupt();
    if (!entry.is_dir && categories.count(IndexRules::CategoryKey(entry.path)) != 0) {
      const Verdict verdict = rules_.Judge(entry.path, false);
      if (verdict.index) {
        work.push_back(Pending{entry.path, verdict.need_meta});
        continue;
      }
      Delete(entry.path);
    }
    progress_.Done(share_);
  }
  UpsertMany(work);
}

void OpApplier::UpsertMany(const std::vector<Pending>& work) {
  DocumentSender sender([this](std::vector<DocumentSender::Document>& batch) { StoreBatch(batch); });
  std::atomic<size_t> next{0};
  std::atomic<bool> stop{false};
  std::mutex mutex;
  std::exception_ptr first_failure;
  const auto run = [&] {
    try {
      for (size_t i = next++; !stop && i < work.size(); i = next++) {
        CheckInterrupt();
        bool queued = false;
        RunOrSkipFile("upsert", work[i].path, [&] {
          sender.Push({work[i].path, elastic::IndexUpsertRequest(share_, work[i].path, work[i].need_meta)});
          queued = true;
        });
        if (!queued) progress_.Done(share_);  // a queued one counts once it is stored
      }
    } catch (...) {
      std::lock_guard<std::mutex> lock(mutex);
      if (!first_failure) first_failure = std::current_exception();
      stop = true;
    }
  };
  std::vector<std::thread> helpers;
  const size_t threads = std::min<size_t>(walk_threads_, work.size());
  for (size_t i = 1; i < threads; ++i) helpers.emplace_back(run);
  run();
  for (std::thread& helper : helpers) helper.join();
  // What was extracted is stored also when the walk was interrupted: the
  // commit before a pause then makes it visible.
  try {
    sender.Finish();
  } catch (...) {
    if (!first_failure) first_failure = std::current_exception();
  }
  if (first_failure) std::rethrow_exception(first_failure);
}

void OpApplier::StoreBatch(std::vector<DocumentSender::Document>& batch) {
  std::vector<std::string> requests;
  requests.reserve(batch.size());
  size_t bytes = 0;
  for (DocumentSender::Document& document : batch) {
    bytes += document.request.size();
    requests.push_back(std::move(document.request));
  }
  const TrimAfterLargeBatch trim(bytes);
  Json::Value outcomes;
  try {
    outcomes = elastic::SendRequestTexts(requests);
  } catch (const Error& error) {
    if (IsBatchError(error)) throw;
    // The daemon refused the compound as a whole: each file of it failed so.
    for (DocumentSender::Document& document : batch) {
      RunOrSkipFile("upsert", document.path, [&] { throw error; });
      progress_.Done(share_);
    }
    return;
  }
  requests.clear();
  for (Json::ArrayIndex i = 0; i < batch.size(); ++i) {
    RunOrSkipFile("upsert", batch[i].path, [&] {
      const Json::Value& outcome = outcomes[i];
      if (!outcome["success"].asBool()) {
        throw Error(static_cast<ErrorCode>(outcome["error"]["code"].asInt()),
                    "Request failed, msg=" + outcome["error"]["msg"].asString());
      }
      progress_.Extracted(share_);
    });
    progress_.Done(share_);
  }
}

void OpApplier::FullReindex() {
  // The outermost folders of the share; nested ones are walked with them.
  std::vector<std::string> roots;
  for (const auto& folder : rules_.folders().Folders()) {
    if (folder->GetShare() != share_) continue;
    const std::string full = folder->GetFullPath();
    const auto governing_parent = rules_.folders().GetMostSuitableCfg(Dirname(full));
    if (!governing_parent) roots.push_back(full);
  }
  Resync(roots, rules_.share_dir());
}

}  // namespace fileindexd
}  // namespace corvlumex
