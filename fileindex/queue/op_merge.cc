// Folding events into the tree: the merge rules between a new operation and
// the ones already pending on its path, and the rename that carries
// pending work from the old path to the new one.
#include "common/error.h"
#include "fileindex/queue/optree.h"

namespace corvlumex {
namespace fileindex {

// The incoming handler, i.e. the column of the merge table.
enum class OPTree::Column { kCreate, kModify, kAttr, kDelete, kUpdateCfg, kReindex };

// The one OP an event hands to every handler that fires. Most events merge
// into work already pending and their OP is dropped, so it is made for real
// (in the tree's arena) only when a handler appends it; from then on every
// handler works on that same shared OP.
class OPTree::EventOP {
 public:
  // The OP of a queue line, not made yet.
  EventOP() : scratch_(nullptr, kOPNone, std::string(), Json::Value()) {}
  // An OP the caller made and hands to a handler.
  explicit EventOP(std::shared_ptr<OP> made) : scratch_(nullptr, kOPNone, std::string(), Json::Value()), made_(std::move(made)) {}

  OP& Get() { return made_ ? *made_ : scratch_; }
  const std::shared_ptr<OP>& Made(OPTree& tree, OPNode* node) {
    if (!made_) made_ = tree.MakeOP(node, scratch_.op_, scratch_.path_, scratch_.data_);
    return made_;
  }

