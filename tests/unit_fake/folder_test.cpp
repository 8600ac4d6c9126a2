#include <random>

#include <gtest/gtest.h>

#include "fileindex/folder_mgr.h"
#include "support/errors.h"
#include "support/fake_platform/fake_platform.h"
#include "support/private_machine.h"
#include "support/temp_dir.h"

namespace quarrox::fileindex {
namespace {

using FolderPtr = std::shared_ptr<Folder>;

const auto Kinds = [](Folder& f) { return f.HasDocument() + 2 * f.HasAudio() + 4 * f.HasVideo() + 8 * f.HasPhoto(); };

class FolderTest : public ::testing::Test {
 protected:
  void SetUp() override {
    world_.Reset();
    const bool entered = support::PrivateMachine().Enter();
    if (!entered) GTEST_SKIP() << "no machine of one's own";
    std::filesystem::remove_all("/var/packages");
    world_.shares = {{.name = "a", .path = "/v/a"}, {.name = "b", .path = "/v/a/b"}, {.name = "c", .path = "/v/c"}};
  }
  void TearDown() override { world_.Reset(); }
  static FolderPtr Make(const std::string& path, unsigned kinds, const std::string& name = "n") {
    return std::make_shared<Folder>(path, name, "", "g", kinds & 1, kinds & 2, kinds & 4, kinds & 8, true, true);
  }
  support::FakePlatform& world_ = support::FakePlatform::Get();
  FolderPtr diff_;
};

// Beside a list that is gone through from its beginning to its end.
TEST_F(FolderTest, AnswersAndDifferencesAreThoseOfThePlainList) {
  std::mt19937 random(1);
  const auto pick = [&](size_t count) { return static_cast<unsigned>(random() % count); };
  const std::vector<std::string> tails = {"", "/", "/x", "/x/", "//x", "/x/b", "/xy", "/b", "/b/x"};
  const auto pick_path = [&] { return "/" + std::string(1, "abc"[pick(3)]) + tails[pick(tails.size())]; };
  FolderMgr folders;
  std::vector<FolderPtr> list;
  const auto governing = [&](const std::string& full_path) {
    FolderPtr best;
    for (const FolderPtr& f : list) {
      const bool covers = (full_path + "/").find(f->GetFullPath() + "/") == 0;
      if (covers && (!best || f->GetFullPath().size() > best->GetFullPath().size())) best = f;
    }
    return best;
  };
  for (int round = 0; round < 4000; ++round) {
    const FolderPtr folder = Make(pick_path(), pick(16));
    const auto same = [&](const FolderPtr& f) { return f->GetPath() == folder->GetPath(); };
    const unsigned what = pick(64);
    if (what == 0 && !list.empty()) list[pick(list.size())]->SetShare("c");
    FolderPtr a = governing(folder->GetFullPath());
    what < 30 ? folders.Delete(diff_, folder->GetPath()) : folders.Upsert(diff_, folder);
    if (const auto first = std::find_if(list.begin(), list.end(), same); first != list.end()) list.erase(first);
    if (what >= 30) list.push_back(folder);
    const FolderPtr b = what < 30 ? governing(folder->GetFullPath()) : std::exchange(a, folder);
    ASSERT_TRUE(a ? Kinds(*diff_) == (b ? Kinds(*a) ^ Kinds(*b) : 15) : diff_ == nullptr) << round;
    const std::string asked = Make(pick_path(), 0)->GetFullPath();
    ASSERT_EQ(folders.GetFolders(), list) << round;
    ASSERT_EQ(folders.GetMostSuitableCfg(asked), governing(asked)) << asked;
    ASSERT_EQ(folders.HasFolder(folder->GetPath()), std::any_of(list.begin(), list.end(), same));
    ASSERT_EQ(folders.IsFullPathNeedMeta(asked + "/t.mp3"), governing(asked) && governing(asked)->HasAudio());
  }
}

TEST_F(FolderTest, EachShareIsOpenedOnceAndOneThatIsGoneIsAnErrorUntilItsFoldersAreGone) {
  FolderMgr folders;
  for (int i = 0; i < 10000; ++i) folders.Upsert(diff_, Make((i % 2 ? "/a/" : "/c/") + std::to_string(i), 1));
  folders.Save();
  world_.RemoveShare("c");
  world_.ForgetCalls();
  FolderMgr loaded;
  for (int i = 0; i < 2; ++i) EXPECT_EQ(support::ReasonOf(800, [&] { loaded.IsFullPathIndexed("/v/a/1"); }), "c");
  loaded.DeleteByShare("c");
  EXPECT_TRUE(loaded.IsFullPathIndexed("/v/a/1/x") && !loaded.IsFullPathHasOwnCfg("/v/a/1/x"));
  EXPECT_EQ(world_.CountCalls("VEXOShareGet"), 3U);  // twice c
}

TEST_F(FolderTest, AListIsSavedAsRootAndReadInPagesAndWhatIsNoneIsRefused) {
  world_.Become(world_.users.emplace_back(support::FakeUser{.name = "alice", .uid = 1000}));
  FolderMgr folders;
  for (const char* name : {"b Rock", "A ROCK", "c rocks", "d"})
    folders.Upsert(diff_, Make("/c/" + std::string(name), *name == 'b' ? 8 : 0, name));
  folders.Save();
  EXPECT_EQ(std::filesystem::status(kFileIndexFoldersCfgPath).permissions(), std::filesystem::perms(0644));
  EXPECT_TRUE(world_.effective_user().name == "alice" && world_.CountCalls("ResetCredentialsByName") == 2);
  const auto page = [](size_t offset, size_t limit, const char* sort_by, const char* direction) {
    std::vector<FolderPtr> found;
    size_t total = 0;
    FolderMgr().List(found, total, offset, limit, sort_by, direction, "", " rocK\t");
    std::string text = std::to_string(total);
    for (const FolderPtr& folder : found) text += folder->GetName()[0];
    return text;
  };
  EXPECT_EQ(page(1, 9, "path", "") + page(0, 1, "photo", "DESC") + page(4, 9, "", ""), "3bc3b3");
  Json::Value data = Make("/a", 1)->GetData();
  data["group"] = "all";
  EXPECT_EQ(support::ReasonOf(120, [&] { Folder{data}; }), "\"all\" is reserved group name");
  data.removeMember("photo");
  EXPECT_EQ(support::ReasonOf(120, [&] { Folder{data}; }).find("Missing property: photo, data={"), 0U);
  support::WriteText(kFileIndexFoldersCfgPath, "{}");
  EXPECT_EQ(support::ReasonOf(504, [] { FolderMgr(); }), std::string("Cannot load json: ") + kFileIndexFoldersCfgPath);
  std::filesystem::remove(kFileIndexFoldersCfgPath);  // other tests of the program have the same machine
}

}  // namespace
}  // namespace quarrox::fileindex
