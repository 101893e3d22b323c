// The operation tree: the events of one queue file folded, per path, into
// the short list of index operations that still matter, handed out in the
// order in which they were first inserted.
//
// Ownership: a node owns its children and its OPs, a child owns its parent
// and an OP owns its node, so an OP handed out keeps its node and all its
// ancestors alive and GetPath() keeps working after the tree is gone. The
// tree breaks the node-to-child and node-to-OP links when it is released,
// so nothing else outlives it.
//
// A tree's nodes, OPs and names live in the tree's OPArena (op_arena.h).
#pragma once

#include <json/json.h>

#include <cstdint>
#include <functional>
#include <iosfwd>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "common/export.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/op_arena.h"
#include "fileindex/queue/op_child_index.h"
#include "fileindex/queue/op_folder_cache.h"
#include "fileindex/queue/op_small_list.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

// Operation kinds. The values are printed and compared by value.
enum FileIndexOP : int32_t {
  kOPNone = 0,         // cancelled; never handed out
  kOPDelete = 1,       // remove the path's document(s)
  kOPUpsert = 2,       // (re)index the file's content and metadata
  kOPAttr = 3,         // refresh attributes only
  kOPUpdateCfg = 4,    // indexing settings of the path changed; data_ holds them
  kOPRename = 5,       // move documents from path_ (old full path) to the node's path
  kOPReindex = 6,      // reindex the path and everything below it
  kOPFullReindex = 7,  // reindex the whole share (after a queue crash)
};

class OPNode;
class OPTree;

class OP {
 public:
  OP(std::shared_ptr<OPNode> node, FileIndexOP op, const std::string& path, const Json::Value& data);

  // ORs the four category flags of `data` into data_ ("document", "audio",
  // "video", "photo"); afterwards all four exist as booleans. A flag present
  // in `data` but not boolean throws the typed-read Error 120.
  void MergeData(const Json::Value& data);

  std::shared_ptr<OPNode> node_;  // the path the operation applies to
  FileIndexOP op_;                // changed in place by merging

 private:
  friend class OPTree;
  // Scratch count used while a rename moves OPs; declared here, where it
  // fills the space after op_ instead of adding to the OP's size.
  uint32_t pending_removals_ = 0;

 public:
  std::string path_;  // old full path of a rename, else empty
  Json::Value data_;  // settings of kOPUpdateCfg, else null
};

class OPNode : public std::enable_shared_from_this<OPNode> {
 public:
  OPNode(std::shared_ptr<OPNode> parent, const std::string& name);
  // A node made in an arena, whose name the arena stores; only the tree and
  // its nodes can make the key.
  class ArenaKey {
    friend class OPNode;
    friend class OPTree;
    ArenaKey() = default;
  };
  OPNode(ArenaKey, std::shared_ptr<OPNode> parent, std::string_view stored_name);
  ~OPNode();
  OPNode(const OPNode&) = delete;
  OPNode& operator=(const OPNode&) = delete;

  // "/a/b" for node b under a under the root; the root's path is empty.
  std::string GetPath() const;

  // The child with exactly this name, created (and appended) when absent.
  // Throws std::bad_weak_ptr when this node is not held by a shared_ptr.
  std::shared_ptr<OPNode> GetChild(const std::string& name);

  // Calls fn for every live OP of a copy of ops_, in order, so fn may add
  // to or remove from ops_.
  void TraverseOP(std::function<void(std::shared_ptr<OP>)> fn);

  // Children in order of creation. They only ever grow through GetChild.
  const std::vector<std::shared_ptr<OPNode>>& Children() const;

  const std::string_view name_;           // one path component; empty for the root
  std::shared_ptr<OPNode> parent_;        // empty for the root
  SmallList<std::shared_ptr<OP>> ops_;  // in order of attachment, cancelled ones included

 private:
  friend class OPTree;
  static std::shared_ptr<OPNode> MakeInArena(OPArena* arena, std::shared_ptr<OPNode> parent, std::string_view name);
  // GetChild without taking shared ownership.
  OPNode* ChildNode(std::string_view name);

