#include "support/reference_fold.h"

#include <algorithm>
#include <sstream>
#include <utility>

#include "common/json.h"

namespace quarrox::support {

using fileindex::Event;

struct ReferenceFold::Node {
  Node* parent = nullptr;
  std::string name;
  std::map<std::string, std::unique_ptr<Node>> children;
  std::vector<Op> ops;

  std::string Path() const { return parent == nullptr ? name : parent->Path() + "/" + name; }

  std::vector<Node*> Descendants() {
    std::vector<Node*> all;
    for (const auto& [child_name, child] : children) {
      all.push_back(child.get());
      const auto below = child->Descendants();
      all.insert(all.end(), below.begin(), below.end());
    }
    return all;
  }
};

struct ReferenceFold::Entry {
  Node* node;
  int kind;
  std::string path_old;
  Json::Value data;

  Operation Show() const { return {kind, node->Path(), kind == 5 ? path_old : "", toString(data)}; }
};

namespace {

// One letter for each kind of pending operation, 1 to 6. d: drop the new operation. b: keep both. m: merge the data,
// drop. A digit: the pending operation becomes this kind, drop.
constexpr char kCreateRow[] = "2d2dbd";
constexpr char kModifyRow[] = "dd2dbd";
constexpr char kAttrRow[] = "ddddbd";
constexpr char kDeleteRow[] = "d11bbb";
constexpr char kUpdateRow[] = "d44mbd";
constexpr char kReindexRow[] = "d666bd";

bool Flag(const Json::Value& data, const char* key) {
  return data.isObject() && data[key].isBool() && data[key].asBool();
}

void Merge(Json::Value& data, const Json::Value& other) {
  if (!data.isObject()) data = Json::Value(Json::objectValue);
  for (const char* key : {"document", "audio", "video", "photo", "basic"}) {
    data[key] = Flag(other, key) || Flag(std::as_const(data), key);
  }
}

}  // namespace

ReferenceFold::ReferenceFold() : root_(std::make_unique<Node>()) {}
ReferenceFold::~ReferenceFold() = default;

ReferenceFold::Node* ReferenceFold::NodeAt(const std::string& path) {
  if (path.empty() || path[0] != '/' || path.find('\0') != std::string::npos || path.size() > 64 * 1024) return nullptr;
  Node* node = root_.get();
  std::istringstream components(path);
  for (std::string name; std::getline(components, name, '/');) {
    if (name.empty()) continue;
    auto& child = node->children[name];
    if (child == nullptr) {
      child = std::make_unique<Node>();
      child->parent = node;
      child->name = name;
    }
    node = child.get();
  }
  return node;
}

void ReferenceFold::Append(Node& node, const Op& op) {
  if (std::find(ops_.begin(), ops_.end(), op) != ops_.end()) return;
  ops_.push_back(op);
  node.ops.push_back(op);
}

void ReferenceFold::Apply(const char* row, int kind, Node& node, const Op& fresh) {
  fresh->kind = kind;
  std::vector<Op> revived;
  for (const Op& pending : node.ops) {
    if (pending == fresh || pending->kind == 0) continue;
    const char cell = row[pending->kind - 1];
    if (cell == 'b') continue;
    fresh->kind = 0;
    if (cell == 'm') Merge(pending->data, fresh->data);
    if (cell == '4') pending->data = fresh->data;
    if (cell >= '1' && cell <= '6') {
      if (pending->kind == 1) revived.push_back(pending);
      pending->kind = cell - '0';
    }
  }
  // A create that revives a delete makes it the newest operation of its path.
  for (const Op& op : revived) {
    node.ops.erase(std::find(node.ops.begin(), node.ops.end(), op));
    node.ops.push_back(op);
  }
  if (fresh->kind != 0) Append(node, fresh);
}

void ReferenceFold::Reindex(Node& node, const Op& fresh) {
  Apply(kReindexRow, 6, node, fresh);
  for (const Node* below : node.Descendants()) {
    for (const Op& pending : below->ops) {
      if (pending->kind != 5) pending->kind = 0;
    }
  }
}

void ReferenceFold::MoveDescendants(Node& old_node, const Node& node, const Op& fresh) {
  const std::string old_path = old_node.Path();
  const std::string path = node.Path();
  std::vector<std::pair<Node*, Op>> moves;
  for (Node* below : old_node.Descendants()) {
    for (const Op& pending : below->ops) {
      if (pending->kind > 1 && pending != fresh) moves.emplace_back(below, pending);
    }
  }
  for (const auto& [from, pending] : moves) {
    Node* to = NodeAt(path + from->Path().substr(old_path.size()));
    if (to == from) continue;
    from->ops.erase(std::find(from->ops.begin(), from->ops.end(), pending));
    to->ops.push_back(pending);
    pending->node = to;
  }
}

void ReferenceFold::Rename(const Event& event, Node& node, const Op& fresh) {
  Node* old_node = NodeAt(event.path_old);
  if (old_node == nullptr) return Reindex(node, fresh);
  fresh->kind = 5;
  fresh->path_old = event.path_old;
  for (const Op& pending : node.ops) {
    if (pending->kind <= 3) pending->kind = 0;
  }
  const auto second = std::make_shared<Entry>(Entry{&node, 0, "", event.data});
  for (const Op& pending : std::vector<Op>(old_node->ops)) {
    if (pending == fresh) continue;
    if (pending->kind == 2 || pending->kind == 3 || pending->kind == 6) {
      second->kind = std::exchange(pending->kind, 0);
    }
    old_node->ops.erase(std::find(old_node->ops.begin(), old_node->ops.end(), pending));
    node.ops.push_back(pending);
    pending->node = &node;
  }
  MoveDescendants(*old_node, node, fresh);
  Append(node, fresh);
  if (second->kind != 0) Append(node, second);
}

bool ReferenceFold::Insert(const Event& event) {
  if ((event.event & 0x200) != 0) crashed_ = true;
  Node* node = NodeAt(event.path);
  if (node == nullptr) return false;
  const auto fresh = std::make_shared<Entry>(Entry{node, 0, "", event.data});
  const auto has = [&](uint32_t bits) { return (event.event & bits) != 0; };
  if (has(0x40) && event.is_dir) Reindex(*node, fresh);
  if (has(0x40) && !event.is_dir) Apply(kCreateRow, 2, *node, fresh);
  if (has(0x04)) Apply(kAttrRow, 3, *node, fresh);
  if (has(0x0A)) Apply(kModifyRow, 2, *node, fresh);
  if (has(0x80) && event.is_dir) Reindex(*node, fresh);
  if (has(0x80) && !event.is_dir) Apply(kDeleteRow, 1, *node, fresh);
  if (has(0x100)) Rename(event, *node, fresh);
  if (has(0x10000)) Reindex(*node, fresh);
  if (has(0x20000)) Apply(kUpdateRow, 4, *node, fresh);
  return true;
}

std::vector<ReferenceFold::Operation> ReferenceFold::Process() const {
  if (crashed_) return {{7, "", "", "null"}};
  std::vector<Operation> result;
  for (const Op& op : ops_) {
    if (op->kind != 0) result.push_back(op->Show());
  }
  return result;
}

std::map<std::string, std::vector<ReferenceFold::Operation>> ReferenceFold::Pending() const {
  std::map<std::string, std::vector<Operation>> result;
  std::vector<Node*> nodes = root_->Descendants();
  nodes.push_back(root_.get());
  for (const Node* node : nodes) {
    for (const Op& op : node->ops) {
      if (op->kind != 0) result[node->Path()].push_back(op->Show());
    }
  }
  return result;
}

}  // namespace quarrox::support
