#include "fileindex/optree.h"

#include <cerrno>
#include <cstring>
#include <ostream>
#include <string_view>
#include <utility>
#include <vector>

#include "common/log.h"
#include "common/queue_file.h"
#include "fileindex/optree_event.h"
#include "fileindex/optree_fold.h"

namespace quarrox::fileindex {
namespace {

EventView ViewOf(const Event& event, std::string& data) {
  if (!event.data.isNull()) data = toString(event.data);
  return {event.event, event.is_dir, event.path, event.path_old, data};
}

}  // namespace

// --- operations and nodes ------------------------------------------------------------------------------------------

OP::OP(const std::shared_ptr<OPNode>& node, FileIndexOP op, const std::string& path_old, const Json::Value& data)
    : node(node), op(op), path_old(path_old), data(data) {}

void OP::MergeData(const Json::Value& other) {
  MergeFlags(data, other);
}

std::ostream& operator<<(std::ostream& stream, const OP& op) {
  const std::shared_ptr<OPNode> node(op.node);
  stream << (op.op < 10 ? "[0" : "[") << static_cast<int32_t>(op.op) << "] ";
  if (op.op == kOpRename) stream << op.path_old << " -> ";
  return stream << node->GetPath() << AppendData(op.data);
}

OPNode::OPNode(const std::shared_ptr<OPFold>& fold, std::string path) : fold_(fold), path_(std::move(path)) {}

std::shared_ptr<OPNode> OPNode::GetParent() const {
  const std::shared_ptr<OPFold> fold(fold_);
  return path_.empty() ? nullptr : fold->View(fold, Dirname(path_));
}

std::shared_ptr<OPNode> OPNode::GetChild(const std::string& name) const {
  const std::shared_ptr<OPFold> fold(fold_);
  const std::string path = path_ + "/" + name;
  return CanHaveNode(path) && fold->HasNode(path) ? fold->View(fold, path) : nullptr;
}

void OPNode::TraverseOP(const boost::function<void(std::shared_ptr<OP>)>& fn) {
  const std::shared_ptr<OPFold> fold(fold_);
  std::vector<std::shared_ptr<OP>> pending;
  for (const OPFold::OpId id : fold->PendingAt(path_)) {
    pending.push_back(newClass<OP>(shared_from_this(), fold->Kind(id), fold->PathOld(id), fold->Data(id)));
  }
  for (const std::shared_ptr<OP>& op : pending) fn(op);
}

std::ostream& operator<<(std::ostream& stream, OPNode& node) {
  stream << "Node[" << node.GetPath() << "]: ";
  const char* separator = "";
  node.TraverseOP([&](const std::shared_ptr<OP>& op) {
    stream << separator << *op;
    separator = ", ";
  });
  return stream;
}

// --- the tree ------------------------------------------------------------------------------------------------------

OPTree::OPTree(const std::string& queue_path) : queue_path_(queue_path), fold_(newClass<OPFold>()) {}

OPTree::~OPTree() = default;

void OPTree::BuildTree() {
  QueueLines input(queue_path_);
  std::string_view line;
  while (input.Next(line)) InsertLine(line, input.overlong());
  if (input.error() != 0) {
    errno = input.error();
    QUARROX_THROW("!input_stream", kErrSystem, std::string("Failed to open queue, reason=") + strerror(input.error()));
  }
}

void OPTree::InsertLine(std::string_view line, bool overlong) {
  ++counts_.lines;
  if (log_level == kLogVerbose) QUARROX_LOG_PROGRESS("Got event: %s", log::Text(std::string(line)).c_str());
  try {
    if (overlong) {
      throw Error(kErrMalformedEvent, "Line too long: more than " + std::to_string(QueueLines::kMaxLine) + " bytes");
    }
    EventView event;
    if (ReadPlainEvent(line, event)) {
      fold_->InsertEvent(event);
    } else {
      InsertEvent(newClass<Event>(std::string(line)));
    }
  } catch (const Error& error) {
    ++counts_.bad_lines;
    QUARROX_SYSLOG_FAILURE_("BuildTree", "InsertEvent failed, event_raw=%s, code=%d, reason=%s",
                            log::Text(std::string(line)).c_str(), error.code, log::Text(error.what()).c_str());
  }
}

void OPTree::InsertEvent(const std::shared_ptr<Event>& event) {
  std::string data;
  fold_->InsertEvent(ViewOf(*event, data));
}

std::shared_ptr<OPNode> OPTree::GetNodeByPath(const std::string& path) {
  if (!CanHaveNode(path)) return nullptr;
  const std::string node_path = NodePath(path);
  fold_->MakeNode(node_path);
  return fold_->View(fold_, node_path);
}

size_t OPTree::ProcessOP(const boost::function<void(std::shared_ptr<OP>)>& fn) {
  if (fold_->crashed()) {
    QUARROX_LOG_PROGRESS("Queue crashed: %s", queue_path_.c_str());
    fn(newClass<OP>(root(), kOpQueueCrashed, std::string(), Json::Value()));
    return 1;
  }
  const auto entries = static_cast<OPFold::OpId>(fold_->entries());
  for (OPFold::OpId id = 1; id <= entries; ++id) {
    const FileIndexOP kind = fold_->Kind(id);
    if (kind == kOpNone) continue;
    const std::string path = fold_->Path(id);
    {
      const auto op = newClass<OP>(fold_->View(fold_, path), kind, fold_->PathOld(id), fold_->Data(id));
      fn(op);
      if (op.use_count() > 1) continue;  // kept by the caller: so is its node
    }
    fold_->Release(path);
  }
  return entries;
}

size_t OPTree::Count() const {
  if (fold_->crashed()) return 1;
  size_t count = 0;
  const auto entries = static_cast<OPFold::OpId>(fold_->entries());
  for (OPFold::OpId id = 1; id <= entries; ++id) count += static_cast<size_t>(fold_->Kind(id) != kOpNone);
  return count;
}

void OPTree::TraverseNodeDescendant(const std::shared_ptr<OPNode>& node,
                                    const boost::function<void(std::shared_ptr<OPNode>)>& fn, bool recursive) {
  const std::string prefix = node->GetPath() + "/";
  std::vector<std::shared_ptr<OPNode>> below;
  for (const std::string& path : fold_->AllPaths()) {
    if (!StringStartWith(path, prefix)) continue;
    if (recursive || path.find('/', prefix.size()) == std::string::npos) below.push_back(fold_->View(fold_, path));
  }
  for (const std::shared_ptr<OPNode>& descendant : below) fn(descendant);
}

std::shared_ptr<OPNode> OPTree::root() {
  return fold_->View(fold_, std::string());
}

bool OPTree::queue_crashed() const {
  return fold_->crashed();
}

}  // namespace quarrox::fileindex