 private:
  OP scratch_;
  std::shared_ptr<OP> made_;
};

namespace {


enum Effect : uint8_t {
  kDrop,            // the new OP is cancelled
  kKeep,            // both stay
  kToDeleteDrop,    // existing becomes a delete, new cancelled
  kToUpsertDrop,    // existing becomes an upsert, new cancelled
  kToCfgDrop,       // existing becomes update-settings with the new data, new cancelled
  kMergeCfgDrop,    // existing ORs in the new settings, new cancelled
  kToReindexDrop,   // existing becomes a reindex, new cancelled
};

// Rows: the existing OP's kind (1..6); columns: Create, Modify, Attr,
// Delete, UpdateCfg, Reindex. The asymmetries are intended: a modify after
// a delete is dropped while a create after a delete makes it an upsert, and
// a delete after update-settings or a reindex is kept as a second OP. A
// pending rename never merges: later work is appended after it.
constexpr Effect kMergeTable[7][6] = {
    /* 0 none    */ {kKeep, kKeep, kKeep, kKeep, kKeep, kKeep},
    /* 1 delete  */ {kToUpsertDrop, kDrop, kDrop, kDrop, kDrop, kDrop},
    /* 2 upsert  */ {kDrop, kDrop, kDrop, kToDeleteDrop, kToCfgDrop, kToReindexDrop},
    /* 3 attr    */ {kToUpsertDrop, kToUpsertDrop, kDrop, kToDeleteDrop, kToCfgDrop, kToReindexDrop},
    /* 4 cfg     */ {kDrop, kDrop, kDrop, kKeep, kMergeCfgDrop, kToReindexDrop},
    /* 5 rename  */ {kKeep, kKeep, kKeep, kKeep, kKeep, kKeep},
    /* 6 reindex */ {kDrop, kDrop, kDrop, kKeep, kDrop, kDrop},
};

void ApplyRule(OP& existing, OP& incoming, int column) {
  const int row = existing.op_;
  if (row < 0 || row > 6) return;  // a kind this table does not know is left alone
  switch (kMergeTable[row][column]) {
    case kKeep: return;
    case kDrop: break;
    case kToDeleteDrop: existing.op_ = kOPDelete; break;
    case kToUpsertDrop: existing.op_ = kOPUpsert; break;
    case kToCfgDrop:
      existing.op_ = kOPUpdateCfg;
      existing.data_ = incoming.data_;
      break;
    case kMergeCfgDrop: existing.MergeData(incoming.data_); break;
    case kToReindexDrop: existing.op_ = kOPReindex; break;
  }
  incoming.op_ = kOPNone;
}

// Post-order over the strict descendants of `node`, children in creation
// order, each node's children as they were when the walk entered it.
// Nodes are never removed while the tree lives, so raw pointers are safe.
template <typename Fn>
void ForEachDescendantPostOrder(OPNode* node, Fn fn) {
  struct Frame {
    OPNode* node;
    size_t next;
    size_t end;
  };
  std::vector<Frame> stack{{node, 0, node->Children().size()}};
  while (!stack.empty()) {
    Frame& top = stack.back();
    if (top.next < top.end) {
      OPNode* child = top.node->Children()[top.next++].get();
      stack.push_back({child, 0, child->Children().size()});
      continue;
    }
    OPNode* done = top.node;
    stack.pop_back();
    if (!stack.empty()) fn(done);
  }
}

}  // namespace

void OPTree::InsertEvent(std::shared_ptr<Event> event) {
  OPNode* node = Resolve(event->path);
  EventOP op;
  // Every bit is tested on its own and the same OP goes to every handler
  // that fires. Directory creates and deletes become reindexes.
  const uint32_t mask = event->event;
  if (mask & kEventCreate) event->is_dir ? Reindex(node, op) : Fold(node, op, kOPUpsert, Column::kCreate);
  if (mask & kEventAttr) Fold(node, op, kOPAttr, Column::kAttr);
  if (mask & kEventModify) Fold(node, op, kOPUpsert, Column::kModify);
  if (mask & kEventDelete) event->is_dir ? Reindex(node, op) : Fold(node, op, kOPDelete, Column::kDelete);
  if (mask & kEventRename) {
    op.Get().path_ = event->path_old;
    Rename(node, op);
  }
  if (mask & kEventReindex) Reindex(node, op);
  if (mask & kEventUpdateCfg) {
    op.Get().data_ = event->data;
    Fold(node, op, kOPUpdateCfg, Column::kUpdateCfg);
  }
  if (mask & kEventQueueCrash) crashed_ = true;
}

void OPTree::HandleCreate(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  EventOP made(std::move(op));
  Fold(node.get(), made, kOPUpsert, Column::kCreate);
}

void OPTree::HandleModify(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  EventOP made(std::move(op));
  Fold(node.get(), made, kOPUpsert, Column::kModify);
}

void OPTree::HandleAttr(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  EventOP made(std::move(op));
  Fold(node.get(), made, kOPAttr, Column::kAttr);
}

void OPTree::HandleDelete(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  EventOP made(std::move(op));
  Fold(node.get(), made, kOPDelete, Column::kDelete);
}

void OPTree::HandleUpdateCfg(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  EventOP made(std::move(op));
  Fold(node.get(), made, kOPUpdateCfg, Column::kUpdateCfg);
}

void OPTree::HandleReindex(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  EventOP made(std::move(op));
  Reindex(node.get(), made);
}

void OPTree::HandleRename(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  EventOP made(std::move(op));
  Rename(node.get(), made);
}

void OPTree::Append(OPNode* node, const std::shared_ptr<OP>& op) {
  ops_.push_back(op);
  node->ops_.push_back(op);
}

void OPTree::MergeIntoNode(OPNode* node, OP& op, FileIndexOP kind, Column column) {
  op.op_ = kind;
  // The rules only change kinds and data, never the list, so walking it by
  // index sees exactly the OPs that were there when the walk began.
  const size_t count = node->ops_.size();
  for (size_t i = 0; i < count; ++i) {
    OP& existing = *node->ops_[i];
    if (existing.op_ != kOPNone) ApplyRule(existing, op, static_cast<int>(column));
  }
}

void OPTree::Fold(OPNode* node, EventOP& op, FileIndexOP kind, Column column) {
  MergeIntoNode(node, op.Get(), kind, column);
  if (op.Get().op_ != kOPNone) Append(node, op.Made(*this, node));
}

void OPTree::Reindex(OPNode* node, EventOP& op) {
  MergeIntoNode(node, op.Get(), kOPReindex, Column::kReindex);
  // The reindex covers everything below, except renames: documents moved
  // into this directory from elsewhere still have to leave their old place.
  ForEachDescendantPostOrder(node, [](OPNode* descendant) {
    for (const std::shared_ptr<OP>& pending : descendant->ops_) {
      if (pending->op_ != kOPRename) pending->op_ = kOPNone;
    }
  });
  if (op.Get().op_ != kOPNone) Append(node, op.Made(*this, node));
}

void OPTree::MoveOPs(OPNode* from, OPNode* to, FileIndexOP min_kind, FileIndexOP* extra) {
  // Equivalent to: for each live OP of a copy of from->ops_, append it to
  // to->ops_ and erase its first entry in from->ops_. The erasures are
  // counted on the OPs and done in one pass, so moving n OPs costs O(n)
  // even when from and to are the same node.
  SmallList<std::shared_ptr<OP>>& source = from->ops_;
  const size_t count = source.size();
  std::shared_ptr<OPNode> owner;
  for (size_t i = 0; i < count; ++i) {
    OP& op = *source[i];
    if (op.op_ == kOPNone || op.op_ < min_kind) continue;
    if (extra != nullptr && (op.op_ == kOPUpsert || op.op_ == kOPAttr || op.op_ == kOPReindex)) {
      // Content work of the old path is redone at the new path after the rename.
      *extra = op.op_;
      op.op_ = kOPNone;
    }
    if (!owner) owner = to->shared_from_this();
    op.node_ = owner;
    ++op.pending_removals_;
    to->ops_.push_back(source[i]);
  }
  if (!owner) return;
  size_t kept = 0;
  for (size_t i = 0; i < count; ++i) {
    OP& op = *source[i];
    if (op.pending_removals_ > 0) {
      --op.pending_removals_;
      continue;
    }
    if (kept != i) source[kept] = std::move(source[i]);
    ++kept;
  }
  // When from and to are the same node the moved OPs sit after `count`.
  std::move(source.begin() + count, source.end(), source.begin() + kept);
  source.resize(kept + (source.size() - count));
}

void OPTree::MoveDescendantOPs(OPNode* old_node, OPNode* new_node) {
  // Pending work below the old path follows to the same place below the new
  // one; deletes stay where they were, their documents are still there.
  // Post-order like TraverseNodeDescendant. A descendant's target is the new
  // path followed by its path below the old one; the frames on the stack are
  // exactly its ancestors, so each keeps its own target once resolved and
  // no path is ever rebuilt. Targets are created top-down, when first
  // needed, as resolving the full new path would create them.
  struct Frame {
    OPNode* node;
    size_t next;
    size_t end;
    OPNode* target;
  };
  std::vector<Frame> stack;
  stack.push_back({old_node, 0, old_node->ChildCount(), new_node});
  while (!stack.empty()) {
    Frame& top = stack.back();
    if (top.next < top.end) {
      OPNode* child = top.node->ChildAt(top.next++);
      stack.push_back({child, 0, child->ChildCount(), nullptr});
      continue;
    }
    if (stack.size() == 1) break;  // the old node itself is the caller's
    size_t resolved = stack.size() - 1;
    while (stack[resolved].target == nullptr) --resolved;
    for (size_t i = resolved + 1; i < stack.size(); ++i) {
      stack[i].target = stack[i - 1].target->ChildNode(stack[i].node->name_);
    }
    MoveOPs(top.node, top.target, kOPUpsert, nullptr);
    stack.pop_back();
  }
}

void OPTree::Rename(OPNode* node, EventOP& op) {
  const std::string old_path = op.Get().path_;
  OPNode* old_node = Resolve(old_path);
  // No file system moves a folder into itself. Folding such a line would
  // copy the pending subtree into itself (and again for each such line), so
  // it is refused like a path that does not resolve.
  for (const OPNode* up = node->parent_.get(); up != nullptr; up = up->parent_.get()) {
    if (up == old_node) {
      throw Error(kErrorBadArgument, "Rename into its own subtree, path_old=" + old_path + ", path=" + node->GetPath());
    }
  }
  FileIndexOP extra = kOPNone;
  op.Get().op_ = kOPRename;
  // The rename overwrites whatever was pending at the destination.
  for (const std::shared_ptr<OP>& pending : node->ops_) {
    if (pending->op_ == kOPDelete || pending->op_ == kOPUpsert || pending->op_ == kOPAttr) pending->op_ = kOPNone;
  }
  MoveOPs(old_node, node, kOPDelete, &extra);
  MoveDescendantOPs(old_node, node);
  Append(node, op.Made(*this, node));
  if (extra != kOPNone) Append(node, MakeOP(node, extra, std::string(), Json::Value()));
}

}  // namespace fileindex
}  // namespace corvlumex
