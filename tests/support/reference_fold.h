// The operation tree as one would write it first: a node for each path component, with its children and its list of
// shared operations, every step a walk. The real tree is held against it.
#pragma once

#include <compare>
#include <cstddef>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "fileindex/optree.h"

namespace quarrox::support {

class ReferenceFold {
 public:
  struct Operation {
    int kind;
    std::string path;
    std::string path_old;
    std::string data;
    auto operator<=>(const Operation&) const = default;
  };

  ReferenceFold();
  ~ReferenceFold();
  ReferenceFold(const ReferenceFold&) = delete;
  ReferenceFold& operator=(const ReferenceFold&) = delete;

  // False where the event's path can have no node.
  bool Insert(const fileindex::Event& event);

  // What is handed out, in order, and how many entries are looked at for it.
  std::vector<Operation> Process() const;
  size_t Entries() const { return crashed_ ? 1 : ops_.size(); }

  // What is pending on each path that has something pending, oldest first.
  std::map<std::string, std::vector<Operation>> Pending() const;

 private:
  struct Node;
  struct Entry;
  using Op = std::shared_ptr<Entry>;

  Node* NodeAt(const std::string& path);
  void Apply(const char* row, int kind, Node& node, const Op& fresh);
  void Reindex(Node& node, const Op& fresh);
  void Rename(const fileindex::Event& event, Node& node, const Op& fresh);
  void MoveDescendants(Node& old_node, const Node& node, const Op& fresh);
  void Append(Node& node, const Op& op);

  bool crashed_ = false;
  std::unique_ptr<Node> root_;
  std::vector<Op> ops_;
};

}  // namespace quarrox::support
