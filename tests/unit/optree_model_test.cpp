// What a fold does to an index. Random but consistent histories of a small disk, with the lines that a watcher writes
// about them, are applied to the model of an index: line by line, and folded.
#include <algorithm>
#include <array>
#include <cstdlib>
#include <functional>
#include <iostream>
#include <map>
#include <memory>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "common/strings.h"
#include "fileindex/optree.h"

namespace quarrox::fileindex {
namespace {

// What is at a path: on the disk as it is, in the index as it was seen last. No two contents have the same number.
struct Entry {
  bool is_dir;
  int content;
  int attributes;
  bool operator==(const Entry&) const = default;
};
using Tree = std::map<std::string, Entry>;

struct Step {
  FileIndexOP kind;
  std::string path;
  std::string path_old;
};

bool IsAtOrBelow(const std::string& path, const std::string& top) {
  return path == top || StringStartWith(path, top + "/");
}

bool IsRelated(const std::string& a, const std::string& b) {
  return IsAtOrBelow(a, b) || IsAtOrBelow(b, a);
}

// Takes a path and all below it out of a tree.
Tree Cut(Tree& tree, const std::string& top) {
  Tree cut;
  for (auto entry = tree.begin(); entry != tree.end();) {
    if (IsAtOrBelow(entry->first, top)) {
      cut.insert(*entry);
      entry = tree.erase(entry);
    } else {
      ++entry;
    }
  }
  return cut;
}

void Move(Tree& tree, const std::string& from, const std::string& to) {
  const Tree moved = Cut(tree, from);
  if (!moved.empty()) Cut(tree, to);
  for (const auto& [path, entry] : moved) tree[to + path.substr(from.size())] = entry;
}

class Disk {
 public:
  explicit Disk(uint64_t seed) : random_(seed) {
    for (unsigned i = Below(12); i > 0; --i) Act();
    events.clear();
  }

  void Act() {
    static const std::array<void (Disk::*)(), 10> kActs{
        &Disk::Create, &Disk::Create, &Disk::MakeDirectory, &Disk::Write, &Disk::ChangeMode,
        &Disk::Delete, &Disk::Rename, &Disk::Rename,        &Disk::Swap,  &Disk::Save};
    (this->*kActs[Below(kActs.size())])();
  }
  unsigned Below(size_t bound) { return static_cast<unsigned>(random_() % bound); }

  Tree tree;
  std::vector<Event> events;

 private:
  void Tell(uint32_t bit, const std::string& path, bool is_dir, const std::string& path_old = "") {
    static const Event kBlank(R"({"event":0,"path":"/"})");
    Event event = kBlank;
    event.event = bit;
    event.is_dir = is_dir;
    event.path = path;
    event.path_old = path_old;
    events.push_back(event);
  }

  std::string AnyEntry() {
    if (tree.empty()) return "";
    return std::next(tree.begin(), Below(tree.size()))->first;
  }
  // A free path in a directory that is there.
  std::string FreePath() {
    std::vector<std::string> directories{""};
    for (const auto& [path, entry] : tree) {
      if (entry.is_dir && path.size() < 6) directories.push_back(path);
    }
    const std::string directory = directories[Below(directories.size())];
    const std::string path = directory + "/" + "abc"[Below(3)];
    return tree.count(path) == 0 ? path : "";
  }

