// The merge itself, on small records.
//
// There are two tries of paths. One holds what moves when a directory is renamed: every operation but deletes. The
// other holds the deletes, which stay where they are. So a rename moves a whole subtree of the first by changing one
// key, and where the new place has pending operations of its own the smaller side is merged into the larger, name by
// name. The operations at one place form a group (so that a place's operations move together), with one list for each
// kind (so that a rule applies to a list, not to an operation after the other).
#pragma once

#include <array>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "fileindex/chunked_array.h"
#include "fileindex/optree.h"
#include "fileindex/optree_event.h"
#include "fileindex/path_trie.h"

namespace quarrox::fileindex {

// Whether a path can have a node.
bool CanHaveNode(std::string_view path);

// The path as its node bears it: without doubled or trailing slashes, so that the root's is empty.
std::string NodePath(std::string_view path);

// The five flags of OP::MergeData.
void MergeFlags(Json::Value& data, const Json::Value& other);

class OPFold {
 public:
  using OpId = uint32_t;  // in order of acceptance; 0 is none

  OPFold();

  // Throws Error 9999.
  void InsertEvent(const EventView& event);

  bool crashed() const { return crashed_; }
  size_t entries() const { return ops_.size() - 1; }

  FileIndexOP Kind(OpId op) const { return static_cast<FileIndexOP>(ops_[op].kind); }
  std::string Path(OpId op) const;
  std::string PathOld(OpId op) const;
  Json::Value Data(OpId op) const;

  // The operations pending on a path, oldest first.
  std::vector<OpId> PendingAt(std::string_view path);
  bool HasNode(std::string_view path);
  void MakeNode(std::string_view path);
  // The paths of all nodes, each once, sorted.
  std::vector<std::string> AllPaths() const;

  // The one view of a path, kept until Release finds that nobody else holds it.
  std::shared_ptr<OPNode> View(const std::shared_ptr<OPFold>& self, const std::string& path);
  void Release(const std::string& path);

 private:
  static constexpr int kKinds = kOpReindex;
  static constexpr size_t kFilterBits = size_t{1} << 19;
  static constexpr size_t kOldDirectories = 4096;

  struct OpRecord {
    uint32_t place;  // its group; for a delete its node among the deletes
    OpId next;       // in the list of its kind at its place
    uint32_t order;  // within its place: larger is later
    uint32_t kind : 3;
    uint32_t extra : 29;
  };
  struct Extra {
    uint32_t old_directory;  // of the old path; 0 is none
    uint32_t old_name;
    uint32_t data;  // in data_; 0 is null
  };
  struct Group {
    NodeId node;
    uint32_t first;                 // no operation here has a smaller order
    std::array<OpId, kKinds> head;  // by kind - 2; deletes are elsewhere
    OpId& of(FileIndexOP kind) { return head[static_cast<size_t>(kind) - 2]; }
    OpId of(FileIndexOP kind) const { return head[static_cast<size_t>(kind) - 2]; }
  };
  // The operation that an event brings, before and after it was accepted.
  struct NewOp {
    FileIndexOP kind = kOpNone;
    std::string_view path_old;
    std::string_view data;
    OpId id = 0;
  };
  enum Row { kRowCreate, kRowModify, kRowAttr, kRowDelete, kRowUpdateDirectory, kRowReindex, kRows };
  enum class DataRule { kKeep, kTake, kMerge };
  struct Rule {
    FileIndexOP becomes;  // kOpNone: stays what it is
    bool drop;
    DataRule data;
  };
  static const Rule kRules[kRows][kKinds];

  void HandleCreate(const PathKey& path, NewOp& op) { HandleByRow(path, op, kRowCreate); }
  void HandleModifyAndCloseWrite(const PathKey& path, NewOp& op) { HandleByRow(path, op, kRowModify); }
  void HandleAttr(const PathKey& path, NewOp& op) { HandleByRow(path, op, kRowAttr); }
  void HandleDelete(const PathKey& path, NewOp& op) { HandleByRow(path, op, kRowDelete); }
  void HandleUpdateDirectory(const PathKey& path, NewOp& op) { HandleByRow(path, op, kRowUpdateDirectory); }
  void HandleReindex(const PathKey& path, NewOp& op);
  void HandleRename(const PathKey& path, std::string_view path_old, NewOp& op);

  void HandleByRow(const PathKey& path, NewOp& op, Row row);
  bool ApplyRules(const PathKey& path, Row row, const NewOp& op);
  void ApplyDataRule(OpId list, DataRule rule, const NewOp& op);
  void Settle(const PathKey& path, NewOp& op);
  void Withdraw(const PathKey& path, NewOp& op);
  void Unlist(OpId& list, OpId op);
  void VoidBelow(const PathKey& path);

  FileIndexOP WithdrawWork(NodeId node);
  void MoveDeletes(const PathKey& from, const PathKey& to);
  void MoveOps(NodeId from, NodeId to);
  void MoveBelow(NodeId from, NodeId to);
  void MergeChildren(NodeId moved, NodeId resident, std::vector<std::pair<NodeId, NodeId>>& pairs);
  std::vector<OpId> TakeOps(NodeId node);
  void SwapOps(NodeId a, NodeId b);
  void ExchangeBelow(NodeId a, NodeId b);

  void Put(const PathKey& path, OpId op, FileIndexOP kind);
  void PutAt(NodeId node, OpId op, FileIndexOP kind);
  NodeId FindDeleted(const PathKey& path);
  NodeId MakeDeleted(const PathKey& path);
  void PutDelete(NodeId node, OpId op);
  void Kill(OpId list);
  OpId TakeDeletes(NodeId node);
  uint32_t GroupOf(NodeId node);
  bool HasOps(NodeId node) const;
  bool HasFewerOps(NodeId a, NodeId b) const;
  size_t CountOps(NodeId node, size_t limit) const;
  void RefreshMarks(NodeId node);
  void SetData(OpId op, std::string_view data);
  void SetExtra(OpId op, const Extra& extra);
  Extra MakeExtra(std::string_view path_old, uint32_t data);
  uint32_t Intern(std::string_view data);
  Extra ExtraOf(OpId op) const { return extras_[ops_[op].extra]; }

  TextStore texts_;
  PathTrie moving_;  // lane kWork: what a reindex voids; lane kAny: everything
  PathTrie deletes_;
  ChunkedArray<OpRecord> ops_;
  ChunkedArray<Group> groups_;
  ChunkedArray<Extra> extras_;
  std::vector<uint32_t> old_directories_;  // those met lately, by hash: renames mostly stay in few directories
  std::vector<std::string> data_;
  std::unordered_map<std::string, uint32_t> data_ids_;
  std::vector<bool> ever_deleted_;  // by a name's hash; false: never
  size_t pending_deletes_ = 0;
  uint32_t order_ = uint32_t{1} << 31;  // the newest; a group may grow at its old end, too
  bool crashed_ = false;
  std::unordered_map<std::string, std::shared_ptr<OPNode>> views_;
};

}  // namespace quarrox::fileindex
