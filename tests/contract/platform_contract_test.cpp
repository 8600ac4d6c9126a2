#include <unistd.h>

#include <filesystem>
#include <sstream>

#include <gtest/gtest.h>

#include "contract/world.h"
#include "vexo/notifyd.h"
#include "vexo/path_compose.h"
#include "vexo/quota.h"
#include "vexo/recycle.h"
#include "vexo/service.h"
#include "vexo/share.h"
#include "vexo/smb.h"
#include "vexo/user.h"

namespace quarrox::contract {
namespace {

// A call's answer; where it failed, the last error as a negative number.
int Answer(int result) {
  return result < 0 ? -VLIBCErrGet() : result;
}

template <typename Argument>
int Flag(int (*call)(const Argument*, int*), const Argument* argument) {
  int on = -1;
  return call(argument, &on) == 0 ? on : Answer(-1);
}

// What a call writes into a buffer of this size; where it fails, the negative error and what it wrote all the same.
std::string Text(int (*call)(const char*, char*, size_t), const std::string& argument, size_t size = VEXO_PATH_SIZE) {
  char text[VEXO_PATH_SIZE] = "";
  return (call(argument.c_str(), text, size) == 0 ? "" : std::to_string(Answer(-1))) + text;
}

struct PlatformContract : testing::Test {
  void SetUp() override {
    if (volume_.empty()) GTEST_SKIP() << "needs root and a mount namespace of its own";
    for (auto& share : shares_) std::filesystem::create_directories(share.path = volume_ / share.path);
    std::filesystem::create_directories(volume_ / "homes/nobody/#recycle");
    SetUpWorld(shares_);
  }

