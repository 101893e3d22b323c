// OP and OPNode: the records of the operation tree, child lookup, paths
// and the printed forms used for debug output.
#include <cstring>
#include <iomanip>
#include <ostream>

#include "common/json_util.h"
#include "fileindex/queue/optree.h"

namespace corvlumex {
namespace fileindex {

OP::OP(std::shared_ptr<OPNode> node, FileIndexOP op, const std::string& path, const Json::Value& data)
    : node_(std::move(node)), op_(op), path_(path), data_(data) {}

void OP::MergeData(const Json::Value& data) {
  static const char* const kKeys[] = {"document", "audio", "video", "photo"};
  for (const char* key : kKeys) {
    // Absent reads as false; present but not a boolean is the typed-read error.
    bool incoming = false;
    GetJsonValue<bool>(incoming, data, key, data.isObject() && data.isMember(key));
    // A stored payload that is not an object (a garbled queue line) has no
    // flags to keep; the merge turns it into the four booleans.
    if (!data_.isObject()) data_ = Json::Value(Json::objectValue);
    const Json::Value& stored = data_[key];
    const bool stored_true = stored.isBool() && stored.asBool();
    data_[key] = incoming || stored_true;
  }
}

namespace {

std::string_view OwnedCopy(const std::string& name) {
  if (name.empty()) return std::string_view();
  char* copy = new char[name.size()];
  memcpy(copy, name.data(), name.size());
  return std::string_view(copy, name.size());
}

}  // namespace

OPNode::OPNode(std::shared_ptr<OPNode> parent, const std::string& name)
    : name_(OwnedCopy(name)), parent_(std::move(parent)), owns_name_(true) {}

OPNode::OPNode(ArenaKey, std::shared_ptr<OPNode> parent, std::string_view stored_name)
    : name_(stored_name), parent_(std::move(parent)), owns_name_(false) {}

std::shared_ptr<OPNode> OPNode::MakeInArena(OPArena* arena, std::shared_ptr<OPNode> parent, std::string_view name) {
  // The name goes right before the node: comparing it reads memory next to the node.
  const std::string_view stored = arena->CopyName(name);
  return fileindex::MakeInArena<OPNode>(arena, ArenaKey(), std::move(parent), stored);
}

OPNode::~OPNode() {
  if (owns_name_) delete[] name_.data();
  // Release the ancestors this node was the last owner of one by one, so a
  // path thousands of components deep cannot exhaust the stack.
  std::shared_ptr<OPNode> ancestor = std::move(parent_);
  while (ancestor && ancestor.use_count() == 1) {
    std::shared_ptr<OPNode> next = std::move(ancestor->parent_);
    ancestor.reset();
    ancestor = std::move(next);
  }
}

std::string OPNode::GetPath() const {
  size_t length = 0;
  for (const OPNode* node = this; node->parent_; node = node->parent_.get()) length += node->name_.size() + 1;
  std::string path(length, '\0');
  size_t end = length;
  for (const OPNode* node = this; node->parent_; node = node->parent_.get()) {
    end -= node->name_.size();
    path.replace(end, node->name_.size(), node->name_.data(), node->name_.size());
    path[--end] = '/';
  }
  return path;
}

const std::vector<std::shared_ptr<OPNode>>& OPNode::Children() const {
  static const std::vector<std::shared_ptr<OPNode>> kNone;
  return children_ ? children_->list : kNone;
}

OPNode* OPNode::ChildNode(std::string_view name) {
  const size_t count = ChildCount();
  if (count >= ChildIndex::kMinChildren) {
    if (OPNode* child = children_->index.Find(name, count)) return child;
  } else {
    for (size_t i = 0; i < count; ++i) {
      if (ChildAt(i)->name_ == name) return ChildAt(i);
    }
  }
  std::shared_ptr<OPNode> child = owns_name_ ? std::make_shared<OPNode>(shared_from_this(), std::string(name))
                                             : MakeInArena(OPArena::Of(this), shared_from_this(), name);
  if (!children_) children_.reset(new ChildTable());
  children_->list.push_back(std::move(child));
  children_->index.Added(children_->list);
  return children_->list.back().get();
}

std::shared_ptr<OPNode> OPNode::GetChild(const std::string& name) {
  // Resolve ownership first: an unshared node fails before it changes.
  std::shared_ptr<OPNode> self = shared_from_this();
  return self->ChildNode(name)->shared_from_this();
}

void OPNode::TraverseOP(std::function<void(std::shared_ptr<OP>)> fn) {
  const std::vector<std::shared_ptr<OP>> snapshot(ops_.begin(), ops_.end());
  for (const std::shared_ptr<OP>& op : snapshot) {
    if (op->op_ != kOPNone) fn(op);
  }
}

std::ostream& operator<<(std::ostream& os, std::shared_ptr<OP> op) {
  // The fill character is left at '0' on purpose: debug dumps print many
  // OPs in a row and rely on it.
  os << "[" << std::setw(2) << std::setfill('0') << static_cast<int>(op->op_) << "] ";
  if (op->op_ == kOPRename) os << op->path_ << " -> ";
  os << op->node_->GetPath();
  if (op->op_ == kOPUpdateCfg) os << ", data=" << JsonToString(op->data_);
  return os;
}

std::ostream& operator<<(std::ostream& os, std::shared_ptr<OPNode> node) {
  os << "Node[" << node->name_ << "]: " << "\n";
  for (const std::shared_ptr<OP>& op : node->ops_) os << "  " << op << "\n";
  return os;
}

}  // namespace fileindex
}  // namespace corvlumex
