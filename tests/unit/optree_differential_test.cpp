// Random event sequences through the real tree and the plain one. The first difference is shrunk and printed as lines
// that can be put into a queue file.
#include <algorithm>
#include <array>
#include <cstdlib>
#include <map>
#include <memory>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "common/json.h"
#include "fileindex/optree.h"
#include "support/reference_fold.h"

namespace quarrox::fileindex {
namespace {

using support::ReferenceFold;
using Events = std::vector<Event>;
using Operations = std::vector<ReferenceFold::Operation>;

class Generator {
 public:
  explicit Generator(uint64_t seed) : random_(seed) {}

  Events Sequence() {
    Events events;
    for (unsigned i = 1 + Below(60); i > 0; --i) events.push_back(OneEvent());
    return events;
  }
  unsigned Below(unsigned bound) { return static_cast<unsigned>(random_() % bound); }

 private:
  bool OneIn(unsigned n) { return Below(n) == 0; }

  std::string Path() {
    static const std::array<const char*, 4> kNames{"a", "b", "ab", "\xff"};
    if (OneIn(60)) return "/";
    std::string path;
    for (unsigned depth = 1 + (OneIn(3) ? Below(6) : Below(3)); depth > 0; --depth) {
      path += OneIn(40) ? "//" : "/";
      path += kNames[OneIn(4) ? Below(4) : Below(2)];
    }
    return OneIn(40) ? path + "/" : path;
  }

  std::string AnyPath() {
    static const std::array<std::string, 4> kNowhere{"", "a/b", "./a", std::string("/a\0b", 4)};
    return OneIn(60) ? kNowhere[Below(4)] : Path();
  }

  Json::Value Data() {
    static const std::array<const char*, 6> kKeys{"document", "audio", "video", "photo", "basic", "x"};
    if (OneIn(3)) return {};
    if (OneIn(12)) return OneIn(2) ? Json::Value("text") : Json::Value(Json::arrayValue);
    Json::Value data(Json::objectValue);
    for (unsigned i = Below(4); i > 0; --i) data[kKeys[Below(6)]] = OneIn(8) ? Json::Value(7) : Json::Value(OneIn(2));
    return data;
  }

  uint32_t Mask() {
    static const std::array<uint32_t, 9> kBits{0x40, 0x04, 0x02, 0x08, 0x80, 0x100, 0x100, 0x10000, 0x20000};
    if (OneIn(300)) return 0x200 | kBits[Below(9)];
    if (OneIn(50)) return 0x1001;  // bits that mean nothing
    uint32_t mask = kBits[Below(9)];
    while (OneIn(6)) mask |= kBits[Below(9)];
    return mask;
  }

  Event OneEvent() {
    static const Event kBlank(R"({"event":0,"path":"/"})");
    Event event = kBlank;
    event.event = Mask();
    event.is_dir = OneIn(4);
    event.path = AnyPath();
    event.data = Data();
    if ((event.event & kEventRename) != 0) event.path_old = OldPath(event.path);
    return event;
  }

  // Also what no file system does: a directory moved onto itself, below itself, over what it is in.
  std::string OldPath(const std::string& path) {
    if (OneIn(12)) return path;
    if (OneIn(12)) return path + Path();
    if (OneIn(12)) return path.substr(0, path.rfind('/'));
    return AnyPath();
  }

