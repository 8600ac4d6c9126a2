#include "fileindex/custom_events.h"

#include "common/lock_file.h"
#include "fileindex/optree.h"
#include "support/index_mgr_test.h"

namespace quarrox::fileindex {

using support::ReasonOf;
using CustomEventsTest = support::IndexMgrTest;

TEST_F(CustomEventsTest, AnEventIsLeftOutOnlyWhereAPendingReindexCoversIt) {
  const std::string reindex = R"({"event":65536,"path":"/tmp/v/docs/a/)";
  support::WriteText(QueuePath("docs"), reindex + "/x\"}\n?\n{\"event\":65538,\"path\":\"/tmp/v\"}\n");
  support::WriteText(QueuePath("docs") + ".tmp", "{\"event\":131072,\"path\":\"/tmp/v\"}\n" + reindex + "y/\"}");
  OpenShares shares;
  CustomEvents events(shares);
  const auto added = [&](int kind, const std::string& place) {
    events.Add(kind, "/tmp/v/docs" + place, "", Json::Value());
    return Taken("docs").ends_with("/tmp/v/docs" + place + "\",\"path_old\":\"\"}\n");
  };
  for (const char* place : {"/a", "/a/xy", "/a/x.b/c", ""}) EXPECT_TRUE(added(kEventUpdateDirectory, place)) << place;
  for (const char* place : {"/a/x", "/a/x/deep", "/a/y/z"}) EXPECT_FALSE(added(kEventUpdateDirectory, place)) << place;
  EXPECT_TRUE(added(kEventReindex, "/b/c") && added(kEventReindex, "/b") && added(kEventReindex, "/b.c"));
  EXPECT_FALSE(added(kEventReindex, "/b/c") || added(kEventRename, "/b/d") || added(kEventReindex, "/b.c/d"));
  EXPECT_TRUE(added(kEventReindex, "") && !added(kEventUpdateDirectory, "/a"));
  world_.AddShare({.name = "docsx", .path = "/tmp/v/docsx", .read_only = true});
  EXPECT_EQ((events.Add(kEventReindex, "/tmp/v/docsx/a", "", Json::Value()), Taken("docsx")), "");
  EXPECT_EQ(world_.CountCalls("VEXOShareGet"), 2U);
  EXPECT_EQ(log_.texts().size(), 2U);  // of the bad line, once
}

TEST_F(CustomEventsTest, AnEventBearsRawBytesAndGoesIntoTheQueueThatIsThereWhenItHasTheLock) {
  AddCustomEvent(kEventRename, "/tmp/v/docs/\xff\n", "/tmp/v/docs/\"", Json::Value(true));
  EXPECT_EQ(std::filesystem::status(QueuePath("docs")).permissions(), std::filesystem::perms(0600));
  const std::string line = Taken("docs");
  const Event event(line);
  EXPECT_EQ(line.find('\n'), line.size() - 1);
  EXPECT_TRUE(event.path == "/tmp/v/docs/\xff\n" && event.path_old == "/tmp/v/docs/\"" && event.data == true);
  support::WriteText(QueuePath("docs"), "");
  auto lock = std::make_unique<LockFile>(QueuePath("docs"), true);
  support::OnSleep([&] {
    std::filesystem::rename(QueuePath("docs"), QueuePath("docs") + ".tmp");
    lock.reset();
  });
  AddCustomEvent(kEventReindex, "/tmp/v/docs", "", Json::Value());
  EXPECT_EQ(support::ReadText(QueuePath("docs") + ".tmp"), "");
  EXPECT_NE(Taken("docs"), "");
}

TEST_F(CustomEventsTest, ALostEventIsLoggedThrownAndShownInTheStatusOfItsShare) {
  const std::string reason = "open failed, path=/tmp/v/@fileindex/docs/queue, reason=No such file or directory";
  const auto add = [] { AddCustomEvent(kEventReindex, "/tmp/v/docs/a", "", Json::Value()); };
  std::filesystem::remove_all("/tmp/v/@fileindex");
  EXPECT_EQ(ReasonOf(506, add), reason);
  EXPECT_TRUE(log_.texts().back().ends_with("(AddCustomEvent) AddCustomEvent failed, code=506, reason=" + reason +
                                            ". Set [docs] need reindex"));
  EXPECT_EQ(StatusMgr().GetShareStatus("docs"), kShareNeedReindex);
  support::WriteText(kFileIndexStatusCfgPath, "[");
  EXPECT_EQ(ReasonOf(506, add), reason);
  std::filesystem::remove(kFileIndexStatusCfgPath);
  EXPECT_NE(ReasonOf(502, [] { AddCustomEvent(kEventReindex, "/elsewhere", "", Json::Value()); }), "");
  EXPECT_FALSE(std::filesystem::exists(kFileIndexStatusCfgPath));
}

}  // namespace quarrox::fileindex