  void Create() { CreateAt(FreePath()); }
  void CreateAt(const std::string& path) {
    if (path.empty()) return;
    tree[path] = {false, ++last_, 0};
    Tell(kEventCreate, path, false);
    Tell(kEventCloseWrite, path, false);
  }
  void MakeDirectory() {
    const std::string path = FreePath();
    if (path.empty()) return;
    tree[path] = {true, 0, ++last_};
    Tell(kEventCreate, path, true);
  }
  void Write() {
    const std::string path = AnyEntry();
    if (path.empty() || tree[path].is_dir) return;
    tree[path].content = ++last_;
    Tell(kEventCloseWrite, path, false);
  }
  void ChangeMode() {
    const std::string path = AnyEntry();
    if (path.empty()) return;
    tree[path].attributes = ++last_;
    Tell(kEventAttr, path, tree[path].is_dir);
  }
  void Delete() {
    const std::string path = AnyEntry();
    if (path.empty()) return;
    const Tree gone = Cut(tree, path);
    for (auto entry = gone.rbegin(); entry != gone.rend(); ++entry)
      Tell(kEventDelete, entry->first, entry->second.is_dir);
  }
  void MoveTo(const std::string& from, const std::string& to) {
    if (from.empty() || to.empty() || IsAtOrBelow(to, from)) return;
    Tell(kEventRename, to, tree[from].is_dir, from);
    Move(tree, from, to);
  }
  // To a free place, or a file over a file.
  void Rename() {
    const std::string from = AnyEntry();
    const std::string other = AnyEntry();
    const bool over = !from.empty() && from != other && !tree[from].is_dir && !tree[other].is_dir;
    MoveTo(from, over ? other : FreePath());
  }
  void Swap() {
    const std::string a = AnyEntry();
    const std::string b = AnyEntry();
    if (a.empty() || IsRelated(a, b)) return;
    MoveTo(a, "/~");
    MoveTo(b, a);
    MoveTo("/~", b);
  }
  void Save() {
    const std::string path = AnyEntry();
    if (path.empty() || tree[path].is_dir) return;
    CreateAt(path + "~");
    MoveTo(path + "~", path);
  }

  std::mt19937_64 random_;
  int last_ = 0;
};

// The index. It looks at the disk as the disk is when the step is handled: after the whole history.
class Index {
 public:
  Index(Tree start, const Tree& disk) : tree(std::move(start)), disk_(disk) {}

  // Does what the operation says.
  void Follow(const Step& step) {
    const auto found = disk_.find(step.path);
    if (step.kind == kOpDelete) Cut(tree, step.path);
    if (step.kind == kOpCreate && found != disk_.end()) tree[step.path] = found->second;
    if (step.kind == kOpAttr && found != disk_.end() && tree.count(step.path) != 0) {
      tree[step.path].attributes = found->second.attributes;
    }
    if (step.kind == kOpRename) Move(tree, step.path_old, step.path);
    if (step.kind == kOpReindex) Reindex(step.path);
  }

  // The same, but where the disk is otherwise than the operation says, the disk is right.
  void FollowDisk(const Step& step) {
    const auto found = disk_.find(step.path);
    if (step.kind == kOpRename) {
      Move(tree, step.path_old, step.path);
      Reindex(step.path_old);
      Reindex(step.path);
    } else if (found == disk_.end() || step.kind == kOpReindex) {
      Reindex(step.path);
    } else if (step.kind == kOpAttr && tree.count(step.path) == 0) {
      Reindex(step.path);
    } else if (step.kind == kOpAttr) {
      tree[step.path].attributes = found->second.attributes;
    } else {
      tree[step.path] = found->second;
    }
  }

  Tree tree;

 private:
  void Reindex(const std::string& top) {
    Cut(tree, top);
    for (const auto& [path, entry] : disk_) {
      if (IsAtOrBelow(path, top)) tree[path] = entry;
    }
  }

  const Tree& disk_;
};

std::vector<Step> Folded(const std::vector<Event>& events) {
  OPTree tree("");
  for (const Event& event : events) tree.InsertEvent(std::make_shared<Event>(event));
  std::vector<Step> steps;
  tree.ProcessOP([&](const std::shared_ptr<OP>& op) {
    steps.push_back({op->op, std::shared_ptr<OPNode>(op->node)->GetPath(), op->path_old});
  });
  return steps;
}

// What a line says, without any other.
std::vector<Step> Unfolded(const std::vector<Event>& lines) {
  std::vector<Step> steps;
  for (const Event& line : lines) {
    FileIndexOP kind = line.is_dir ? kOpReindex : kOpCreate;
    if (line.event == kEventCloseWrite) kind = kOpCreate;
    if (line.event == kEventAttr) kind = kOpAttr;
    if (line.event == kEventDelete && !line.is_dir) kind = kOpDelete;
    if (line.event == kEventRename) kind = kOpRename;
    steps.push_back({kind, line.path, line.path_old});
  }
  return steps;
}

struct History {
  explicit History(uint64_t seed) : disk(seed), start(disk.tree) {
    for (unsigned i = 1 + disk.Below(20); i > 0; --i) disk.Act();
    lines = Unfolded(disk.events);
    folded = Folded(disk.events);
  }

