#include "support/reference_fold.h"

#include <sys/mman.h>

#include <algorithm>
#include <memory>
#include <sstream>
#include <utility>

#include "common/json.h"
#include "fileindex/optree.h"
#include "support/temp_dir.h"

namespace quarrox::support {
namespace {

void Merge(Json::Value& data, const Json::Value& other) {
  const auto flag = [](const Json::Value& value, const char* key) { return value.isObject() && value[key] == true; };
  if (!data.isObject()) data = Json::Value(Json::objectValue);
  for (const char* key : {"document", "audio", "video", "photo", "basic"}) {
    data[key] = flag(other, key) || flag(data, key);
  }
}

bool CanHaveNode(const std::string& path) {
  return path[0] == '/' && path.find('\0') == std::string::npos && path.size() <= 64 * 1024;
}

std::string NodePath(std::string path) {
  const auto end = std::unique(path.begin(), path.end(), [](char a, char b) { return a == '/' && b == '/'; });
  path.erase(end, path.end());
  return path.back() == '/' ? path.substr(0, path.size() - 1) : path;
}

struct Entry {
  int kind;
  std::string path;
  std::string path_old;
  Json::Value data;
  size_t age = 0;  // at its path: what moves becomes the newest
};
using Op = std::shared_ptr<Entry>;

class PlainFold {
 public:
  void Insert(const fileindex::Event& event) {
    if ((event.event & 0x200) != 0) crashed_ = true;
    if (!CanHaveNode(event.path)) throw Error(kErrInternal);
    fresh_ = std::make_shared<Entry>(Entry{0, NodePath(event.path), event.path_old, event.data});
    const auto has = [&](uint32_t bits) { return (event.event & bits) != 0; };
    if (has(0x40)) event.is_dir ? Reindex() : Apply("2d2dbd", 2);
    if (has(0x04)) Apply("ddddbd", 3);
    if (has(0x0A)) Apply("dd2dbd", 2);
    if (has(0x80)) event.is_dir ? Reindex() : Apply("d11bbb", 1);
    if (has(0x100)) CanHaveNode(event.path_old) ? Rename(NodePath(event.path_old)) : Reindex();
    if (has(0x10000)) Reindex();
    if (has(0x20000)) Apply("d44mbd", 4);
  }

  void HandOut(Folded& result) {
    if (crashed_) ops_ = {std::make_shared<Entry>(Entry{7, "", "", {}})};
    result.entries = ops_.size();
    for (const Op& op : ops_) {
      const std::string from = op->kind == 5 ? op->path_old + " -> " : "";
      const std::string text = "[0" + std::to_string(op->kind) + "] " + from + op->path + AppendData(op->data);
      if (op->kind != 0) result.operations.push_back(text);
    }
  }

 private:
  // The row has a letter for each kind of pending operation, 1 to 6. d: drop the new one. b: keep both. m: merge the
  // data, drop. A digit: the pending operation becomes this kind, drop.
  void Apply(const char* row, int kind) {
    fresh_->kind = kind;
    for (const Op& pending : Pending(fresh_->path, false)) {
      const char cell = row[pending->kind - 1];
      if (cell != 'b') fresh_->kind = 0;
      if (cell == 'm') Merge(pending->data, fresh_->data);
      if (cell == '4') pending->data = fresh_->data;
      if (pending->kind == 1 && cell == '2') pending->age = ++age_;  // what is revived becomes the newest, too
      if (cell >= '1' && cell <= '6') pending->kind = cell - '0';
    }
    Accept(fresh_);
  }

  void Reindex() {
    Apply("d666bd", 6);
    for (const Op& pending : Pending(fresh_->path, true)) {
      if (pending->kind != 5) pending->kind = 0;
    }
  }

  void Rename(const std::string& from) {
    for (const Op& pending : Pending(fresh_->path, false)) {
      if (pending->kind <= 3) pending->kind = 0;
    }
    const auto second = std::make_shared<Entry>(Entry{0, fresh_->path, "", fresh_->data});
    const auto move = [&](const Op& op) {
      op->path = fresh_->path + op->path.substr(from.size());
      op->age = ++age_;
    };
    for (const Op& pending : Pending(from, false)) {
      if (pending->kind == 2 || pending->kind == 3 || pending->kind == 6)
        second->kind = std::exchange(pending->kind, 0);
      move(pending);
    }
    for (const Op& pending : Pending(from, true)) {
      if (pending->kind != 1) move(pending);
    }
    fresh_->kind = 5;
    Accept(fresh_);
    Accept(second);
  }

  void Accept(const Op& op) {
    if (op->kind == 0 || std::find(ops_.begin(), ops_.end(), op) != ops_.end()) return;
    op->age = ++age_;
    ops_.push_back(op);
  }

  // What is pending at the path or below it besides the fresh one, oldest first.
  std::vector<Op> Pending(const std::string& path, bool below) const {
    std::vector<Op> found;
    for (const Op& op : ops_) {
      const bool is_there = below ? op->path.starts_with(path + "/") : op->path == path;
      if (is_there && op != fresh_ && op->kind != 0) found.push_back(op);
    }
    std::sort(found.begin(), found.end(), [](const Op& a, const Op& b) { return a->age < b->age; });
    return found;
  }

  bool crashed_ = false;
  size_t age_ = 0;
  Op fresh_;
  std::vector<Op> ops_;  // in order of acceptance
};

}  // namespace

Folded Fold(const std::string& queue) {
  static const std::string path = "/proc/self/fd/" + std::to_string(memfd_create("queue", MFD_CLOEXEC));
  WriteText(path, queue);
  fileindex::OPTree tree(path);
  tree.BuildTree();
  Folded result{{}, 0, tree.counts().lines, tree.counts().bad_lines};
  result.entries = tree.ProcessOP([&result](const std::shared_ptr<fileindex::OP>& op) {
    result.operations.push_back((std::ostringstream() << *op).str());
  });
  return result;
}

Folded FoldPlainly(const std::string& queue) {
  Folded result;
  PlainFold fold;
  std::istringstream lines(queue);
  for (std::string line; std::getline(lines, line); ++result.lines) {
    try {
      fold.Insert(fileindex::Event(line));
    } catch (const Error&) {
      ++result.bad_lines;
    }
  }
  fold.HandOut(result);
  return result;
}

}  // namespace quarrox::support
