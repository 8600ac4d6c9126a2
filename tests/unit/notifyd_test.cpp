// The notification daemon's rules that a running daemon shows only by chance: which paths it speaks about, how a line
// is written, and what becomes of directories that move between an event and its lookup.
#include <fcntl.h>
#include <sys/stat.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "common/error.h"
#include "common/json.h"
#include "event.h"
#include "move_log.h"
#include "resolver.h"
#include "scope.h"

namespace quarrox::notifyd {
namespace {

namespace fs = std::filesystem;

class TempDir {
 public:
  TempDir() {
    char name[] = "/tmp/notifyd-unit.XXXXXX";
    path_ = fs::canonical(mkdtemp(name));
    fs::create_directory(path_ / "tree");
  }
  ~TempDir() { fs::remove_all(path_); }
  std::string operator/(const std::string& name) const { return path_ / name; }

 private:
  fs::path path_;
};

TEST(NotifydLine, ReadsBackAsItWasWritten) {
  std::string name = "\xff\xfe \"q\" \\ \xc3\xbc";
  for (char c = 1; c < 0x20; ++c) name += c;
  std::string line;
  AppendLine(line, {kRenamed, true, "/new/" + name, "/old/" + name});
  ASSERT_EQ(line.find('\n'), line.size() - 1);
  Json::Value value;
  ASSERT_TRUE(fromString(value, line.substr(0, line.size() - 1)));
  EXPECT_EQ(value["event"].asUInt(), kRenamed);
  EXPECT_TRUE(value["is_dir"].asBool());
  EXPECT_EQ(value["path"].asString(), "/new/" + name);
  EXPECT_EQ(value["path_old"].asString(), "/old/" + name);
}

TEST(NotifydScope, ComparesWholeComponents) {
  const TempDir temp;
  const std::string tree = temp / "tree";
  const Scope scope(tree + "/../tree/", tree + "/queue");
  EXPECT_EQ(scope.dir(), tree);
  EXPECT_TRUE(scope.IsInside(tree, "a"));
  EXPECT_TRUE(scope.IsInside(tree, "."));
  EXPECT_TRUE(scope.IsInside(tree.substr(0, tree.rfind('/')), "tree"));
  EXPECT_TRUE(scope.IsInside(tree + "/@eaDirs", "x@eaDir"));
  EXPECT_FALSE(scope.IsInside(tree + "-sibling", "a"));
  EXPECT_FALSE(scope.IsInside(tree, "@eaDir"));
  EXPECT_FALSE(scope.IsInside(tree + "/a/@eaDir/b", "c"));
  EXPECT_FALSE(scope.IsInside(tree, "queue"));
  EXPECT_FALSE(scope.IsInside(tree, "queue.tmp"));
  EXPECT_TRUE(scope.IsInside(tree, "queue.txt"));
  EXPECT_TRUE(scope.IsInside(tree + "/below", "queue"));
  EXPECT_THROW(Scope(temp / "missing", temp / "queue"), Error);
  EXPECT_TRUE(Scope("/", temp / "queue").IsInside("/etc", "passwd"));
}

TEST(NotifydMoveLog, FollowsMovesInTheirOrder) {
  MoveLog log;
  log.AddEnds("/a", "/b");
  log.AddTold("/a", "/b");
  log.AddTold("/b/c", "/d");
  log.AddTold("/a", "/z");
  EXPECT_EQ(log.Follow("/a/c/x"), "/d/x");
  EXPECT_EQ(log.Follow("/a/e"), "/b/e");
  EXPECT_EQ(log.Follow("/ab"), "/ab");
  EXPECT_TRUE(log.Covers("/b/c"));
  EXPECT_FALSE(log.Covers("/bc"));
}

struct RecordingSink final : EventSink {
  void Add(const Event& event) override {
    lines.push_back(std::to_string(event.bit) + (event.is_dir ? "d " : " ") + std::string(event.path) +
                    (event.path_old.empty() ? "" : " < " + std::string(event.path_old)));
  }
  std::vector<std::string> lines;
};

// Batches as the kernel would report them, resolved when the disk has already gone on.
class NotifydResolver : public testing::Test {
 protected:
  void SetUp() override {
    if (!handles_.Works()) GTEST_SKIP() << "opening by handle needs root";
  }

  static std::string HandleOf(const std::string& dir) {
    union {
      file_handle handle;
      char bytes[sizeof(file_handle) + MAX_HANDLE_SZ];
    } buffer = {};
    buffer.handle.handle_bytes = MAX_HANDLE_SZ;
    int mount_id = 0;
    EXPECT_EQ(name_to_handle_at(AT_FDCWD, dir.c_str(), &buffer.handle, &mount_id, 0), 0);
    constexpr size_t kType = offsetof(file_handle, handle_type);
    return {buffer.bytes + kType, sizeof(buffer.handle.handle_type) + buffer.handle.handle_bytes};
  }

