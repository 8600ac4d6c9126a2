#define QUARROX_LOG_UNIT "optree"

#include "fileindex/optree_fold.h"

#include <algorithm>
#include <iterator>
#include <set>
#include <utility>

#include "common/log.h"

namespace quarrox::fileindex {
namespace {

constexpr int kWork = 0;  // what a reindex above voids: everything but renames
constexpr int kAny = 1;

// The kernel takes paths of 4 KiB; sixteen times that leaves room for those that are reached step by step.
constexpr size_t kMaxPath = TextStore::kMaxText;

}  // namespace

std::string NodePath(std::string_view path) {
  std::string result;
  std::unique_copy(path.begin(), path.end(), std::back_inserter(result),
                   [](char a, char b) { return a == '/' && b == '/'; });
  if (!result.empty() && result.back() == '/') result.pop_back();
  return result;
}

bool CanHaveNode(std::string_view path) {
  return !path.empty() && path.front() == '/' && path.size() <= kMaxPath && path.find('\0') == std::string_view::npos;
}

void MergeFlags(Json::Value& data, const Json::Value& other) {
  if (!data.isObject()) data = Json::Value(Json::objectValue);
  for (const char* key : {"document", "audio", "video", "photo", "basic"}) {
    bool incoming = false;
    if (other.isObject()) GetJsonValue(incoming, other, key, false);
    const bool current = data[key].isBool() && data[key].asBool();
    data[key] = incoming || current;
  }
}

// The table of optree.h: what a pending operation of kind 1 to 6 becomes, whether the new one is dropped, whose data
// counts.
const OPFold::Rule OPFold::kRules[kRows][kKinds] = {
#define KEEP_BOTH \
  { kOpNone, false, DataRule::kKeep }
#define DROP \
  { kOpNone, true, DataRule::kKeep }
#define BECOMES(kind) \
  { kind, true, DataRule::kKeep }
#define TAKES_DATA \
  { kOpUpdateDirectory, true, DataRule::kTake }
#define MERGES_DATA \
  { kOpNone, true, DataRule::kMerge }
    /* create */ {BECOMES(kOpCreate), DROP, BECOMES(kOpCreate), DROP, KEEP_BOTH, DROP},
    /* modify */ {DROP, DROP, BECOMES(kOpCreate), DROP, KEEP_BOTH, DROP},
    /* attr */ {DROP, DROP, DROP, DROP, KEEP_BOTH, DROP},
    /* delete */ {DROP, BECOMES(kOpDelete), BECOMES(kOpDelete), KEEP_BOTH, KEEP_BOTH, KEEP_BOTH},
    /* update */ {DROP, TAKES_DATA, TAKES_DATA, MERGES_DATA, KEEP_BOTH, DROP},
    /* reindex */ {DROP, BECOMES(kOpReindex), BECOMES(kOpReindex), BECOMES(kOpReindex), KEEP_BOTH, DROP},
#undef KEEP_BOTH
#undef DROP
#undef BECOMES
#undef TAKES_DATA
#undef MERGES_DATA
};

OPFold::OPFold()
    : moving_(texts_, 16384),
      deletes_(texts_, 1024),
      old_directories_(kOldDirectories),
      data_(1),
      ever_deleted_(kFilterBits) {
  ops_.Add(OpRecord{});
  groups_.Add(Group{});
  extras_.Add(Extra{});
}

void OPFold::InsertEvent(const EventView& event) {
  // Damage counts whatever else is wrong with the line.
  if ((event.event & kEventQueueDamaged) != 0) crashed_ = true;
  if (!CanHaveNode(event.path)) {
    QUARROX_THROW("!node", kErrInternal, "GetNodeByPath failed, path=" + std::string(event.path));
  }
  const PathKey path(event.path);
  NewOp op;
  op.data = event.data;
  const uint32_t bits = event.event;
  try {
    if ((bits & kEventCreate) != 0) event.is_dir ? HandleReindex(path, op) : HandleCreate(path, op);
    if ((bits & kEventAttr) != 0) HandleAttr(path, op);
    if ((bits & (kEventModify | kEventCloseWrite)) != 0) HandleModifyAndCloseWrite(path, op);
    if ((bits & kEventDelete) != 0) event.is_dir ? HandleReindex(path, op) : HandleDelete(path, op);
    if ((bits & kEventRename) != 0) HandleRename(path, event.path_old, op);
    if ((bits & kEventReindex) != 0) HandleReindex(path, op);
    if ((bits & kEventUpdateDirectory) != 0) HandleUpdateDirectory(path, op);
  } catch (const std::length_error&) {
    // More paths or operations than can be numbered: what cannot be told apart any more is the whole share's matter.
    crashed_ = true;
  }
}

// --- the handlers ------------------------------------------------------------------------------------------------

void OPFold::HandleByRow(const PathKey& path, NewOp& op, Row row) {
  static constexpr FileIndexOP kKindOfRow[kRows] = {kOpCreate, kOpCreate,          kOpAttr,
                                                    kOpDelete, kOpUpdateDirectory, kOpReindex};
  Withdraw(path, op);
  op.kind = ApplyRules(path, row, op) ? kOpNone : kKindOfRow[row];
  Settle(path, op);
}

void OPFold::HandleReindex(const PathKey& path, NewOp& op) {
  HandleByRow(path, op, kRowReindex);
  VoidBelow(path);  // also when the operation itself was absorbed
}

void OPFold::HandleRename(const PathKey& path, std::string_view path_old, NewOp& op) {
  if (!CanHaveNode(path_old)) return HandleReindex(path, op);
  const PathKey old(path_old);
  Withdraw(path, op);
  const NodeId node = moving_.Make(path);
  const NodeId old_node = moving_.Find(old);

  // What was pending under the new name is superseded by what arrives from the old one.
  if (const uint32_t group = moving_.payload(node); group != 0) {
    Kill(std::exchange(groups_[group].of(kOpCreate), 0));
    Kill(std::exchange(groups_[group].of(kOpAttr), 0));
    RefreshMarks(node);
  }
  if (const NodeId deleted = FindDeleted(path); deleted != 0) Kill(TakeDeletes(deleted));

  NewOp follow;  // the work that follows the file to its new name
  follow.data = op.data;
  if (old_node != 0) {
    follow.kind = WithdrawWork(old_node);
    if (old_node != node) MoveOps(old_node, node);
  }
  MoveDeletes(old, path);
  if (old_node != 0 && old_node != node) MoveBelow(old_node, node);

  op.kind = kOpRename;
  op.path_old = path_old;
  Settle(path, op);
  Settle(path, follow);
}

// Lets every pending operation of the path change. True when the new one was absorbed.
bool OPFold::ApplyRules(const PathKey& path, Row row, const NewOp& op) {
  const NodeId node = moving_.Find(path);
  const uint32_t group = node == 0 ? 0 : moving_.payload(node);
  const NodeId deleted = FindDeleted(path);
  std::array<OpId, kKinds> pending{};  // all taken out before a rule runs: each operation meets its rule once
  bool drop = false;
  bool changed = false;
  for (size_t i = 0; i < kKinds; ++i) {
    const auto kind = static_cast<FileIndexOP>(i + 1);
    pending[i] = kind == kOpDelete ? deletes_.payload(deleted) : groups_[group].of(kind);
    if (pending[i] == 0) continue;
    const Rule& rule = kRules[row][i];
    drop |= rule.drop;
    ApplyDataRule(pending[i], rule.data, op);
    if (rule.becomes == kOpNone) {
      pending[i] = 0;
    } else {
      changed = true;
      kind == kOpDelete ? static_cast<void>(TakeDeletes(deleted)) : static_cast<void>(groups_[group].of(kind) = 0);
    }
  }
  if (!changed) return drop;
  for (size_t i = 0; i < kKinds; ++i) {
    for (OpId e = pending[i]; e != 0;) {
      const OpId next = ops_[e].next;
      // A create that revives a delete makes it the newest operation of its path: what moved here since came without
      // its age.
      if (i + 1 == kOpDelete) ops_[e].order = ++order_;
      Put(path, e, kRules[row][i].becomes);
      e = next;
    }
  }
  if (group != 0) RefreshMarks(node);
  return drop;
}

// The rule's say about data.
void OPFold::ApplyDataRule(OpId list, DataRule rule, const NewOp& op) {
  if (rule == DataRule::kKeep) return;
  if (rule == DataRule::kTake) {
    for (OpId e = list; e != 0; e = ops_[e].next) SetData(e, op.data);
    return;
  }
  Json::Value incoming;
  if (!op.data.empty()) fromString(incoming, std::string(op.data));
  for (OpId e = list; e != 0; e = ops_[e].next) {
    Json::Value data = Data(e);
    MergeFlags(data, incoming);
    SetData(e, toString(data));
  }
}

// Enters the operation where it belongs now; the acceptance list once, when it first survives a handler.
void OPFold::Settle(const PathKey& path, NewOp& op) {
  if (op.kind == kOpNone) return;
  if (op.id == 0) op.id = ops_.Add(OpRecord{});
  SetExtra(op.id, MakeExtra(op.path_old, Intern(op.data)));
  ops_[op.id].order = ++order_;
  Put(path, op.id, op.kind);
}

// An event of several bits passes several handlers with one operation, which is never its own pending operation: before
// each it is taken out of its place again, and keeps its turn.
void OPFold::Withdraw(const PathKey& path, NewOp& op) {
  if (op.id == 0 || op.kind == kOpNone) return;
  const FileIndexOP kind = Kind(op.id);
  ops_[op.id].kind = kOpNone;
  op.kind = kOpNone;
  if (kind != kOpDelete) {
    const NodeId node = moving_.Find(path);
    Unlist(groups_[moving_.payload(node)].of(kind), op.id);
    RefreshMarks(node);
    return;
  }
  const NodeId node = deletes_.Find(path);
  OpId others = TakeDeletes(node);
  Unlist(others, op.id);
  while (others != 0) PutDelete(node, std::exchange(others, ops_[others].next));
}

void OPFold::Unlist(OpId& list, OpId op) {
  OpId* link = &list;
  while (*link != op) link = &ops_[*link].next;
  *link = ops_[op].next;
}

void OPFold::VoidBelow(const PathKey& path) {
  if (const NodeId top = moving_.Find(path); top != 0 && moving_.HasBelow(top, kWork)) {
    const std::vector<NodeId> below = moving_.Below(top, kWork);
    for (auto node = below.rbegin(); node != below.rend(); ++node) {
      const uint32_t group = moving_.payload(*node);
      if (group == 0) continue;
      for (const FileIndexOP kind : {kOpCreate, kOpAttr, kOpUpdateDirectory, kOpReindex}) {
        Kill(std::exchange(groups_[group].of(kind), 0));
      }
      RefreshMarks(*node);
    }
  }
  if (pending_deletes_ == 0) return;
  if (const NodeId top = deletes_.Find(path); top != 0 && deletes_.HasBelow(top, kAny)) {
    const std::vector<NodeId> below = deletes_.Below(top, kAny);
    for (auto node = below.rbegin(); node != below.rend(); ++node) Kill(TakeDeletes(*node));
  }
}

// --- renames -----------------------------------------------------------------------------------------------------

// Voids the old node's creates, attribute changes and reindexes and returns the newest one's kind.
FileIndexOP OPFold::WithdrawWork(NodeId node) {
  const uint32_t group = moving_.payload(node);
  if (group == 0) return kOpNone;
  FileIndexOP newest = kOpNone;
  uint32_t order = 0;
  for (const FileIndexOP kind : {kOpCreate, kOpAttr, kOpReindex}) {
    const OpId list = std::exchange(groups_[group].of(kind), 0);
    for (OpId e = list; e != 0; e = ops_[e].next) {
      if (ops_[e].order >= order) {
        order = ops_[e].order;
        newest = kind;
      }
    }
    Kill(list);
  }
  RefreshMarks(node);
  return newest;
}

// The deletes of the old path itself go along; those below it stay.
void OPFold::MoveDeletes(const PathKey& from, const PathKey& to) {
  const NodeId old_node = FindDeleted(from);
  if (old_node == 0 || deletes_.payload(old_node) == 0) return;
  const NodeId node = MakeDeleted(to);
  if (node == old_node) return;
  for (OpId e = TakeDeletes(old_node); e != 0;) {
    const OpId next = ops_[e].next;
    PutDelete(node, e);
    e = next;
  }
}

// Appends the operations of one place to those of another, by moving the smaller side.
void OPFold::MoveOps(NodeId from, NodeId to) {
  if (!HasOps(from)) return;
  const bool resident_moves = HasFewerOps(to, from);
  std::vector<OpId> ops = TakeOps(resident_moves ? to : from);
  if (resident_moves) SwapOps(from, to);
  // The resident's come before all others, what arrives comes last.
  uint32_t order = order_ + 1;
  if (resident_moves) {
    uint32_t& first = groups_[GroupOf(to)].first;
    order = first -= static_cast<uint32_t>(ops.size());
  } else {
    order_ += static_cast<uint32_t>(ops.size());
  }
  for (const OpId op : ops) {
    ops_[op].order = order++;
    PutAt(to, op, Kind(op));
  }
  RefreshMarks(from);
  RefreshMarks(to);
}

// Takes all operations out of a place, oldest first.
std::vector<OPFold::OpId> OPFold::TakeOps(NodeId node) {
  std::vector<OpId> ops;
  const uint32_t group = moving_.payload(node);
  if (group == 0) return ops;
  for (OpId& head : groups_[group].head) {
    for (OpId e = std::exchange(head, 0); e != 0; e = ops_[e].next) ops.push_back(e);
  }
  std::sort(ops.begin(), ops.end(), [this](OpId a, OpId b) { return ops_[a].order < ops_[b].order; });
  return ops;
}

void OPFold::SwapOps(NodeId a, NodeId b) {
  const uint32_t group_a = moving_.payload(a);
  const uint32_t group_b = moving_.payload(b);
  moving_.set_payload(a, group_b);
  moving_.set_payload(b, group_a);
  if (group_a != 0) groups_[group_a].node = b;
  if (group_b != 0) groups_[group_b].node = a;
}

// What is below two places changes sides; what is pending on the places themselves stays.
void OPFold::ExchangeBelow(NodeId a, NodeId b) {
  moving_.ExchangeBelow(a, b);
  for (const NodeId node : {a, b}) {
    if (const uint32_t group = moving_.payload(node); group != 0) groups_[group].node = node;
  }
}

// Moves what is pending below `from` to the same places below `to`. Nothing that stays lies there, so where nothing is
// pending below `to` the subtree moves whole; else the two are merged, child by child, as far down as both have
// something.
void OPFold::MoveBelow(NodeId from, NodeId to) {
  if (!moving_.HasBelow(from, kAny)) return;
  if (moving_.IsAncestor(from, to) || moving_.IsAncestor(to, from)) {
    // A move into itself or onto its own ancestor: the new place is found anew once the moved tree is out of the way.
    const std::string path = moving_.Path(to);
    moving_.Detach(from);
    to = moving_.Make(PathKey(path));
  }
  std::vector<std::pair<NodeId, NodeId>> pairs{{from, to}};
  while (!pairs.empty()) {
    const auto [moved, resident] = pairs.back();
    pairs.pop_back();
    if (!moving_.HasBelow(moved, kAny)) continue;
    if (!moving_.HasBelow(resident, kAny) && resident != moving_.root()) {
      ExchangeBelow(moved, resident);
    } else {
      MergeChildren(moved, resident, pairs);
    }
  }
}

// One level of a merge. The side with fewer children is the one that is taken apart.
void OPFold::MergeChildren(NodeId moved, NodeId resident, std::vector<std::pair<NodeId, NodeId>>& pairs) {
  const bool take_moved = resident == moving_.root() || moving_.HasFewerChildren(moved, resident, kAny);
  if (!take_moved) ExchangeBelow(moved, resident);  // now the many children are in place, and the few go back to them
  const NodeId source = take_moved ? moved : resident;
  const NodeId target = take_moved ? resident : moved;
  for (const NodeId child : moving_.Children(source, kAny)) {
    const NodeId there = moving_.Child(target, moving_.Name(child));
    if (there == 0) {
      moving_.Reparent(child, target);
    } else if (!moving_.HasAtOrBelow(there, kAny)) {
      moving_.Exchange(child, there);
    } else if (take_moved) {
      MoveOps(child, there);
      pairs.emplace_back(child, there);
    } else {
      moving_.Exchange(child, there);
      MoveOps(there, child);
      pairs.emplace_back(there, child);
    }
  }
}

// --- records -----------------------------------------------------------------------------------------------------

void OPFold::Put(const PathKey& path, OpId op, FileIndexOP kind) {
  if (kind == kOpDelete) return PutDelete(MakeDeleted(path), op);
  const NodeId node = moving_.Make(path);
  PutAt(node, op, kind);
  moving_.SetPending(node, kAny, true);
  if (kind != kOpRename) moving_.SetPending(node, kWork, true);
}

void OPFold::PutAt(NodeId node, OpId op, FileIndexOP kind) {
  const uint32_t group = GroupOf(node);
  OpRecord& record = ops_[op];
  OpId& head = groups_[group].of(kind);
  record.place = group;
  record.kind = static_cast<uint32_t>(kind) & 7U;
  record.next = head;
  head = op;
  groups_[group].first = std::min(groups_[group].first, record.order);
}

// The node of a path among the deletes. For most paths nothing of their name was ever deleted, which a filter tells at
// once.
NodeId OPFold::FindDeleted(const PathKey& path) {
  return pending_deletes_ != 0 && ever_deleted_[path.name_hash() % kFilterBits] ? deletes_.Find(path) : 0;
}

NodeId OPFold::MakeDeleted(const PathKey& path) {
  ever_deleted_[path.name_hash() % kFilterBits] = true;
  return deletes_.Make(path);
}

void OPFold::PutDelete(NodeId node, OpId op) {
  OpRecord& record = ops_[op];
  record.place = node;
  record.kind = kOpDelete;
  record.next = deletes_.payload(node);
  deletes_.set_payload(node, op);
  deletes_.SetPending(node, kAny, true);
  ++pending_deletes_;
}

void OPFold::Kill(OpId list) {
  for (OpId e = list; e != 0; e = ops_[e].next) ops_[e].kind = kOpNone;
}

// Takes all deletes out of a place. They keep their kind until they are put elsewhere or killed.
OPFold::OpId OPFold::TakeDeletes(NodeId node) {
  const OpId list = deletes_.payload(node);
  for (OpId e = list; e != 0; e = ops_[e].next) --pending_deletes_;
  deletes_.set_payload(node, 0);
  deletes_.SetPending(node, kAny, false);
  return list;
}

uint32_t OPFold::GroupOf(NodeId node) {
  uint32_t group = moving_.payload(node);
  if (group == 0) {
    group = groups_.Add({node, UINT32_MAX, {}});
    moving_.set_payload(node, group);
  }
  return group;
}

bool OPFold::HasOps(NodeId node) const {
  const auto& head = groups_[moving_.payload(node)].head;
  return std::any_of(head.begin(), head.end(), [](OpId e) { return e != 0; });
}

// Whether `a` has fewer operations than `b`, at the cost of the smaller number.
bool OPFold::HasFewerOps(NodeId a, NodeId b) const {
  for (size_t limit = 1;; limit *= 2) {
    const size_t count_a = CountOps(a, limit);
    const size_t count_b = CountOps(b, limit);
    if (count_a < limit || count_b < limit) return count_a < count_b;
  }
}

// The number of operations at a place, or `limit` when there are no fewer.
size_t OPFold::CountOps(NodeId node, size_t limit) const {
  size_t count = 0;
  for (OpId head : groups_[moving_.payload(node)].head) {
    for (OpId e = head; e != 0 && count < limit; e = ops_[e].next) ++count;
  }
  return count;
}

void OPFold::RefreshMarks(NodeId node) {
  const Group& group = groups_[moving_.payload(node)];
  const bool work =
      (group.of(kOpCreate) | group.of(kOpAttr) | group.of(kOpUpdateDirectory) | group.of(kOpReindex)) != 0;
  moving_.SetPending(node, kWork, work);
  moving_.SetPending(node, kAny, work || group.of(kOpRename) != 0);
}

void OPFold::SetExtra(OpId op, const Extra& extra) {
  if (ops_[op].extra != 0) {
    extras_[ops_[op].extra] = extra;
  } else if (extra.old_directory != 0 || extra.data != 0) {
    ops_[op].extra = extras_.Add(extra) & 0x1fffffff;
  }
}

void OPFold::SetData(OpId op, std::string_view data) {
  Extra extra = ExtraOf(op);
  extra.data = Intern(data);
  SetExtra(op, extra);
}

OPFold::Extra OPFold::MakeExtra(std::string_view path_old, uint32_t data) {
  if (path_old.empty()) return {0, 0, data};
  const size_t name = path_old.rfind('/') + 1;
  const std::string_view directory = path_old.substr(0, name);
  uint32_t& known = old_directories_[std::hash<std::string_view>()(directory) % kOldDirectories];
  if (known == 0 || texts_[known] != directory) known = texts_.Add(directory);
  return {known, texts_.Add(path_old.substr(name)), data};
}

// Equal data is kept once: requests about one folder carry its configuration again and again.
uint32_t OPFold::Intern(std::string_view data) {
  if (data.empty()) return 0;
  const auto [entry, added] = data_ids_.try_emplace(std::string(data), static_cast<uint32_t>(data_.size()));
  if (added) data_.push_back(entry->first);
  return entry->second;
}

std::string OPFold::Path(OpId op) const {
  const OpRecord& record = ops_[op];
  return record.kind == kOpDelete ? deletes_.Path(record.place) : moving_.Path(groups_[record.place].node);
}

std::string OPFold::PathOld(OpId op) const {
  const Extra extra = ExtraOf(op);
  if (Kind(op) != kOpRename || extra.old_directory == 0) return std::string();
  return std::string(texts_[extra.old_directory]).append(texts_[extra.old_name]);
}

Json::Value OPFold::Data(OpId op) const {
  Json::Value data;
  if (const uint32_t id = ExtraOf(op).data; id != 0) fromString(data, data_[id]);
  return data;
}

// --- views -------------------------------------------------------------------------------------------------------

std::vector<OPFold::OpId> OPFold::PendingAt(std::string_view path_text) {
  std::vector<OpId> ops;
  const PathKey path(path_text);
  if (const NodeId node = moving_.Find(path); node != 0) {
    for (const OpId head : groups_[moving_.payload(node)].head) {
      for (OpId e = head; e != 0; e = ops_[e].next) ops.push_back(e);
    }
  }
  for (OpId e = deletes_.payload(FindDeleted(path)); e != 0; e = ops_[e].next) ops.push_back(e);
  std::sort(ops.begin(), ops.end(), [this](OpId a, OpId b) { return ops_[a].order < ops_[b].order; });
  return ops;
}

bool OPFold::HasNode(std::string_view path) {
  const PathKey key(path);
  return moving_.Find(key) != 0 || FindDeleted(key) != 0;
}

void OPFold::MakeNode(std::string_view path) {
  moving_.Make(PathKey(path));
}

std::vector<std::string> OPFold::AllPaths() const {
  std::set<std::string> paths;
  for (const PathTrie* trie : {&moving_, &deletes_}) {
    for (NodeId node = 1; node < trie->Limit(); ++node) {
      if (trie->IsAttached(node)) paths.insert(trie->Path(node));
    }
  }
  return {paths.begin(), paths.end()};
}

std::shared_ptr<OPNode> OPFold::View(const std::shared_ptr<OPFold>& self, const std::string& path) {
  std::shared_ptr<OPNode>& view = views_[path];
  if (!view) view = newClass<OPNode>(self, path);
  return view;
}

void OPFold::Release(const std::string& path) {
  const auto view = views_.find(path);
  if (view != views_.end() && view->second.use_count() == 1) views_.erase(view);
}

}  // namespace quarrox::fileindex
