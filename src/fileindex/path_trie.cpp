#include "fileindex/path_trie.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <random>
#include <utility>

namespace quarrox::fileindex {
namespace {

constexpr size_t kFirstSlots = 1024;
constexpr size_t kMaxProbes = 8;

// Chosen anew in each process, so that nobody can make up paths that collide.
uint64_t Seed() {
  static const uint64_t seed = (uint64_t{std::random_device()()} << 32) | std::random_device()();
  return seed;
}

uint64_t HashName(std::string_view name) {
  return XXH3_64bits_withSeed(name.data(), name.size(), Seed());
}

uint32_t HashChild(NodeId parent, uint64_t name_hash) {
  return static_cast<uint32_t>(((name_hash ^ parent) * 0x9E3779B97F4A7C15ULL) >> 32);
}

}  // namespace

DirectoryHash::DirectoryHash(std::string_view path) {
  const XXH128_hash_t hash = XXH3_128bits_withSeed(path.data(), path.size(), Seed());
  high = hash.high64;
  low = hash.low64;
}

PathKey::PathKey(std::string_view path) {
  while (!path.empty() && path.back() == '/') path.remove_suffix(1);
  const auto* slash = static_cast<const char*>(memrchr(path.data(), '/', path.size()));
  const size_t name = slash == nullptr ? 0 : static_cast<size_t>(slash - path.data()) + 1;
  name_ = path.substr(name);
  name_hash_ = HashName(name_);
  directory_ = path.substr(0, name == 0 ? 0 : name - 1);
  directory_hash_ = DirectoryHash(directory_);
}

PathTrie::PathTrie(TextStore& names, size_t directories) : names_(names), slots_(kFirstSlots), known_(directories) {
  const uint32_t no_name = names_.Add("");
  nodes_.Add(Node{});  // 0 is none
  root_ = Add(0, no_name);
}

NodeId PathTrie::Add(NodeId parent, uint32_t name) {
  Node node{};
  node.parent = parent;
  node.name = name;
  return nodes_.Add(node);
}

NodeId PathTrie::Resolve(const PathKey& path, bool make) {
  const Known& known = KnownAt(path.directory_hash_);
  const NodeId directory = IsKnown(known, path.directory_hash_) ? known.node : Directory(path, make);
  if (directory == 0 || path.name_.empty()) return directory;
  return Step(directory, path.name_, path.name_hash_, make);
}

bool PathTrie::IsKnown(const Known& known, const DirectoryHash& hash) const {
  return known.hash.low == hash.low && known.hash.high == hash.high && IsStill(known);
}

// From the nearest ancestor that is remembered; else, or where that is too far up, from the root. What is passed on the
// way is remembered.
NodeId PathTrie::Directory(const PathKey& path, bool make) {
  std::array<std::pair<std::string_view, DirectoryHash>, kMaxProbes> missing;
  size_t count = 0;
  NodeId node = root_;
  size_t pos = 0;
  DirectoryHash hash = path.directory_hash_;
  for (std::string_view prefix = path.directory_; !prefix.empty(); hash = DirectoryHash(prefix)) {
    const Known& known = KnownAt(hash);
    if (IsKnown(known, hash)) {
      node = known.node;
      pos = prefix.size();
      break;
    }
    missing[count++] = {prefix, hash};
    if (count == kMaxProbes) break;
    prefix = prefix.substr(0, std::min(prefix.rfind('/'), prefix.size()));
  }
  while (node != 0 && count > 0) {
    const auto& [prefix, prefix_hash] = missing[--count];
    node = StepAlong(node, prefix, pos, make);
    pos = prefix.size();
    if (node != 0) KnownAt(prefix_hash) = {prefix_hash, node, moves_};
  }
  return node;
}

NodeId PathTrie::StepAlong(NodeId node, std::string_view path, size_t pos, bool make) {
  while (node != 0) {
    while (pos < path.size() && path[pos] == '/') ++pos;
    if (pos == path.size()) break;
    const size_t end = std::min(path.find('/', pos), path.size());
    const std::string_view name = path.substr(pos, end - pos);
    node = Step(node, name, HashName(name), make);
    pos = end;
  }
  return node;
}

NodeId PathTrie::Step(NodeId parent, std::string_view name, uint64_t name_hash, bool make) {
  const uint32_t hash = HashChild(parent, name_hash);
  NodeId child = Lookup(parent, name, hash);
  if (child != 0 || !make) return child;
  child = Add(parent, names_.Add(name));
  Insert(child, hash);
  return child;
}

// What was known of the places at and below a node that moves is so no longer.
void PathTrie::NoteMove(NodeId node) {
  nodes_[node].moved = 1;
  moved_at_[node] = ++moves_;
}

bool PathTrie::IsStill(const Known& known) const {
  if (known.moves == moves_) return true;
  if (known.node == 0) return false;
  for (NodeId node = known.node; node != 0; node = Parent(node)) {
    if (nodes_[node].moved != 0 && moved_at_.at(node) > known.moves) return false;
  }
  known.moves = moves_;
  return true;
}

NodeId PathTrie::Child(NodeId parent, std::string_view name) const {
  return Lookup(parent, name, HashChild(parent, HashName(name)));
}

std::string PathTrie::Path(NodeId node) const {
  size_t size = 0;
  for (NodeId n = node; Parent(n) != 0; n = Parent(n)) size += 1 + Name(n).size();
  std::string path(size, '/');
  for (NodeId n = node; Parent(n) != 0; n = Parent(n)) {
    const std::string_view name = Name(n);
    size -= name.size();
    name.copy(path.data() + size, name.size());
    --size;
  }
  return path;
}

bool PathTrie::IsAncestor(NodeId ancestor, NodeId node) const {
  while (node != 0) {
    node = Parent(node);
    if (node == ancestor) return true;
  }
  return false;
}

void PathTrie::SetPending(NodeId node, int lane, bool pending) {
  if (IsPending(node, lane) == pending) return;
  Node& n = nodes_[node];
  n.pending = (n.pending ^ 1U << lane) & 3U;
  pending ? Link(node, lane) : Unlink(node, lane);
}

// Enters a node that has something at or below it in its parent's list, and so on upwards as far as that is news.
void PathTrie::Link(NodeId node, int lane) {
  for (; Parent(node) != 0 && !IsLinked(node, lane); node = Parent(node)) {
    Lane& own = nodes_[node].lanes[lane];
    NodeId& head = nodes_[Parent(node)].lanes[lane].head;
    if (head == 0) {
      own.next = own.prev = head = node;
    } else {
      Lane& first = nodes_[head].lanes[lane];
      own.next = head;
      own.prev = first.prev;
      nodes_[first.prev].lanes[lane].next = node;
      first.prev = node;
      head = node;
    }
  }
}

// Takes a node that has nothing left out of its parent's list, and so on upwards.
void PathTrie::Unlink(NodeId node, int lane) {
  for (; Parent(node) != 0 && IsLinked(node, lane) && !HasAtOrBelow(node, lane); node = Parent(node)) {
    Lane& own = nodes_[node].lanes[lane];
    NodeId& head = nodes_[Parent(node)].lanes[lane].head;
    nodes_[own.prev].lanes[lane].next = own.next;
    nodes_[own.next].lanes[lane].prev = own.prev;
    if (head == node) head = own.next == node ? 0 : own.next;
    own.next = own.prev = 0;
  }
}

// A node that is about to leave its place: its former parent no longer counts it.
void PathTrie::UnlinkAll(NodeId node) {
  for (int lane = 0; lane < kLanes; ++lane) {
    Lane& own = nodes_[node].lanes[lane];
    const NodeId head = std::exchange(own.head, 0);
    const uint32_t pending = nodes_[node].pending;
    nodes_[node].pending = pending & ~(1U << lane) & 3U;
    Unlink(node, lane);
    own.head = head;
    nodes_[node].pending = pending & 3U;
  }
}

void PathTrie::LinkAll(NodeId node) {
  for (int lane = 0; lane < kLanes; ++lane) {
    if (HasAtOrBelow(node, lane)) Link(node, lane);
  }
}

void PathTrie::AppendChildren(NodeId node, int lane, std::vector<NodeId>& found) const {
  const NodeId head = nodes_[node].lanes[lane].head;
  for (NodeId child = head; child != 0;) {
    found.push_back(child);
    child = nodes_[child].lanes[lane].next;
    if (child == head) break;
  }
}

std::vector<NodeId> PathTrie::Children(NodeId node, int lane) const {
  std::vector<NodeId> found;
  AppendChildren(node, lane, found);
  return found;
}

std::vector<NodeId> PathTrie::Below(NodeId node, int lane) const {
  std::vector<NodeId> found = Children(node, lane);
  for (size_t i = 0; i < found.size(); ++i) AppendChildren(found[i], lane, found);
  return found;
}

bool PathTrie::HasFewerChildren(NodeId a, NodeId b, int lane) const {
  const NodeId head_a = nodes_[a].lanes[lane].head;
  const NodeId head_b = nodes_[b].lanes[lane].head;
  NodeId x = head_a;
  NodeId y = head_b;
  while (x != 0 && y != 0) {
    x = nodes_[x].lanes[lane].next;
    y = nodes_[y].lanes[lane].next;
    if (x == head_a) return true;
    if (y == head_b) return false;
  }
  return x == 0;
}

void PathTrie::SwapPlaces(NodeId a, NodeId b, bool keep_payload) {
  UnlinkAll(a);
  UnlinkAll(b);
  Erase(a);
  Erase(b);
  Node& x = nodes_[a];
  Node& y = nodes_[b];
  std::swap(x.parent, y.parent);
  std::swap(x.name, y.name);
  if (keep_payload) {
    const Node old = x;
    x.payload = y.payload;
    x.pending = y.pending;
    y.payload = old.payload;
    y.pending = old.pending;
  }
  for (const NodeId node : {a, b}) {
    if (Parent(node) != 0) Insert(node, HashOf(node));
  }
  LinkAll(a);
  LinkAll(b);
  NoteMove(a);
  NoteMove(b);
}

void PathTrie::Exchange(NodeId a, NodeId b) {
  SwapPlaces(a, b, false);
}

void PathTrie::ExchangeBelow(NodeId a, NodeId b) {
  SwapPlaces(a, b, true);
}

void PathTrie::Reparent(NodeId node, NodeId parent) {
  UnlinkAll(node);
  Erase(node);
  nodes_[node].parent = parent;
  Insert(node, HashOf(node));
  LinkAll(node);
  NoteMove(node);
}

void PathTrie::Detach(NodeId node) {
  NoteMove(node);
  if (node == root_) {
    root_ = Add(0, nodes_[node].name);
    return;
  }
  UnlinkAll(node);
  Erase(node);
  nodes_[node].parent = 0;
}

uint32_t PathTrie::HashOf(NodeId node) const {
  return HashChild(Parent(node), HashName(Name(node)));
}

NodeId PathTrie::Lookup(NodeId parent, std::string_view name, uint32_t hash) const {
  const size_t mask = slots_.size() - 1;
  for (size_t i = hash & mask; slots_[i].node != 0; i = (i + 1) & mask) {
    if (slots_[i].hash != hash) continue;
    const Node& node = nodes_[slots_[i].node];
    if (node.parent == parent && names_[node.name] == name) return slots_[i].node;
  }
  return 0;
}

void PathTrie::Insert(NodeId node, uint32_t hash) {
  if ((used_slots_ + 1) * 4 > slots_.size() * 3) Grow();
  const size_t mask = slots_.size() - 1;
  size_t i = hash & mask;
  while (slots_[i].node != 0) i = (i + 1) & mask;
  slots_[i] = {hash, node};
  ++used_slots_;
}

// Linear probing without tombstones: what follows in the run moves up into the gap.
void PathTrie::Erase(NodeId node) {
  if (Parent(node) == 0) return;  // detached
  const size_t mask = slots_.size() - 1;
  size_t gap = HashOf(node) & mask;
  while (slots_[gap].node != node) gap = (gap + 1) & mask;
  for (size_t i = (gap + 1) & mask; slots_[i].node != 0; i = (i + 1) & mask) {
    const size_t home = slots_[i].hash & mask;
    if (((i - home) & mask) >= ((i - gap) & mask)) {
      slots_[gap] = slots_[i];
      gap = i;
    }
  }
  slots_[gap] = {};
  --used_slots_;
}

void PathTrie::Grow() {
  std::vector<Slot> old(slots_.size() * 2);
  old.swap(slots_);
  const size_t mask = slots_.size() - 1;
  for (const Slot& slot : old) {
    if (slot.node == 0) continue;
    size_t i = slot.hash & mask;
    while (slots_[i].node != 0) i = (i + 1) & mask;
    slots_[i] = slot;
  }
}

}  // namespace quarrox::fileindex
