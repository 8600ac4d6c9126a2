// Folds one share's queue of raw file-system events into the few operations that the index needs.
//
// A raw event line is a JSON object: "event" (bit mask), "path" (absolute), and optionally "is_dir", "path_old" (the
// former path of a rename) and "data" (what parts of the index to refresh). Each bit becomes an operation on the path,
// which is merged with what is already pending there:
//
//   new \ pending     1 delete   2 create   3 attr     4 update   5 rename   6 reindex
//   create            E=2, drop  drop       E=2, drop  drop       both       drop
//   modify            drop       drop       E=2, drop  drop       both       drop
//   attr              drop       drop       drop       drop       both       drop
//   delete            drop       E=1, drop  E=1, drop  both       both       both
//   update directory  drop       E=4*,drop  E=4*,drop  merge,drop both       drop
//   reindex           drop       E=6, drop  E=6, drop  E=6, drop  both       drop
//
//   E=k: the pending operation becomes kind k.  drop: the new operation is absorbed.  both: it is queued as well.
//   *: the pending operation takes the new one's data.  merge: its flags are widened by the new one's.
//   A delete that becomes a create counts as the newest operation of its path.
//
// The asymmetries are wanted. A modify after a pending delete is dropped, because a file that is written once more
// after its deletion is still gone; a create after a delete revives it. A delete does not absorb an update or a reindex
// of the same path: these concern a directory that may come back under the same name, so the delete is queued behind
// them.
//
// Beyond its own path a reindex voids everything pending below it but renames, and a rename carries what is pending at
// the old path and below it (but deletes below, which stay) to the new path.
#pragma once

#include <cstddef>
#include <cstdint>
#include <iosfwd>
#include <memory>
#include <string>
#include <string_view>

#include <boost/function.hpp>

#include "common/export.h"
#include "common/json.h"
#include "common/strings.h"

namespace quarrox::fileindex {

// What happened, as bits of a raw event's mask, in the order in which they are examined.
enum EventBit : uint32_t {
  kEventCreate = 0x40,
  kEventAttr = 0x04,
  kEventModify = 0x02,
  kEventCloseWrite = 0x08,
  kEventDelete = 0x80,
  kEventRename = 0x100,
  kEventReindex = 0x10000,
  kEventUpdateDirectory = 0x20000,
  kEventQueueDamaged = 0x200,  // events were lost: nothing less than the whole share will do
};

enum FileIndexOP : int32_t {
  kOpNone = 0,             // absorbed by another operation; never handed out
  kOpDelete = 1,           // delete the path's documents
  kOpCreate = 2,           // create or update the path's document
  kOpAttr = 3,             // update the path's attributes only
  kOpUpdateDirectory = 4,  // update a directory's settings; carries data
  kOpRename = 5,           // move from the old path to the node's path
  kOpReindex = 6,          // reindex the path and everything below it
  kOpQueueCrashed = 7,     // reindex the whole share; made by the tree only
};

// One raw event line, parsed.
struct QUARROX_API Event {
  // Throws Error 906 when the line is not JSON and 120 when a required member is missing or of the wrong type. An
  // optional member of the wrong type counts as absent.
  explicit Event(const std::string& event_raw);

  uint32_t event = 0;
  bool is_dir = false;
  std::string path;
  std::string path_old;
  Json::Value data;
};

class OPNode;

// One pending operation. The path is always its node's.
class QUARROX_API OP {
 public:
  OP(const std::shared_ptr<OPNode>& node, FileIndexOP op, const std::string& path_old, const Json::Value& data);

  // Widens this operation's data: each of the flags "document", "audio", "video", "photo" and "basic" becomes true
  // where it is true in either, false where it is true in neither. Other members stay; other members of `other` are
  // ignored. Data that is no object merges as one without members.
  void MergeData(const Json::Value& other);

  std::weak_ptr<OPNode> node;
  FileIndexOP op;
  std::string path_old;  // a rename's old path, else empty
  Json::Value data;
};

// "[05] OLD -> PATH, data=JSON"; the old path for a rename only. Throws std::bad_weak_ptr when the node is gone.
QUARROX_API std::ostream& operator<<(std::ostream& stream, const OP& op);

class OPFold;

// A path in an OPTree. A node is a view: it is made when it is asked for, stays at its path, and is valid as long as
// the tree is; afterwards its questions throw std::bad_weak_ptr.
class QUARROX_API OPNode : public std::enable_shared_from_this<OPNode> {
 public:
  OPNode(const std::shared_ptr<OPFold>& fold, std::string path);

  // The full path; empty for the root, whose name is the tree's base, the empty text.
  const std::string& GetPath() const { return path_; }

  // The last component.
  std::string GetName() const { return Basename(path_); }

  // Null for the root.
  std::shared_ptr<OPNode> GetParent() const;

  // Null where no event has touched such a child.
  std::shared_ptr<OPNode> GetChild(const std::string& name) const;

  // Calls `fn` on each operation pending on this path, oldest first, over a snapshot: `fn` may insert events.
  void TraverseOP(const boost::function<void(std::shared_ptr<OP>)>& fn);

 private:
  std::weak_ptr<OPFold> fold_;
  std::string path_;
};

// "Node[PATH]: " and the operations.
QUARROX_API std::ostream& operator<<(std::ostream& stream, OPNode& node);

// The operations pending for one queue file. Not thread-safe.
//
// Operations and nodes are kept as small records; an OP is made when it is handed out and shows the operation as it is
// then.
class QUARROX_API OPTree {
 public:
  // What BuildTree read.
  struct Counts {
    size_t lines = 0;
    size_t bad_lines = 0;  // of these, logged and skipped
  };

  explicit OPTree(const std::string& queue_path);
  ~OPTree();
  OPTree(const OPTree&) = delete;
  OPTree& operator=(const OPTree&) = delete;

  // Reads the queue file and inserts every event. A line that cannot be inserted is logged and skipped; one of more
  // than 16 MiB is such a line. Throws Error 502 when the file cannot be opened or read.
  void BuildTree();

  // Throws Error 9999 when the path can have no node: one that is relative, empty, holds a zero byte or is longer than
  // 64 KiB (the kernel takes 4 KiB). The queue-damaged bit counts also then. A rename whose old path can have no node
  // is a reindex of its path.
  void InsertEvent(const std::shared_ptr<Event>& event);

  // The node of a path, made where it is missing. Doubled and trailing slashes name the same node. Null where the path
  // can have no node.
  std::shared_ptr<OPNode> GetNodeByPath(const std::string& path);

  // Hands each surviving operation to `fn` in order of acceptance and returns the number of entries, absorbed ones
  // included. A crashed queue hands out one operation of kind 7 on the root and returns 1.
  size_t ProcessOP(const boost::function<void(std::shared_ptr<OP>)>& fn);

  // How many it would hand out.
  size_t Count() const;

  // Calls `fn` on every node below `node` (recursive) or on its children, over a snapshot. It looks at the whole tree:
  // for diagnosis and tests, not for a loop.
  void TraverseNodeDescendant(const std::shared_ptr<OPNode>& node,
                              const boost::function<void(std::shared_ptr<OPNode>)>& fn, bool recursive);

  std::shared_ptr<OPNode> root();
  bool queue_crashed() const;
  const std::string& queue_path() const { return queue_path_; }
  const Counts& counts() const { return counts_; }

 private:
  void InsertLine(std::string_view line, bool overlong);

  std::string queue_path_;
  Counts counts_;
  std::shared_ptr<OPFold> fold_;
};

}  // namespace quarrox::fileindex
