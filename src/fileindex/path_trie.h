// A tree of path components that finds a path fast, moves whole subtrees in constant time, and finds what is pending
// below a node without looking at anything else.
//
// Nodes are numbers; 0 is none. A node bears a payload (a number of its owner's choosing) and, for each of two lanes, a
// mark that something is pending on it. For each lane a node keeps the list of those children at or below which
// something is pending, so a walk over a lane costs what it finds. Children are looked up by name in one hash table
// keyed by parent and name; re-parenting a subtree is therefore one change of a key.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "fileindex/chunked_array.h"

namespace quarrox::fileindex {

using NodeId = uint32_t;

// A directory's path as 128 bits, seeded anew in each process: nobody can aim at another's.
struct DirectoryHash {
  DirectoryHash() = default;
  explicit DirectoryHash(std::string_view path);

  uint64_t high = 0;
  uint64_t low = 0;
};

// A path and what is computed of it once, for all look-ups.
class PathKey {
 public:
  // An absolute path; empty components count as none. Its text outlives the key.
  explicit PathKey(std::string_view path);

  // Of the last component: the same however the path is written.
  uint64_t name_hash() const { return name_hash_; }

 private:
  friend class PathTrie;

  std::string_view directory_;
  std::string_view name_;  // empty for the root
  DirectoryHash directory_hash_;
  uint64_t name_hash_ = 0;
};

class PathTrie {
 public:
  static constexpr int kLanes = 2;

  // The texts are shared with whoever keeps more of them; they outlive the trie. `directories` is how many directories
  // are remembered (24 bytes each), a power of 2.
  PathTrie(TextStore& names, size_t directories);

  NodeId root() const { return root_; }

  // The node of a path; Find gives 0 where it is missing, Make makes it. Neither recurses. Directories that were looked
  // up are remembered, so that a path in one of them costs one step.
  NodeId Find(const PathKey& path) { return Resolve(path, false); }
  NodeId Make(const PathKey& path) { return Resolve(path, true); }

  NodeId Child(NodeId parent, std::string_view name) const;
  NodeId Parent(NodeId node) const { return nodes_[node].parent; }
  std::string_view Name(NodeId node) const { return names_[nodes_[node].name]; }

  // The full path; empty for the root.
  std::string Path(NodeId node) const;
  bool IsAncestor(NodeId ancestor, NodeId node) const;

  // Every node that hangs on the root, the root left out, is one of [1, Limit()) for which IsAttached.
  NodeId Limit() const { return nodes_.size(); }
  bool IsAttached(NodeId node) const { return IsAncestor(root_, node); }

  uint32_t payload(NodeId node) const { return nodes_[node].payload; }
  void set_payload(NodeId node, uint32_t payload) { nodes_[node].payload = payload & kMaxPayload; }

  // Marks or unmarks a node in a lane.
  void SetPending(NodeId node, int lane, bool pending);

  // Whether something is pending below a node, and at or below it.
  bool HasBelow(NodeId node, int lane) const { return nodes_[node].lanes[lane].head != 0; }
  bool HasAtOrBelow(NodeId node, int lane) const { return IsPending(node, lane) || HasBelow(node, lane); }

  // The children at or below which something is pending.
  std::vector<NodeId> Children(NodeId node, int lane) const;
  // All nodes below at or below which something is pending, parents before children.
  std::vector<NodeId> Below(NodeId node, int lane) const;
  // Whether `a` has at most as many children in a lane as `b`, at the cost of the smaller number.
  bool HasFewerChildren(NodeId a, NodeId b, int lane) const;

  // Two nodes change places, each with everything below it. Neither is an ancestor of the other or the root.
  void Exchange(NodeId a, NodeId b);
  // The same, but payloads and marks stay at their places: what changes places is what is below.
  void ExchangeBelow(NodeId a, NodeId b);
  // Hangs a node under another parent that has no child of its name.
  void Reparent(NodeId node, NodeId parent);
  // Takes a node with everything below it out of the tree; a detached root is replaced by an empty one.
  void Detach(NodeId node);

 private:
  static constexpr uint32_t kMaxPayload = (1U << 29) - 1;

  struct Lane {
    NodeId head;  // the first child in the lane
    NodeId next;  // neighbours among the parent's children in the lane; a ring, 0 when not in it
    NodeId prev;
  };
  struct Node {
    NodeId parent;
    uint32_t name;
    uint32_t payload : 29;
    uint32_t pending : kLanes;
    uint32_t moved : 1;  // ever: then moved_at_ says when last
    Lane lanes[kLanes];
  };
  struct Slot {
    uint32_t hash;
    NodeId node;
  };
  // A directory that was looked up.
  struct Known {
    DirectoryHash hash;
    NodeId node;
    mutable uint32_t moves;  // valid while neither it nor what it hangs on was moved since
  };

  NodeId Resolve(const PathKey& path, bool make);
  NodeId Directory(const PathKey& path, bool make);
  NodeId StepAlong(NodeId node, std::string_view path, size_t pos, bool make);
  NodeId Step(NodeId parent, std::string_view name, uint64_t name_hash, bool make);
  NodeId Add(NodeId parent, uint32_t name);
  void AppendChildren(NodeId node, int lane, std::vector<NodeId>& found) const;

  bool IsPending(NodeId node, int lane) const { return (nodes_[node].pending >> lane & 1) != 0; }
  bool IsLinked(NodeId node, int lane) const { return nodes_[node].lanes[lane].next != 0; }
  void Link(NodeId node, int lane);
  void Unlink(NodeId node, int lane);
  void UnlinkAll(NodeId node);
  void LinkAll(NodeId node);

  NodeId Lookup(NodeId parent, std::string_view name, uint32_t hash) const;
  uint32_t HashOf(NodeId node) const;
  void Insert(NodeId node, uint32_t hash);
  void Erase(NodeId node);
  void Grow();
  void NoteMove(NodeId node);
  Known& KnownAt(const DirectoryHash& hash) { return known_[hash.low & (known_.size() - 1)]; }
  bool IsKnown(const Known& known, const DirectoryHash& hash) const;
  bool IsStill(const Known& known) const;
  void SwapPlaces(NodeId a, NodeId b, bool keep_payload);

  TextStore& names_;
  ChunkedArray<Node> nodes_;
  std::vector<Slot> slots_;
  size_t used_slots_ = 0;
  NodeId root_;
  std::vector<Known> known_;
  uint32_t moves_ = 1;
  std::unordered_map<NodeId, uint32_t> moved_at_;
};

}  // namespace quarrox::fileindex
