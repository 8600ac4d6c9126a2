#include "fileindex/status_mgr.h"

#include <gtest/gtest.h>

#include "common/json.h"
#include "fileindex/folder.h"
#include "support/call_capture.h"
#include "support/errors.h"
#include "support/fake_platform/fake_platform.h"
#include "support/private_machine.h"
#include "support/temp_dir.h"

namespace quarrox::fileindex {

using support::FakePlatform, support::ReasonOf;

class StatusMgrTest : public ::testing::Test {
 protected:
  void SetUp() override {
    FakePlatform::Get().Reset();
    static const bool entered = support::PrivateMachine().Enter();
    if (!entered) GTEST_SKIP() << "no machine of one's own";
    std::filesystem::remove_all("/var/packages");
  }
  static void Put(const std::string& state) { support::WriteText(kFileIndexStatusCfgPath, state); }
  static std::string Saved() { return support::ReadText(kFileIndexStatusCfgPath); }
};

TEST_F(StatusMgrTest, ASetterWritesAsRootAllThatWasLoadedAndOverwritesNothingThatItDoesNotUnderstand) {
  StatusMgr old;
  FakePlatform::Get().Become({.name = "alice", .uid = 1000});
  FakePlatform::Get().AddUser(FakePlatform::Get().effective_user());
  StatusMgr().SetShareStatus("docs", 1);
  EXPECT_EQ(FakePlatform::Get().CountCalls("ResetCredentialsByName"), 2U);  // there and back
  StatusMgr().SetShareStatus("docs", 2);
  EXPECT_EQ(StatusMgr().GetShareStatus("docs"), 3);
  StatusMgr().UnsetShareStatus("docs", 3);
  EXPECT_EQ(Saved(), "{\"share\":{\"docs\":0}}\n");
  old.SetShareStatus("music", 1);
  EXPECT_EQ(Saved(), "{\"share\":{\"music\":1}}\n");
  StatusMgr().ClearShareStatus("music");
  EXPECT_EQ(Saved(), "{\"share\":{}}\n");
  Put(R"({"resume_time":"1","share":[1]})");
  EXPECT_EQ(ReasonOf(120, [] { StatusMgr().GetPauseInfo(); }), "Not a string, data=" + Saved());
  StatusMgr().ClearShareStatus("a");
  EXPECT_EQ(StatusMgr().GetShareStatus("a"), 0);
  StatusMgr().SetShareStatus("a", 1);
  EXPECT_EQ(Saved(), "{\"resume_time\":\"1\",\"share\":{\"a\":1}}\n");
  Put("[1]");
  EXPECT_EQ(ReasonOf(120, [] { StatusMgr().GetShareStatus("a"); }), "Not an object, data=[1]");
  EXPECT_EQ(ReasonOf(120, [] { StatusMgr().Resume(); }) + Saved(), "Not an object, data=[1][1]");
}

TEST_F(StatusMgrTest, APauseIsSavedBeforeTheDaemonIsToldAndFoldersTellOfIt) {
  support::ResetCalls();
  support::SetTime(1000000000);
  EXPECT_EQ(ReasonOf(502, [] { StatusMgr().Pause(2); }), "write failed, reason=Transport endpoint is not connected");
  EXPECT_EQ(support::Sleeps(), std::vector<useconds_t>(4, 1000000));
  EXPECT_EQ(ReasonOf(120, [] { StatusMgr().Pause(-1); }) + Saved(),
            "Pause length should NOT be negative{\"resume_time\":1000007200}\n");
  EXPECT_THROW(StatusMgr().Pause(400000), Error);
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1854967296);  // wrapped
  FakePlatform::Get().AddShare({.name = "docs", .path = "/tmp/docs"});
  for (const char* place : {"/tmp/docs", "/tmp/@fileindex/docs"}) std::filesystem::create_directories(place);
  support::WriteText("/tmp/@fileindex/docs/queue", "{\"event\":65536,\"path\":\"/tmp/docs\"}\n");
  const auto text = [](const std::string& resume_time, int flags) {
    Put("{\"resume_time\":" + resume_time + ",\"share\":{\"docs\":" + std::to_string(flags) + "}}");
    const Folder folder("/docs", "", "", "", true, true, true, true, false, false);
    return folder.GetDataWithAdditional(Vec2JsonArr<std::string>({"status"}))["additional"]["status"]["text"];
  };
  EXPECT_EQ(text("-1", 2), "processing");
  EXPECT_EQ(text("0", 2), "paused");
  EXPECT_EQ(text("1000000000", 2), "processing");
  EXPECT_EQ(text("1000000001", 2), "paused");
  EXPECT_EQ(text("1000000001", 3), "need_reindex");
}

}  // namespace quarrox::fileindex