  std::mt19937_64 random_;
};

ReferenceFold::Operation Show(const OP& op) {
  return {op.op, std::shared_ptr<OPNode>(op.node)->GetPath(), op.path_old, toString(op.data)};
}

std::map<std::string, Operations> Pending(OPTree& tree) {
  std::map<std::string, Operations> result;
  const auto collect = [&result](const std::shared_ptr<OPNode>& node) {
    node->TraverseOP([&](const std::shared_ptr<OP>& op) {
      if (op->op != kOpNone) result[node->GetPath()].push_back(Show(*op));
    });
  };
  collect(tree.root());
  tree.TraverseNodeDescendant(tree.root(), collect, true);
  return result;
}

std::string Text(const Operations& operations) {
  std::ostringstream text;
  for (const auto& op : operations) {
    text << "    [" << op.kind << "] " << op.path_old << " -> " << op.path << " " << op.data << "\n";
  }
  return text.str();
}

std::string DifferenceInProcessing(OPTree& tree, const ReferenceFold& reference) {
  Operations handed_out;
  const size_t entries = tree.ProcessOP([&](const std::shared_ptr<OP>& op) { handed_out.push_back(Show(*op)); });
  const Operations expected = reference.Process();
  if (handed_out != expected) return "  handed out:\n" + Text(handed_out) + "  expected:\n" + Text(expected);
  if (entries == reference.Entries()) return "";
  return "  " + std::to_string(entries) + " entries, expected " + std::to_string(reference.Entries());
}

// Where a rename has mixed the operations of several places, only the kind of the newest counts, which is compared by
// what is handed out.
std::string DifferenceInNodes(OPTree& tree, const ReferenceFold& reference, bool renamed) {
  std::map<std::string, Operations> pending = Pending(tree);
  std::map<std::string, Operations> all_expected = reference.Pending();
  for (auto& [path, expected] : all_expected) {
    Operations& actual = pending[path];
    if (renamed) {
      std::sort(actual.begin(), actual.end());
      std::sort(expected.begin(), expected.end());
    }
    if (actual != expected) return "  at " + path + ":\n" + Text(actual) + "  expected:\n" + Text(expected);
  }
  return "";
}

bool Insert(OPTree& tree, const Event& event) {
  try {
    tree.InsertEvent(std::make_shared<Event>(event));
  } catch (const Error& error) {
    return false;
  }
  return true;
}

// What differs between the two trees, looked at every so many events and at the end; empty where nothing does.
std::string Compare(const Events& events, size_t every) {
  OPTree tree("");
  ReferenceFold reference;
  bool renamed = false;
  for (size_t i = 0; i < events.size(); ++i) {
    if (Insert(tree, events[i]) != reference.Insert(events[i])) return "  the last event was taken by one only";
    renamed |= (events[i].event & kEventRename) != 0;
    if (i % every != 0 && i + 1 != events.size()) continue;
    const std::string difference = DifferenceInProcessing(tree, reference);
    if (!difference.empty()) return difference;
  }
  return DifferenceInNodes(tree, reference, renamed);
}

Events Shrink(Events events) {
  for (size_t i = 0; i < events.size();) {
    Events fewer = events;
    fewer.erase(fewer.begin() + static_cast<std::ptrdiff_t>(i));
    if (Compare(fewer, 1).empty()) {
      ++i;
    } else {
      events = fewer;
      i = 0;
    }
  }
  return events;
}

std::string Lines(const Events& events) {
  std::string lines;
  for (const Event& event : events) {
    Json::Value line;
    line["event"] = event.event;
    line["is_dir"] = event.is_dir;
    line["path"] = event.path;
    line["path_old"] = event.path_old;
    line["data"] = event.data;
    lines += "  " + toString(line) + "\n";
  }
  return lines;
}

TEST(OPTree, FoldsAnySequenceOfEventsAsThePlainTreeDoes) {
  const uint64_t sequences = std::getenv("FILEINDEX_LONG") != nullptr ? 400'000 : 20'000;
  for (uint64_t seed = 1; seed <= sequences; ++seed) {
    Generator generator(seed);
    const Events events = generator.Sequence();
    if (Compare(events, 1 + generator.Below(60)).empty()) continue;
    const Events shrunk = Shrink(events);
    FAIL() << "seed " << seed << "\n" << Lines(shrunk) << Compare(shrunk, 1);
  }
}

}  // namespace
}  // namespace quarrox::fileindex