  const std::filesystem::path volume_ = Volume();
  const std::string long_ = "a \xc3\xbc \"b\" " + std::string(245, 'c');
  std::vector<support::FakeShare> shares_ = {
      // Recycle bin, encrypted, locked, read-only, unreadable files hidden.
      {"in", "docs/in", false, false, false, false, false},  {"docs", "docs", true, false, false, false, false},
      {"homes", "homes", false, false, false, false, false}, {"vault", "vault", false, true, false, true, false},
      {"pts", "/dev/pts", false, false, false, false, true}, {long_, long_, false, true, true, false, false}};
};

TEST_F(PlatformContract, SharesAreOpenedByTheirExactNames) {
  VEXO_SHARE* share = nullptr;
  for (const auto& of : shares_) {
    ASSERT_TRUE(VEXOShareGet(of.name.c_str(), &share) == 0 && share->szPath == of.path) << of.name;
    EXPECT_EQ((std::vector{Flag(VLIBShareRecycleStatusGet, share), Flag(VLIBShareIsEncryptionGet, share),
                           Flag(VLIBShareIsEncryptedGet, share), Flag(VLIBShareIsReadOnlyGet, share),
                           Flag(VLIBShareHideUnreadableGet, share)}),
              (std::vector<int>{of.recycle, of.encryption, of.locked, of.read_only, of.hide_unreadable}));
    VEXOShareFree(share);
  }
  EXPECT_EQ(Answer(VEXOShareGet("Docs", &share)), -VEXO_ERR_NO_SUCH_SHARE);
  EXPECT_EQ(Flag<VEXO_SHARE>(VLIBShareIsReadOnlyGet, share), -VEXO_ERR_BAD_PARAMETER);  // null, as it must be
}

TEST_F(PlatformContract, PathsAreJudgedByWholeComponents) {
  // A path, its share or the error, and "s" in a snapshot, "r" in the share's recycle bin, "h" in a home's.
  std::istringstream rows(R"(docs/ docs -  docs/in/x in -  docs/inner docs -  docs2 -5120 -  homes/nobody homes -
      docs/.snapshots/x docs -s  #snapshot -5120 -s  docs/#snapshots docs -  docs/a/#snapshot docs -  vault/#recycle vault -
      docs/#recycle/x docs -r  docs/#recycled docs -  homes/nobody/#recycle/x homes -h  homes/root/#recycle homes -)");
  char share[VEXO_SHARE_NAME_SIZE], dir[VEXO_PATH_SIZE];
  for (std::string name, holder, marks; rows >> name >> holder >> marks;) {
    const std::string path = volume_ / name;
    const int result = VEXOShareNamePathGet(path.c_str(), share, sizeof(share), dir, sizeof(dir));
    EXPECT_EQ(result == 0 ? share : std::to_string(Answer(result)), holder) << name;
    EXPECT_EQ(marks.find('s') != marks.npos, Flag(VLIBFhsPathInSnapshot, path.c_str())) << name;
    EXPECT_EQ(marks.find('r') != marks.npos, VEXOShareIsShareRecycle(path.c_str()) == 1) << name;
    EXPECT_EQ(marks.find('h') != marks.npos, VEXORecycleUserHomePathIsExist(path.c_str(), VEXO_USERS_LOCAL)) << name;
  }
  EXPECT_EQ(Answer(VEXOShareNamePathGet((volume_ / "docs").c_str(), share, 4, dir, 1)), -VEXO_ERR_BUFFER_TOO_SMALL);
  EXPECT_EQ(Text(FILEIDXDBPathCompose, "/v/docs/") + Text(FILEIDXDBPathCompose, "/"), "/v/@fileindex/docs/db-3328");
  EXPECT_EQ(Text(FILEIDXQueuePathCompose, "/d", 20) + Text(FILEIDXGetIndexID, "in", 12), "/@fileindex/d/queue-3584");
}

TEST_F(PlatformContract, TheMachineAnswersAndItsUsersCanBeTaken) {
  VEXO_USER* user = nullptr;
  for (const auto& [name, uid] : {std::pair("nobody", 65534U), {"root", 0U}}) {
    ASSERT_EQ(VEXOUserGetByUID(uid, &user), 0);
    EXPECT_TRUE(VLIBGroupIsAdminGroupMem(user->name, 0) == (uid == 0) && ResetCredentialsByName(user->name, true));
    EXPECT_TRUE(!ResetCredentialsByName("Root", true) && geteuid() == uid && getegid() == user->gid);
    EXPECT_EQ(Text(VEXOServiceHomePathGet, name), uid == 0 ? user->home : volume_ / "homes" / name);
    VEXOUserFree(user);
  }
  EXPECT_EQ(Answer(VEXOUserGet("Root", &user)), -VEXO_ERR_NO_SUCH_USER);
  const std::string docs = volume_ / "docs", vault = volume_ / "vault";
  EXPECT_EQ(
      (std::vector{VEXOFSDirIsMntPoint("/proc"), VEXOFSDirIsMntPoint("/dev/pts"), VEXOFSDirIsMntPoint(docs.c_str()),
                   VEXOGetFSType("/proc", 0), VEXOFSIsRemoteFS(VEXOGetFSType(docs.c_str(), 0)),
                   VEXOFSIsImageFS(VEXO_FS_UDF), VEXOEAIsHiddenDir("@eaDir"), VEXOEAIsHiddenDir("eaDir"),
                   VEXOQuotaIsEnough(0, docs.c_str(), 1, 0), VEXOQuotaIsEnough(0, vault.c_str(), 1ULL << 62, 0),
                   VLIBCErrGet(), VEXOSMBSetSpotlight(1), VEXOSMBIsEnableSpotlight()}),
      (std::vector<int>{1, 0, 0, VEXO_FS_PSEUDO, 0, 1, 1, 0, 1, 0, VEXO_ERR_VOLUME_FULL, 0, 1}));
}

TEST_F(PlatformContract, SharesAreListedAndMonitorsStored) {
  VLIBC_SZLIST* list = VLIBCSzListAlloc(1);
  EXPECT_EQ(VLIBShareEnum(&list, [](const VEXO_SHARE* share) { return share->szName[0] == 'p' ? 1 : 0; }), 5);
  EXPECT_EQ(std::string(VLIBCSzListGet(list, 4)) + VLIBCSzListGet(list, 1), long_ + "docs");
  EXPECT_TRUE(VLIBCSzListGet(list, 5) == nullptr && VLIBCSzListGet(list, -1) == nullptr);
  VLIBCSzListFree(list);
  using namespace VEXO::VEXONOTIFYD;
  const auto upsert = [](const Json::Value& config) {
    return MonitorQueue::Upsert(MonitorQueue(config), "test", MONITOR_QUEUE_TYPE_APPLICATION);
  };
  Json::Value config;
  config["queue"] = (volume_ / "@fileindex/docs/queue").string();
  config["config"][0]["path"] = (volume_ / "docs").string();
  EXPECT_FALSE(upsert(config));
  EXPECT_EQ(VLIBCErrGet(), VEXO_ERR_BAD_PARAMETER);
  config["config"][0]["mask"] = 1;
  EXPECT_TRUE(upsert(config) && std::filesystem::is_directory(volume_ / "@fileindex/docs"));
  for (int i = 0; i < 2; ++i) {
    EXPECT_TRUE(MonitorQueue::Delete(config["queue"].asString(), "test", MONITOR_QUEUE_TYPE_APPLICATION));
  }
  EXPECT_EQ(VLIBServiceStart("vexocontentextractd", TRUE), 0);
}

}  // namespace
}  // namespace quarrox::contract