  void Touch(const std::string& dir, const std::string& name, uint32_t bits) {
    batch_->AddBits(batch_->Touch(dir, name), static_cast<uint8_t>(bits), false);
  }
  void MoveDirectory(const std::string& from, const std::string& to) {
    fs::rename(tree_ + "/" + from, tree_ + "/" + to);
    const uint32_t old_end = batch_->Touch(root_, from);
    batch_->AddRename(old_end, batch_->Touch(root_, to), true);
  }
  // The lines of the batch, with "~" for the tree.
  std::vector<std::string> Resolve() {
    sink_.lines.clear();
    resolver_.Resolve(std::exchange(batch_, std::make_unique<EventBatch>()));
    for (std::string& line : sink_.lines) {
      for (size_t at; (at = line.find(tree_)) != std::string::npos;) line.replace(at, tree_.size(), "~");
    }
    return sink_.lines;
  }
  std::string MakeDirectory(const std::string& name) {
    fs::create_directory(tree_ + "/" + name);
    return HandleOf(tree_ + "/" + name);
  }
  void MakeFile(const std::string& name) { std::ofstream(tree_ + "/" + name) << "x"; }

  TempDir temp_;
  std::string tree_ = temp_ / "tree";
  Scope scope_{tree_, temp_ / "queue"};
  RecordingSink sink_;
  DirHandles handles_{tree_};
  Resolver resolver_{scope_, handles_, sink_};
  std::string root_ = HandleOf(tree_);
  std::unique_ptr<EventBatch> batch_ = std::make_unique<EventBatch>();
};

using Lines = std::vector<std::string>;

TEST_F(NotifydResolver, LooksAgainAtNamesWhoseDirectoryMovedBeforeTheirLookup) {
  const std::string d = MakeDirectory("d");
  MakeFile("d/a");
  Touch(d, "a", kCreated);
  auto later = std::make_unique<EventBatch>();
  std::swap(batch_, later);
  MoveDirectory("d", "e");
  std::swap(batch_, later);
  EXPECT_EQ(Resolve(), (Lines{"64 ~/e/a"}));
  batch_ = std::move(later);
  EXPECT_EQ(Resolve(), (Lines{"256d ~/e < ~/d", "64 ~/e/a", "64 ~/e/a"}));  // the rename replaced what was told about e
}

TEST_F(NotifydResolver, TakesBackWhatWasToldOfADirectoryThatTheReaderHasElsewhere) {
  MakeDirectory("e");
  const std::string d = MakeDirectory("d");
  MakeFile("d/a");
  Touch(d, "a", kCreated);
  auto later = std::make_unique<EventBatch>();
  std::swap(batch_, later);
  MoveDirectory("e", "f");
  MoveDirectory("d", "e");
  std::swap(batch_, later);
  EXPECT_EQ(Resolve(), (Lines{"64 ~/e/a"}));  // for the reader that is still the directory that went to f
  batch_ = std::move(later);
  EXPECT_EQ(Resolve(), (Lines{"256d ~/f < ~/e", "256d ~/e < ~/d", "128 ~/f/a", "64d ~/e", "64 ~/e/a"}));
}

TEST_F(NotifydResolver, SettledBatchesAreNotLookedAtAgain) {
  const std::string d = MakeDirectory("d");
  MakeFile("d/a");
  Touch(d, "a", kCreated);
  EXPECT_EQ(Resolve(), (Lines{"64 ~/d/a"}));
  resolver_.Settle();
  MoveDirectory("d", "e");
  EXPECT_EQ(Resolve(), (Lines{"256d ~/e < ~/d"}));
}

TEST_F(NotifydResolver, ChainsOfRenamesStayRenames) {
  MakeDirectory("a");
  MoveDirectory("a", "b");
  MoveDirectory("b", "c");
  EXPECT_EQ(Resolve(), (Lines{"256d ~/b < ~/a", "256d ~/c < ~/b", "128d ~/b"}));
}

TEST_F(NotifydResolver, AMovedDirectoryIsLookedAtWhereRenamesMayHaveBeenMerged) {
  MakeDirectory("a");
  MoveDirectory("a", "b");
  MoveDirectory("b", "a");
  MoveDirectory("a", "b");
  MoveDirectory("b", "c");
  const Lines lines = Resolve();
  EXPECT_EQ(lines.back(), "64d ~/c");
}

TEST_F(NotifydResolver, WritingBeforeARenameIsToldOfTheNewName) {
  MakeFile("a");
  Touch(root_, "a", kWritten);
  const uint32_t from = batch_->Touch(root_, "a");
  batch_->AddRename(from, batch_->Touch(root_, "b"), false);
  fs::rename(tree_ + "/a", tree_ + "/b");
  EXPECT_EQ(Resolve(), (Lines{"256 ~/b < ~/a", "8 ~/b"}));
}

}  // namespace
}  // namespace quarrox::notifyd
