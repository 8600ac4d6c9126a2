// The notification daemon's rules that a running daemon shows only by chance: how a line is written, and what becomes
// of directories that move between an event and its lookup.
#include <fcntl.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <atomic>
#include <cstddef>
#include <filesystem>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "common/json.h"
#include "event.h"
#include "resolver.h"
#include "scope.h"
#include "support/temp_dir.h"
#include "watch_tree.h"

namespace quarrox::notifyd {
namespace {

namespace fs = std::filesystem;

TEST(NotifydLine, ReadsBackAsItWasWritten) {
  std::string name = "\xff\xfe \"q\" \\ \xc3\xbc";
  for (char c = 1; c < 0x20; ++c) name += c;
  std::string line;
  AppendLine(line, {kRenamed, true, "/new/" + name, "/old/" + name});
  Json::Value value;
  ASSERT_TRUE(fromString(value, line));
  EXPECT_EQ(line.find('\n'), line.size() - 1);
  EXPECT_EQ(value["path"].asString(), "/new/" + name);
  EXPECT_EQ(value["path_old"].asString(), "/old/" + name);
}

using Lines = std::vector<std::string>;

// The lines, with the tree's path left out.
struct RecordingSink final : EventSink {
  explicit RecordingSink(size_t root_size) : root(root_size) {}
  void Add(const Event& event) override {
    lines.push_back(std::to_string(event.bit) + (event.is_dir ? "d " : " ") + std::string(event.path.substr(root)));
    if (!event.path_old.empty()) lines.back() += " < " + std::string(event.path_old.substr(root));
  }
  size_t root;
  Lines lines;
};

// Batches as the kernel would report them, resolved when the disk has already gone on.
class NotifydResolver : public testing::Test {
 protected:
  void SetUp() override {
    if (!handles_.Works()) GTEST_SKIP() << "opening by handle needs root";
  }

  static std::string HandleOf(const std::string& dir) {
    std::string buffer(sizeof(file_handle) + MAX_HANDLE_SZ, '\0');
    auto* handle = reinterpret_cast<file_handle*>(buffer.data());
    handle->handle_bytes = MAX_HANDLE_SZ;
    int mount_id = 0;
    EXPECT_EQ(name_to_handle_at(AT_FDCWD, dir.c_str(), handle, &mount_id, 0), 0);
    return buffer.substr(offsetof(file_handle, handle_type), sizeof(handle->handle_type) + handle->handle_bytes);
  }

  void MoveDirectory(const std::string& from, const std::string& to) {
    fs::rename(tree_ + "/" + from, tree_ + "/" + to);
    const uint32_t old_end = batch_->Touch(root_, from);
    batch_->AddRename(old_end, batch_->Touch(root_, to), true);
  }
  // Makes the renames while the batch waits for its lookup: they are the next batch, which this leaves to be resolved.
  Lines ResolveAfter(const std::vector<std::pair<std::string, std::string>>& moves) {
    auto later = std::make_unique<EventBatch>();
    std::swap(batch_, later);
    for (const auto& [from, to] : moves) MoveDirectory(from, to);
    std::swap(batch_, later);
    const Lines lines = Resolve();
    batch_ = std::move(later);
    return lines;
  }
  Lines Resolve() {
    resolver_.Resolve(std::exchange(batch_, std::make_unique<EventBatch>()));
    return std::exchange(sink_.lines, {});
  }
  // A directory with a file "a" that was just created.
  void MakeDirectory(const std::string& name) {
    fs::create_directory(tree_ + "/" + name);
    support::WriteText(tree_ + "/" + name + "/a", "x");
    batch_->AddBits(batch_->Touch(HandleOf(tree_ + "/" + name), "a"), kCreated, false);
  }

  support::TempDir temp_, queue_;
  std::string tree_ = fs::canonical(temp_.path());
  Scope scope_{tree_, queue_ / "queue"};
  RecordingSink sink_{tree_.size()};
  DirHandles handles_{tree_};
  Resolver resolver_{scope_, handles_, sink_};
  std::string root_ = HandleOf(tree_);
  std::unique_ptr<EventBatch> batch_ = std::make_unique<EventBatch>();
};

TEST_F(NotifydResolver, LooksAgainAtNamesWhoseDirectoryMovedBeforeTheirLookup) {
  MakeDirectory("d");
  EXPECT_EQ(ResolveAfter({{"d", "e"}}), (Lines{"64 /e/a"}));
  EXPECT_EQ(Resolve(), (Lines{"256d /e < /d", "64 /e/a", "64 /e/a"}));  // the rename replaced what was told about e
}

TEST_F(NotifydResolver, TakesBackWhatWasToldOfADirectoryThatTheReaderHasElsewhere) {
  fs::create_directory(tree_ + "/e");
  MakeDirectory("d");
  EXPECT_EQ(ResolveAfter({{"e", "f"}, {"d", "e"}}), (Lines{"64 /e/a"}));  // for the reader that e is what went to f
  EXPECT_EQ(Resolve(), (Lines{"256d /f < /e", "256d /e < /d", "128 /f/a", "64d /e", "64 /e/a"}));
}

TEST_F(NotifydResolver, AMovedDirectoryIsLookedAtWhereRenamesMayHaveBeenMerged) {
  fs::create_directory(tree_ + "/a");
  MoveDirectory("a", "b");
  MoveDirectory("b", "c");
  EXPECT_EQ(Resolve(), (Lines{"256d /b < /a", "256d /c < /b", "128d /b"}));
  for (const std::string ends : {"cb", "bc", "cb", "bd"}) MoveDirectory(ends.substr(0, 1), ends.substr(1));
  EXPECT_EQ(Resolve().back(), "64d /d");
}

// By another thread, so that the kernel reports while it is asked to watch.
TEST(NotifydWatchTree, MissesNothingWhereItWatchesAgain) {
  const support::TempDir dir;
  fs::create_directory(dir / "sub");
  support::WriteText(dir / "a", "");
  const Scope scope(dir.path(), dir / "queue");
  WatchTree tree(scope);
  tree.WatchAll();
  for (int round = 0; round < 20; ++round) {
    std::atomic<bool> done = false;
    std::thread other([&] {
      for (int i = 0; i < 2000; ++i) fs::rename(dir / (i % 2 ? "b" : "a"), dir / (i % 2 ? "a" : "b"));
      done = true;
    });
    while (!done) tree.Watch({tree.root(), "sub"});
    other.join();
    std::vector<char> events(1 << 20);
    EXPECT_EQ(read(tree.fd(), events.data(), events.size()), 4000 * ssize_t{sizeof(inotify_event) + 16}) << round;
  }
}

}  // namespace
}  // namespace quarrox::notifyd
