#include <functional>
#include <set>
#include <string>

#include <gtest/gtest.h>

#include "common/error.h"
#include "common/sdk/credentials.h"
#include "common/sdk/share.h"
#include "common/sdk/share_path.h"
#include "common/sdk/user.h"
#include "support/errors.h"
#include "support/fake_platform/fake_platform.h"
#include "support/syslog_capture.h"

namespace quarrox::sdk {
namespace {

using support::FakePlatform;
using support::ReasonOf;

class SDKTest : public ::testing::Test {
 protected:
  SDKTest() {
    world_.Reset();
    world_.AddUser({.name = "alice", .uid = 1001, .gid = 101, .home = "/volume1/homes/alice"});
    world_.AddUser({.name = "boss", .uid = 1002, .gid = 102, .admin = true});
    world_.AddShare({.name = "docs", .path = "/volume1/docs", .privileges = {{"alice", 2}}});
    world_.AddShare({.name = "homes", .path = "/volume1/homes", .read_only = true});
    world_.AddShare({.name = "vault", .path = "/volume1/vault", .encryption = true, .locked = true});
    world_.AddShare({.name = "open", .path = "/volume1/open", .recycle = true, .encryption = true});
  }
  FakePlatform& world_ = FakePlatform::Get();
  support::SyslogCapture log_;
};

TEST_F(SDKTest, ASharesPropertiesDecideWhetherItCanBeIndexed) {
  EXPECT_EQ(SDKShare::Enum(), (std::set<std::string>{"docs", "homes", "open", "vault"}));
  const SDKShare open("open");
  EXPECT_TRUE(open.CanBeIndexed() && open.IsEncryption() && open.IsEnableRecycleBin() && !open.IsHideUnReadable());
  EXPECT_FALSE(SDKShare("vault").CanBeIndexed() || SDKShare("homes").CanBeIndexed());
  EXPECT_EQ(open.GetDBName(), "fileindex_open");
  EXPECT_EQ(open.GetQueuePath(), "/volume1/@fileindex/open/queue");
}

TEST_F(SDKTest, EveryFailingCallHasItsCodeItsReasonAndOneLogLine) {
  const SDKShare docs("docs");
  const auto fails = [this](const char* function, int code, const std::string& reason, const auto& call) {
    const size_t lines = log_.lines().size();
    world_.Fail(function);
    EXPECT_THROW(call(), Error) << function;
    EXPECT_EQ(ReasonOf(code, call), reason) << function;
    EXPECT_EQ(log_.lines().size(), lines + 2) << function;
    world_.Heal(function);
  };
  fails("VEXOShareGet", 800, "docs", [] { SDKShare share("docs"); });
  fails("VLIBCSzListAlloc", 121, "VLIBCSzListAlloc failed", [] { SDKShare::Enum(); });
  fails("VLIBShareEnum", 121, "VLIBShareEnum failed", [] { SDKShare::Enum(); });
  const auto of_docs = [&](const std::string& function, const auto& call, const char* in_reason = nullptr) {
    fails(function.c_str(), 502, (in_reason ? in_reason : function) + " failed, share=docs", call);
  };
  of_docs("FILEIDXGetIndexID", [&] { docs.GetDBName(); });
  of_docs("FILEIDXDBPathCompose", [&] { docs.GetDBPath(); });
  of_docs("FILEIDXQueuePathCompose", [&] { docs.GetQueuePath(); });
  of_docs("VLIBShareRecycleStatusGet", [&] { docs.IsEnableRecycleBin(); });
  of_docs("VLIBShareIsEncryptionGet", [&] { docs.IsEncryption(); });
  of_docs(
      "VLIBShareIsEncryptedGet", [&] { docs.CanBeIndexed(); }, "VLIBShareis_encryptedGet");
  of_docs(
      "VLIBShareIsReadOnlyGet", [&] { docs.CanBeIndexed(); }, "VLIBShareis_readonlyGet");
  fails("VEXOServiceHomePathGet", 502, "VEXOServiceHomePathGet failed, user=alice",
        [] { User("alice").GetHomePath(); });
  fails("VEXOUserGetByUID", 503, "", [] { SDKCredentials credentials; });
  fails("ResetCredentialsByName", 503, "", [] { SDKCredentials credentials("alice"); });
  world_.Fail("VEXOUserGetByUID", 25);  // the error's number cuts the text
  EXPECT_EQ(ReasonOf(503, [] { SDKCredentials credentials; }), "err=");
  EXPECT_NE(
      log_.texts()[0].find("(SDKShare) Failed [0 > VEXOShareGet(share_name.c_str(), &share_info_) || !share_info_], "
                           "reason: docs [err: Input/output error]"),
      std::string::npos);
}

TEST_F(SDKTest, OnlyAFullVolumeOrQuotaIsNoRoom) {
  const SDKShare docs("docs");
  for (const auto& [error, enough] : {std::pair(0x2900, false), {0x2400, false}, {VEXO_ERR_SYSTEM, true}}) {
    world_.SetRoom("/volume1", error);
    EXPECT_EQ(docs.IsSpaceEnough(), enough) << error;
  }
}

TEST_F(SDKTest, WhatWasAnsweredOnceIsNotAskedAgain) {
  const SDKShare docs("docs");
  const User alice("alice");
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(docs.GetPrivilege("alice"), 2);
    docs.GetDBName(), docs.GetDBPath(), docs.GetQueuePath();
    EXPECT_EQ(alice.GetHomePath(), "/volume1/homes/alice");
    EXPECT_EQ(User().GetHomePath(), "");
    if (i == 0) world_.ForgetCalls();
  }
  EXPECT_TRUE(world_.calls().empty());
}

TEST_F(SDKTest, PathsAreShownAsUsersSeeThem) {
  const User alice("alice");
  const auto shown = [&](const char* path, bool home) { return SharePathMgr::GetSharePath(path, alice, home); };
  EXPECT_EQ(shown("/volume1/docs/a/b.txt", true), "/docs/a/b.txt");
  EXPECT_EQ(shown("/volume1/homes/alice", true), "/home");
  EXPECT_EQ(shown("/volume1/homes/alice/x", true), "/home/x");
  EXPECT_EQ(shown("/volume1/homes/alice/x", false), "/homes/alice/x");
  EXPECT_EQ(shown("/volume1/homes/alice2/x", true), "/homes/alice2/x");
  EXPECT_EQ(SharePathMgr::GetSharePath("/volume1/homes/alice/x", User(), true), "/homes/alice/x");
  EXPECT_TRUE(log_.lines().empty());
  EXPECT_EQ(shown("/elsewhere", true), "");
  EXPECT_EQ(log_.lines().size(), 1U);
}

TEST_F(SDKTest, AGuardGoesBackToWhomItWasMadeFor) {
  {
    SDKCredentials credentials;
    credentials.AsUser("alice");
    EXPECT_EQ(world_.effective_user().name, "alice");
  }
  EXPECT_EQ(world_.effective_user().name, "root");
  { const SDKCredentials credentials("alice"); }
  EXPECT_EQ(world_.effective_user().name, "alice");  // a guard made with a name goes to that name
  {
    SDKCredentials credentials;
    credentials.AsUser("boss");
    EXPECT_EQ(world_.effective_user().name, "root");
    world_.Fail("ResetCredentialsByName");
  }
  EXPECT_EQ(world_.effective_user().name, "root");
  EXPECT_EQ(log_.lines().size(), 1U);
  world_.Heal("ResetCredentialsByName");
  world_.ForgetCalls();
  { const SDKCredentials unused; }
  EXPECT_EQ(world_.CountCalls("ResetCredentialsByName"), 0U);
}

}  // namespace
}  // namespace quarrox::sdk
