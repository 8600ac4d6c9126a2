#include "fileindex/folder_pauses.h"
#include "fileindex/index_mgr.h"
#include "fileindex/optree.h"
#include "support/index_mgr_test.h"

namespace quarrox::fileindex {

using support::ReadText, support::ReasonOf, support::WriteText, testing::HasSubstr;
using IndexMgrShareTest = support::IndexMgrTest;

constexpr char kRefused[] = R"({"success":false,"error":{"code":617,"msg":"disk"}})";

TEST_F(IndexMgrShareTest, MissingArgumentsAreFoundInOrderBeforeAnythingIsLookedAt) {
  const std::pair<std::function<void()>, std::string> cases[] = {
      {[] { ShareRename("", ""); }, "(ShareRename) Failed [share_from.empty()], reason: Missing share_from"},
      {[] { ShareClearPaused("a", ""); }, "(ShareClearPaused) Failed [share_path.empty()], reason: Missing share path"},
      {[] { VolumeClean(""); }, "(VolumeClean) Failed [mount_point.empty()], reason: Missing mount point"},
      {[] { UserRename("a", ""); }, "(UserRename) Failed [user_to.empty()], reason: Missing user_to"}};
  for (const auto& [operation, line] : cases) {
    EXPECT_TRUE(line.ends_with(" " + ReasonOf(120, operation)) && log_.texts().back().ends_with(line)) << line;
  }
  EXPECT_TRUE(world_.calls().empty());
}

TEST_F(IndexMgrShareTest, APausedShareComesBackWithItsMonitorAndAnOperationStopsWhereItFails) {
  for (const char* share : {"none", "docs"}) SharePause(share);
  EXPECT_EQ(Told(), "worker_delete docs; Delete docs/queue; index_pause fileindex_docs; ");
  EXPECT_EQ(Folders(), "/docs/a- /docsx/ /homes/al /docs/b- /music/ ");
  world_.Fail("MonitorQueue::Upsert");
  EXPECT_EQ(ReasonOf(502, [] { ShareResume("docs"); }), "MonitorQueue::Upsert failed, share=docs");
  EXPECT_THAT(log_.texts().back(), HasSubstr("(UpsertVEXONotifydCfg) Failed [!MonitorQueue::Upsert(monitor_queue, k"));
  world_.Heal("MonitorQueue::Upsert");
  ShareResume("docs");
  EXPECT_TRUE(Told().ends_with("index_resume fileindex_docs; Upsert docs/queue; worker_create docs; "));
  EXPECT_EQ(Folders(), "/docs/a /docsx/ /homes/al /docs/b /music/ ");
  EXPECT_EQ(toString(world_.monitors[QueuePath("docs")]["config"][1]) +
                toString(world_.monitors[QueuePath("docs")]["config"][2]),
            R"({"ignore":["@eaDir"],"mask":65484,"path":"/tmp/v/docs/b"}null)");
}

TEST_F(IndexMgrShareTest, AFolderIsPausedByItselfUntilItIsResumedOrItsTimeOrItsShareSaysOtherwise) {
  const auto end_of = [](const std::string& path) {
    std::shared_ptr<Folder> folder;
    FolderMgr().Get(folder, path);
    return FolderPauses().EndOf(*folder).value_or(-1);
  };
  EXPECT_EQ(ReasonOf(902, [] { FolderPause("/docs/c", 0); }), "/docs/c");
  EXPECT_EQ(ReasonOf(120, [] { FolderPause("/docs/a", -1); }), "Pause length should NOT be negative");
  support::SetTime(1000);
  FolderPause("/docs/a", 0);
  for (const int end : {2000, 1001}) FolderPause("/docs/b", end);
  EXPECT_EQ(Told(), "notify_setting_changed docs; notify_setting_changed docs; notify_setting_changed docs; ");
  EndFolderPauses("docs");
  EXPECT_EQ(Folders() + Taken("docs"), "/docs/a- /docsx/ /homes/al /docs/b- /music/ ");
  support::SetTime(1001);
  EndFolderPauses("docsx");
  EXPECT_EQ(end_of("/docs/b"), 1001);
  EndFolderPauses("docs");
  EXPECT_EQ(Folders(), "/docs/a- /docsx/ /homes/al /docs/b /music/ ");
  const Event event(Taken("docs"));
  EXPECT_EQ(event.path, "/tmp/v/docs/b");

  world_.AddShare({.name = "new", .path = "/tmp/v/new"});
  std::filesystem::create_directories("/tmp/v/@fileindex/new");
  FolderPause("/docs/b", 3000);
  ShareRename("docs", "new");
  EXPECT_EQ(std::pair(end_of("/new/a"), end_of("/new/b")), std::pair(int64_t{0}, int64_t{3000}));
  Json::Value record, changes;
  changes["paused"] = false;
  std::filesystem::create_directories("/tmp/v/new/b");
  FolderChange(record, "/new/b", changes);
  changes["paused"] = true;
  FolderChange(record, "/new/b", changes);
  EXPECT_EQ(end_of("/new/b"), -1);  // it is paused, but not until then
  FolderResume("/new/b");
  SharePause("new");
  const std::string reason = ReasonOf(120, [] { FolderPause("/new/a", 0); });
  EXPECT_THAT(reason, HasSubstr("fileindexctl share resume new"));
  EXPECT_EQ(ReasonOf(120, [] { FolderResume("/new/a"); }), reason);
  ShareResume("new");
  EXPECT_EQ(Folders(), "/new/a /docsx/ /homes/al /music/ /new/b ");
  EXPECT_TRUE(FolderPauses().empty());
}

TEST_F(IndexMgrShareTest, ARenamedShareKeepsItsFoldersEvenWhereTheEngineFails) {
  world_.AddShare({.name = "new", .path = "/tmp/v/new"});
  std::filesystem::create_directories("/tmp/v/@fileindex/new");
  world_.engine_answers = {kRefused};
  EXPECT_EQ(ReasonOf(617, [] { ShareRename("docs", "new"); }), "Request failed, msg=disk");
  EXPECT_EQ(Folders() + Taken("new"), "/new/a /docsx/ /homes/al /new/b /music/ ");
  ShareRename("docs", "new");
  EXPECT_EQ(Taken("new"), "{\"data\":null,\"event\":256,\"path\":\"/tmp/v/new\",\"path_old\":\"/tmp/v/docs\"}\n");
  ShareMigrate("docsx", "/x/docsx", "/tmp/v/docsx");
  EXPECT_EQ(Event(Taken("docsx")).path_old, "/x/docsx");
  std::filesystem::create_directories("/tmp/v/docsx");
  for (const char* share : {"homes", "docsx"}) ShareCheckRecycle(share);
  EXPECT_EQ(Taken("homes") + Event(Taken("docsx")).path, "/tmp/v/docsx/#recycle");
}

TEST_F(IndexMgrShareTest, AShareIsRebuiltCleanedAndClearedAndTheLastOneSwitchesTheServicesOff) {
  ShareRebuild("docs");
  EXPECT_EQ(Told(),
            "index_delete fileindex_docs; index_create fileindex_docs; Upsert docs/queue; worker_create docs; ");
  EXPECT_EQ(Event(Taken("docs")).event, kEventReindex);
  StatusMgr().SetShareStatus("docs", 3);
  ShareAutoClean("docs");
  const std::string removed = "/bin/rm, -rf, docs/queue; /bin/rm, -rf, docs/queue.tmp; /bin/rm, -rf, docs/db; ";
  EXPECT_EQ(Told(), "index_delete fileindex_docs; Delete docs/queue; " + removed);
  EXPECT_EQ(StatusMgr().GetShareStatus("docs"), 0);
  world_.shares.clear();
  for (const char* share : {"docs", "docsx", "homes"}) ShareClearPaused(share, "/tmp/v/" + std::string(share));
  EXPECT_TRUE(Folders() == "/music/ " && world_.CountCalls("VLIBServicectlStop") == 0);
  world_.spotlight = true;
  world_.Fail("VLIBServiceRestart", 0x1600, 0);
  ShareClearPaused("music", "/tmp/w/music");
  EXPECT_TRUE(!world_.spotlight && Told().ends_with("Restart samba; VLIBServicectlStop pkg-Quarrox-fileindexd; "));
  EXPECT_THAT(log_.texts().back(), HasSubstr("VLIBServiceRestart failed: err=[0x1600 call.h:"));
}

TEST_F(IndexMgrShareTest, AVolumeIsPausedResumedWhereItCanBeAndClearedAwayWhenItIsGone) {
  world_.engine_answers = {R"({"success":true})", kRefused};
  EXPECT_EQ(ReasonOf(617, [] { VolumePause("/tmp/v/"); }), "Request failed, msg=disk");
  EXPECT_EQ(Folders(), "/docs/a-/tmp/v /docsx/-/tmp/v /homes/al-/tmp/v /docs/b-/tmp/v /music/ ");
  world_.AddShare({.name = "docsx", .path = "/tmp/v/docsx", .locked = true});
  world_.RemoveShare("homes");
  VolumeResume("/tmp/v");
  EXPECT_EQ(Folders(), "/docs/a /docsx/- /homes/al-/tmp/v /docs/b /music/ ");
  VolumePause("/tmp/v");
  ShareResume("docs");
  VolumeClean("/tmp/v///");
  EXPECT_TRUE(Told().ends_with("homes/db; index_delete fileindex_homes; "));
  EXPECT_EQ(Folders(), "/docs/a/tmp/v /docs/b/tmp/v /music/ ");
}

TEST_F(IndexMgrShareTest, FoldersFollowTheirUserAndTheHomeService) {
  WriteText(kUserInfosPath, R"({"al":{"x":[1]},"bo":2})");
  UserRename("al", "bo");
  EXPECT_EQ(ReadText(kUserInfosPath) + FolderMgr().GetFolders()[2]->GetOwner(), "{\"bo\":{\"x\":[1]}}\nbo");
  HomeEnable(false);
  EXPECT_EQ(Folders(), "/docs/a /docsx/ /homes/al- /docs/b /music/ ");
  UserDelete("bo");
  EXPECT_EQ(ReadText(kUserInfosPath) + Folders(), "{}\n/docs/a /docsx/ /docs/b /music/ ");
}

TEST_F(IndexMgrShareTest, TheStatusIsThatOfSharesThatCanBeLookedAtAndAFailedRebuildOfSuggestionsKeepsItsMark) {
  WriteText(QueuePath("homes") + ".tmp", "");
  world_.RemoveShare("docs");
  EXPECT_EQ(GetIndexProcessingStatus(), "processing");
  EXPECT_THAT(log_.texts().back(), HasSubstr("(GetIndexProcessingStatus) Failed to get status from share[docs]"));
  for (const auto& [resume_time, status] : {std::pair("0", "paused"), {"1", "processing"}, {"99999999999", "paused"}}) {
    WriteText(kFileIndexStatusCfgPath, "{\"resume_time\":" + std::string(resume_time) + "}");
    EXPECT_EQ(GetIndexProcessingStatus(), status);
  }
  world_.AddShare({.name = "homes", .path = "/tmp/v/homes", .read_only = true});
  EXPECT_EQ(GetIndexProcessingStatus(), "finished");
  world_.AddShare({.name = "docs", .path = "/tmp/v/docs"});
  world_.engine_answers = {R"({"success":true,"data":{"unavail":["fileindex_docs"]}})",
                           R"({"success":true,"data":[{"VEXOMDPath":"/tmp/v/docs/f"}]})", kRefused};
  EXPECT_THROW(UpdateTermSuggestion(), Error);
  EXPECT_THAT(world_.engine_requests.at(1), HasSubstr("\"fileindex_docs\""));
  EXPECT_TRUE(std::filesystem::exists("/tmp/v/@fileindex/docs/db/term.sugg.running"));
}

}  // namespace quarrox::fileindex
