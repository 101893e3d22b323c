// OPTree: building the tree from a queue file, resolving paths into nodes,
// handing the surviving operations out, and releasing the tree.
#include "fileindex/queue/optree.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/queue/op_folder_cache.h"
#include "fileindex/queue/op_line_reader.h"

namespace corvlumex {
namespace fileindex {

OPTree::OPTree(const std::string& queue_path) : queue_path_(queue_path), arena_(OPArena::Open()) {
  root_ = OPNode::MakeInArena(arena_.get(), nullptr, "");
  try {
    BuildTree();
  } catch (...) {
    // No tree exists after a failed construction: free what was built.
    ReleaseCycles();
    throw;
  }
}

OPTree::~OPTree() { ReleaseCycles(); }

void OPTree::BuildTree() {
  const int fd = open(queue_path_.c_str(), O_RDONLY | O_CLOEXEC);
  CORV_CHECK_THROW_TEXT(fd < 0, "!input_stream", kErrorSystem,
                        std::string("Failed to open queue, reason=") + strerror(errno));
  LineReader reader(fd);
  std::string line;
  std::string_view view;
  while (reader.Next(view)) {
    line.assign(view.data(), view.size());
    if (log_level == 7) CORV_LOG("Got event: %s", line.c_str());
    try {
      InsertEvent(std::make_shared<Event>(line));
    } catch (const Error& error) {
      CORV_LOG_FN("InsertEvent failed, event_raw=%s, code=%d, reason=%s", line.c_str(),
                  static_cast<int>(error.code), error.reason.c_str());
    }
    // Nothing after a crash marker matters: the whole share is reindexed.
    if (crashed_) break;
  }
}

std::shared_ptr<OPNode> OPTree::GetNodeByPath(const std::string& path) {
  return Resolve(path)->shared_from_this();
}

OPNode* OPTree::Resolve(std::string_view path) {
  // Only /c1/.../cn resolves: a leading "/", no empty component and no
  // trailing "/". Walking the components (below) and comparing the node's
  // path with `path` at each step answers exactly for this form, so the form
  // is checked once instead of rebuilding the node's path at every step.
  bool canonical = !path.empty() && path.front() == '/' && path.back() != '/';
  size_t last_slash = 0;
  for (const char* slash = path.data(); canonical;) {
    last_slash = static_cast<size_t>(slash - path.data());
    if (slash[1] == '/') canonical = false;  // never past the end: the path does not end in "/"
    slash = static_cast<const char*>(memchr(slash + 1, '/', path.size() - last_slash - 1));
    if (slash == nullptr) break;
  }
  size_t folder_hash = 0;
  if (canonical) {
    if (last_slash == 0) return root_->ChildNode(path.substr(1));
    folder_hash = FolderCache::Hash(path.substr(0, last_slash));
    if (OPNode* folder = folders_.Find(path.substr(0, last_slash), folder_hash)) {
      return folder->ChildNode(path.substr(last_slash + 1));
    }
  }
  // Every non-empty component is walked and created when absent, also for
  // a path that is then rejected: the nodes made on the way remain.
  OPNode* node = root_.get();
  size_t start = 0;
  while (start < path.size()) {
    size_t end = path.find('/', start);
    if (end == std::string_view::npos) end = path.size();
    if (end > start) node = node->ChildNode(path.substr(start, end - start));
    start = end + 1;
  }
  if (!canonical) throw Error(kErrorUnexpected, "GetNodeByPath failed, path=" + std::string(path));
  folders_.Put(path.substr(0, last_slash), folder_hash, node->parent_.get());
  return node;
}

std::shared_ptr<OP> OPTree::MakeOP(OPNode* node, FileIndexOP kind, const std::string& path,
                                   const Json::Value& data) {
  return MakeInArena<OP>(arena_.get(), node->shared_from_this(), kind, path, data);
}

unsigned OPTree::ProcessOP(std::function<void(std::shared_ptr<OP>)> fn) {
  if (!crashed_) {
    // By index: fn may insert into the tree while it runs.
    for (size_t i = 0; i < ops_.size(); ++i) {
      if (ops_[i]->op_ != kOPNone) fn(ops_[i]);
    }
    return static_cast<unsigned>(ops_.size());
  }
  CORV_LOG("Queue crashed: %s", queue_path_.c_str());
  fn(std::make_shared<OP>(root_, kOPFullReindex, "", Json::Value()));
  return 1;
}

void OPTree::TraverseNodeDescendant(std::shared_ptr<OPNode> node, std::function<void(std::shared_ptr<OPNode>)> fn,
                                    bool exclude_self) {
  // Each node's children are those it had when the walk entered it;
  // children only ever get appended, so remembering the count is as good
  // as copying the list.
  struct Frame {
    std::shared_ptr<OPNode> node;
    size_t next;
    size_t end;
  };
  std::vector<Frame> stack;
  stack.push_back({std::move(node), 0, 0});
  stack.back().end = stack.back().node->ChildCount();
  while (!stack.empty()) {
    Frame& top = stack.back();
    if (top.next < top.end) {
      std::shared_ptr<OPNode> child = top.node->children_->list[top.next++];
      const size_t end = child->ChildCount();
      stack.push_back({std::move(child), 0, end});
      continue;
    }
    std::shared_ptr<OPNode> done = std::move(top.node);
    stack.pop_back();
    if (!stack.empty() || !exclude_self) fn(std::move(done));
  }
}

void OPTree::ReleaseCycles() {
  // Drop every parent-to-child and node-to-OP link, iteratively so a deep
  // tree cannot exhaust the stack. What remains (child-to-parent and
  // OP-to-node) has no cycles: an OP a caller still holds keeps its node
  // chain, everything else is freed with ops_ below.
  std::vector<std::shared_ptr<OPNode>> pending;
  if (root_) pending.push_back(root_);
  while (!pending.empty()) {
    std::shared_ptr<OPNode> node = std::move(pending.back());
    pending.pop_back();
    node->ops_.clear();
    if (!node->children_) continue;
    for (std::shared_ptr<OPNode>& child : node->children_->list) pending.push_back(std::move(child));
    node->children_.reset();
  }
  folders_.Clear();
  ops_.clear();
}

}  // namespace fileindex
}  // namespace corvlumex