  size_t ChildCount() const { return children_ ? children_->list.size() : 0; }
  OPNode* ChildAt(size_t i) const { return children_->list[i].get(); }

  // Most nodes are files without children: a folder's children and their
  // index sit apart, made with the first child.
  struct ChildTable {
    std::vector<std::shared_ptr<OPNode>> list;
    ChildIndex index;  // name -> child, once there are a few children
  };
  std::unique_ptr<ChildTable> children_;
  // Nodes made by a tree are in its arena, and so are their children and
  // names; a node made on its own owns its name and makes its children on
  // the heap.
  const bool owns_name_;
};

class OPTree {
 public:
  // Reads the whole queue file into the tree. Error 502 when it cannot be
  // opened; malformed lines are logged and skipped.
  explicit OPTree(const std::string& queue_path);
  ~OPTree();
  OPTree(const OPTree&) = delete;
  OPTree& operator=(const OPTree&) = delete;

  void BuildTree();

  // The node of a full path /c1/.../cn (created when absent). Any other
  // form ("/", "", relative, doubled or trailing "/") throws Error 9999
  // "GetNodeByPath failed, path=<path>"; nodes made on the way remain.
  std::shared_ptr<OPNode> GetNodeByPath(const std::string& path);

  // Hands every live OP to fn in insertion order and returns the number of
  // OPs in the list, cancelled ones included. On a crashed queue hands out
  // one kOPFullReindex instead and returns 1. The tree is not changed.
  unsigned ProcessOP(std::function<void(std::shared_ptr<OP>)> fn);

  // Folds one event into the tree (the merge rules live in op_merge.cc).
  void InsertEvent(std::shared_ptr<Event> event);
  void HandleCreate(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleModify(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleAttr(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleDelete(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleRename(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleReindex(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleUpdateCfg(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);

  // Post-order walk below `node`: children in creation order (those present
  // when their parent is entered), then the node itself unless exclude_self.
  static void TraverseNodeDescendant(std::shared_ptr<OPNode> node,
                                     std::function<void(std::shared_ptr<OPNode>)> fn, bool exclude_self);

  bool IsCrashed() const { return crashed_; }
  const std::string& QueuePath() const { return queue_path_; }
  const std::shared_ptr<OPNode>& Root() const { return root_; }
  const std::vector<std::shared_ptr<OP>>& Ops() const { return ops_; }

 private:
  enum class Column;
  class EventOP;
  struct ArenaCloser {
    void operator()(OPArena* arena) const { arena->Close(); }
  };
  // GetNodeByPath without taking shared ownership.
  OPNode* Resolve(std::string_view path);
  // The handlers' work on raw nodes; the public handlers forward here.
  void Fold(OPNode* node, EventOP& op, FileIndexOP kind, Column column);
  void Reindex(OPNode* node, EventOP& op);
  void Rename(OPNode* node, EventOP& op);
  static void MergeIntoNode(OPNode* node, OP& op, FileIndexOP kind, Column column);
  void Append(OPNode* node, const std::shared_ptr<OP>& op);
  // A new OP on `node`, in the tree's arena.
  std::shared_ptr<OP> MakeOP(OPNode* node, FileIndexOP kind, const std::string& path, const Json::Value& data);
  static void MoveOPs(OPNode* from, OPNode* to, FileIndexOP min_kind, FileIndexOP* extra);
  static void MoveDescendantOPs(OPNode* old_node, OPNode* new_node);
  void ReleaseCycles();

  bool crashed_ = false;
  std::string queue_path_;
  std::shared_ptr<OPNode> root_;
  std::vector<std::shared_ptr<OP>> ops_;
  FolderCache folders_;  // recently resolved folders, to skip walking from the root
  std::unique_ptr<OPArena, ArenaCloser> arena_;
};

// "[05] /old -> /new"; the stream's fill character stays '0' afterwards.
std::ostream& operator<<(std::ostream& os, std::shared_ptr<OP> op);
// "Node[name]: " and a line per OP (cancelled ones included).
std::ostream& operator<<(std::ostream& os, std::shared_ptr<OPNode> node);

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