  Disk disk;  // as it is at the end
  Tree start;
  std::vector<Step> lines;
  std::vector<Step> folded;
};

std::string Text(const char* title, const std::vector<Step>& steps) {
  std::ostringstream text;
  text << title << "\n";
  for (const Step& step : steps) text << "  [" << step.kind << "] " << step.path_old << " -> " << step.path << "\n";
  return text.str();
}

std::string Text(const char* title, const Tree& tree) {
  std::ostringstream text;
  text << title;
  for (const auto& [path, entry] : tree) {
    text << "  " << path << (entry.is_dir ? "/" : "") << " " << entry.content << "." << entry.attributes;
  }
  return text.str() + "\n";
}

std::string Text(const History& history, const Tree& index) {
  return Text("lines", history.lines) + Text("folded", history.folded) + Text("start", history.start) +
         Text("disk", history.disk.tree) + Text("index", index);
}

uint64_t Histories() {
  return std::getenv("FILEINDEX_LONG") != nullptr ? 400'000 : 20'000;
}

TEST(OPTreeModel, HandlersThatFollowTheDiskEndWithAnIndexThatEqualsTheDisk) {
  for (uint64_t seed = 1; seed <= Histories(); ++seed) {
    const History history(seed);
    Index index(history.start, history.disk.tree);
    for (const Step& step : history.folded) index.FollowDisk(step);
    ASSERT_EQ(index.tree, history.disk.tree) << "seed " << seed << "\n" << Text(history, index.tree);
  }
}

// A way in which the folded operations leave another index than the lines do: it is recognised by what has to be done
// once more to bring the path to what the disk holds.
struct Asymmetry {
  const char* name;
  std::function<std::vector<Step>(const History&)> missing;
};

// A line about a path that has a delete pending is dropped, unless it creates a file.
std::vector<Step> DroppedBehindDelete(const History& history, bool reindex) {
  std::vector<Step> missing;
  std::set<std::string> deleted;
  for (const Step& line : history.lines) {
    const bool is_kind = reindex ? line.kind == kOpReindex : line.kind == kOpCreate || line.kind == kOpAttr;
    if (line.kind == kOpDelete) deleted.insert(line.path);
    if (is_kind && deleted.count(line.path) != 0) missing.push_back(line);
  }
  return missing;
}

// A delete stays at its place when a directory above it is renamed, and is voided there by a reindex of what comes to
// that place next. Either way nothing deletes at the new name.
std::vector<Step> DeleteStaysBehindRename(const History& history, bool voided) {
  std::vector<Step> missing;
  for (const Step& gone : history.lines) {
    const auto is_it = [&](const Step& step) { return step.kind == kOpDelete && step.path == gone.path; };
    const bool left = std::any_of(history.folded.begin(), history.folded.end(), is_it);
    if (gone.kind != kOpDelete || left == voided) continue;
    for (const Step& line : history.lines) {
      if (line.kind != kOpRename || !StringStartWith(gone.path, line.path_old + "/")) continue;
      missing.push_back({kOpDelete, line.path + gone.path.substr(line.path_old.size()), ""});
    }
  }
  return missing;
}

// A reindex goes along with a rename as the newest of what was pending only: it may have been dropped behind a delete,
// or give way to a create.
std::vector<Step> RenameLosesReindex(const History& history) {
  std::vector<Step> missing;
  std::set<std::string> reindexed;
  for (const Step& line : history.lines) {
    if (line.kind == kOpReindex) reindexed.insert(line.path);
    if (line.kind != kOpRename || reindexed.count(line.path_old) == 0) continue;
    reindexed.insert(line.path);
    missing.push_back({kOpReindex, line.path, ""});
  }
  return missing;
}

// An operation keeps its turn when it changes its kind or its place, so it may stand before the rename that moved it.
// Then the rename puts the old document over the new one, or takes the new one along.
std::vector<Step> WorkStandsBeforeRename(const History& history) {
  std::vector<Step> missing;
  std::vector<Step> before;
  for (const Step& step : history.folded) {
    if (step.kind != kOpRename) before.push_back(step);
    if (step.kind != kOpRename) continue;
    for (const Step& work : before) {
      if (IsRelated(work.path, step.path)) missing.push_back(work);
      if (IsRelated(work.path, step.path_old)) missing.push_back({kOpReindex, step.path, ""});
    }
  }
  return missing;
}

// A rename whose new name is renamed again goes there at once: swaps and chains come in an order that mixes up
// documents, at the ends of both and at those of later renames that touch them. Renames are never absorbed, so their
// lines and their operations come in pairs.
std::vector<Step> RenameGoesWithLaterOne(const History& history) {
  std::vector<Step> missing;
  auto line = history.lines.begin();
  for (const Step& step : history.folded) {
    if (step.kind != kOpRename) continue;
    while (line->kind != kOpRename) ++line;
    const auto is_touched = [&](const Step& end) { return IsRelated(step.path_old, end.path); };
    if (step.path != line->path || std::any_of(missing.begin(), missing.end(), is_touched)) {
      for (const std::string& end : {step.path, step.path_old, line->path}) missing.push_back({kOpReindex, end, ""});
    }
    ++line;
  }
  return missing;
}

const std::array<Asymmetry, 7> kAsymmetries{{
    {"ChangeIsDroppedBehindDelete", [](const History& h) { return DroppedBehindDelete(h, false); }},
    {"ReindexIsDroppedBehindDelete", [](const History& h) { return DroppedBehindDelete(h, true); }},
    {"DeleteStaysBehindRename", [](const History& h) { return DeleteStaysBehindRename(h, false); }},
    {"ReindexVoidsDeleteLeftBehind", [](const History& h) { return DeleteStaysBehindRename(h, true); }},
    {"RenameLosesReindex", RenameLosesReindex},
    {"WorkStandsBeforeRename", WorkStandsBeforeRename},
    {"RenameGoesWithLaterOne", RenameGoesWithLaterOne},
}};

bool Agree(const Tree& a, const Tree& b, const std::string& path) {
  const auto in_a = a.find(path);
  const auto in_b = b.find(path);
  return in_a == a.end() || in_b == b.end() ? in_a == a.end() && in_b == b.end() : in_a->second == in_b->second;
}

std::set<std::string> Differences(const Tree& a, const Tree& b) {
  std::set<std::string> paths;
  for (const Tree* tree : {&a, &b}) {
    for (const auto& [path, entry] : *tree) {
      if (!Agree(a, b, path)) paths.insert(path);
    }
  }
  return paths;
}

// Takes out the paths at which the index is right, and counts them.
void Explain(std::set<std::string>& paths, const Tree& index, const Tree& disk, unsigned& count) {
  for (auto path = paths.begin(); path != paths.end();) {
    if (Agree(index, disk, *path)) {
      ++count;
      path = paths.erase(path);
    } else {
      ++path;
    }
  }
}

TEST(OPTreeModel, FoldingChangesAnIndexInTheWantedWaysOnly) {
  std::map<std::string, unsigned> counts{{"WorkFollowsRename", 0}};
  for (const Asymmetry& asymmetry : kAsymmetries) counts[asymmetry.name] = 0;
  for (uint64_t seed = 1; seed <= Histories(); ++seed) {
    const History history(seed);
    Index line_by_line(history.start, history.disk.tree);
    for (const Step& step : history.lines) line_by_line.Follow(step);
    Index folded(history.start, history.disk.tree);
    for (const Step& step : history.folded) folded.Follow(step);

    std::set<std::string> differences = Differences(line_by_line.tree, folded.tree);
    // A late line about an old name finds nothing there; folded, it is about the new name.
    Explain(differences, folded.tree, history.disk.tree, counts["WorkFollowsRename"]);
    Index mended = folded;
    for (const Asymmetry& asymmetry : kAsymmetries) {
      if (differences.empty()) break;
      for (const Step& step : asymmetry.missing(history)) mended.Follow(step);
      Explain(differences, mended.tree, history.disk.tree, counts[asymmetry.name]);
    }
    ASSERT_TRUE(differences.empty()) << "seed " << seed << ": " << *differences.begin() << "\n"
                                     << Text(history, folded.tree);
  }
  for (const auto& [name, count] : counts) {
    EXPECT_GT(count, 0U) << name;
    std::cout << count << " x " << name << "\n";
  }
}

}  // namespace
}  // namespace quarrox::fileindex
