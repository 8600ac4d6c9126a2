// Random queues through the real tree and the plain one. The first difference is shrunk and printed as lines that can
// be put into a queue file.
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <random>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "common/json.h"
#include "fileindex/optree.h"
#include "support/reference_fold.h"

namespace quarrox::fileindex {
namespace {

using support::Folded;
using Lines = std::vector<std::string>;

class Generator {
 public:
  explicit Generator(uint64_t seed) : random_(seed) {}

  Lines Sequence() {
    Lines lines(1 + Below(60));
    for (std::string& line : lines) line = toString(OneEvent());
    return lines;
  }

 private:
  unsigned Below(unsigned bound) { return static_cast<unsigned>(random_() % bound); }
  bool OneIn(unsigned n) { return Below(n) == 0; }

  std::string Path() {
    static const std::array<const char*, 4> kNames{"a", "b", "ab", "\xc3\xa4"};
    if (OneIn(60)) return "/";
    std::string path;
    for (unsigned depth = 1 + (OneIn(3) ? Below(6) : Below(depth_)); depth > 0; --depth) {
      path += OneIn(40) ? "//" : "/";
      path += kNames[Below(names_)];
    }
    return OneIn(40) ? path + "/" : path;
  }

  std::string AnyPath() {
    static const std::array<std::string, 4> kNowhere{"", "a/b", "./a", std::string("/a\0b", 4)};
    return OneIn(60) ? kNowhere[Below(4)] : Path();
  }

  // Also what no file system does: a directory moved onto itself, below itself, over what it is in.
  std::string OldPath(const std::string& path) {
    if (OneIn(12)) return path;
    if (OneIn(12)) return path + Path();
    if (OneIn(12)) return path.substr(0, path.rfind('/'));
    return AnyPath();
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
    if (OneIn(600)) return 0x200 | kBits[Below(9)];
    if (Below(8) < renames_) return 0x100;
    if (OneIn(50)) return 0x1001;  // bits that mean nothing
    uint32_t mask = kBits[Below(9)];
    while (OneIn(6)) mask |= kBits[Below(9)];
    return mask;
  }

  // With every other event's data, or the full parse would do all the work.
  Json::Value OneEvent() {
    Json::Value event;
    event["event"] = Mask();
    event["is_dir"] = OneIn(4);
    event["path"] = AnyPath();
    event["path_old"] = OldPath(event["path"].asString());
    event["data"] = OneIn(2) ? Data() : Json::Value();
    return event;
  }

  std::mt19937_64 random_;
  // In a small world, and where much is renamed, much meets at one place.
  const unsigned names_ = 1 + Below(4);
  const unsigned depth_ = 1 + Below(3);
  const unsigned renames_ = Below(7);
};

std::string Text(const Lines& lines) {
  std::string text;
  for (const std::string& line : lines) text += line + "\n";
  return text;
}

bool Differs(const Lines& lines) {
  return support::Fold(Text(lines)) != support::FoldPlainly(Text(lines));
}

Lines Shrink(Lines lines) {
  for (size_t i = 0; i < lines.size();) {
    Lines fewer = lines;
    fewer.erase(fewer.begin() + static_cast<std::ptrdiff_t>(i));
    const bool still = Differs(fewer);
    i = still ? 0 : i + 1;
    if (still) lines = fewer;
  }
  return lines;
}

TEST(OPTree, FoldsAnyQueueAsThePlainTreeDoes) {
  const uint64_t sequences = std::getenv("FILEINDEX_LONG") != nullptr ? 400'000 : 20'000;
  for (uint64_t seed = 1; seed <= sequences; ++seed) {
    const Lines lines = Generator(seed).Sequence();
    if (!Differs(lines)) continue;
    const std::string shrunk = Text(Shrink(lines));
    const Folded folded = support::Fold(shrunk);
    const Folded expected = support::FoldPlainly(shrunk);
    EXPECT_EQ(folded.operations, expected.operations);
    EXPECT_EQ(folded.entries, expected.entries);
    EXPECT_EQ(folded.bad_lines, expected.bad_lines);
    FAIL() << "seed " << seed << "\n" << shrunk;
  }
}

}  // namespace
}  // namespace quarrox::fileindex
