#include <random>

#include "common/lock_file.h"
#include "fileindex/index_mgr.h"
#include "support/call_capture.h"
#include "support/fake_daemon.h"
#include "support/index_mgr_test.h"

namespace quarrox::fileindex {

using support::ReadText, support::ReasonOf, support::WriteText;

// The shares docs and homes have directories here.
class IndexMgrFolderTest : public support::IndexMgrTest {
 protected:
  void Restart(const std::vector<Json::Value>& list) {
    for (const char* place : {"/var/packages", "/tmp/v/@fileindex"}) std::filesystem::remove_all(place);
    for (const std::string dir : {"/docs/a/b/c", "/docs/ab", "/docs/b", "/homes/a/b/c", "/homes/ab", "/homes/b"})
      for (const char* above : {"/tmp/v", "/tmp/v/@fileindex"}) std::filesystem::create_directories(above + dir);
    std::filesystem::create_directories("/var/packages/Quarrox/etc");
    toFile(Array(list), kFileIndexFoldersCfgPath);
    world_.ForgetCalls();
    daemon_.emplace();
  }
  static Json::Value Record(const std::string& path, const std::string& group = "", bool audio = false) {
    Json::Value record = Folder(path, "n" + path, "", "", true, audio, false, false, false, false).GetData();
    return record["group"] = group, record;
  }
  static Json::Value Array(const std::vector<Json::Value>& values) { return Vec2JsonArr(values); }
  // What the daemons, the engine and the services were told, the list, and for docs and homes how many events are
  // queued, with "R" for one that is marked.
  std::string State() {
    const char* const words[][2] = {
        {"\"index_create\"", "create "}, {"Queue::Upsert(", "watch "},   {"Daemon(", "tell "},
        {"\"index_delete\"", "drop "},   {"Queue::Delete(", "unwatch "}, {"VLIBCExec(", "rm "},
        {"ctlStart(", "start "},         {"ctlStop(", "stop "}};
    std::string state;
    for (const std::string& call : world_.calls())
      for (const auto& [part, word] : words) state += call.find(part) != call.npos ? word : "";
    state += Folders();
    for (const std::string share : {"docs", "homes"}) {
      const std::string queue = std::filesystem::is_directory(QueuePath(share)) ? "" : ReadText(QueuePath(share));
      state += std::to_string(std::ranges::count(queue, '\n')) + " R"[StatusMgr().GetShareStatus(share) & 1];
    }
    return world_.ForgetCalls(), state;
  }
  std::optional<support::FakeDaemon> daemon_;
};

TEST_F(IndexMgrFolderTest, AStepThatFailsLeavesWhatIsBeforeItDoneAndWhatIsBehindItUndone) {
  // A step is a call that fails, or a queue that cannot be written.
  const auto expect = [this](const std::vector<Json::Value>& list, const std::function<void()>& operation,
                             const std::vector<std::pair<std::string, std::string>>& steps) {
    for (const auto& [step, state] : steps) {
      Restart(list);
      step[0] == '/' ? void(std::filesystem::create_directories(step)) : world_.Fail(step);
      ReasonOf(std::stoi(state), operation);
      EXPECT_EQ(State(), state.substr(state.find(' ') + 1)) << step;
      world_.Heal(step);
      const LockFile free(kFolderLockPath, true);
    }
  };
  const auto add = [] { FolderAdd(Array({Record("/docs/a"), Record("/homes/a"), Record("/docs/b")}), false); };
  expect({Record("/homes")}, add,
         {{"VLIBServicectlStart", "0 start create watch watch tell tell /homes /docs/a /homes/a /docs/b 2 1 "},
          {QueuePath("docs"), "502 start create watch watch tell tell /homes /docs/a /homes/a /docs/b 0R0 "}});
  const auto remove = [] { FolderDelete(Array({"/docs/a", "/homes/a"})); };
  expect({Record("/docs/a"), Record("/homes"), Record("/homes/a", "", true)}, remove,
         {{"none", "0 drop unwatch rm rm rm watch tell tell /homes 0 1 "},
          {"FILEIDXDBPathCompose", "502 drop unwatch rm rm /docs/a /homes /homes/a 0 0 "},
          {QueuePath("homes"), "502 drop unwatch rm rm rm watch tell tell /homes 0 0R"}});
}

TEST_F(IndexMgrFolderTest, WhatChangesInAFolderIsQueuedAndTheLastOneLeavesNothingBehind) {
  Restart({});
  FolderAdd(Array({Record("/docs/a"), Record("/docs/gone")}), true);
  EXPECT_EQ(State(), "start create watch tell /docs/a /docs/gone 0 0 ");
  FolderSet(Array({Record("/docs/a", "", true), Record("/homes/b")}), false);  // makes no index
  EXPECT_EQ(State(), "start watch watch tell tell /docs/gone /docs/a /homes/b 1 1 ");
  EXPECT_NE(ReadText(QueuePath("docs")).find(R"({"audio":true,"document":false,"photo":false,)"), std::string::npos);
  FolderReindex(Array({"/docs/a", "/docs/a/b", "/docs/b", "/gone/x", "/docs/b"}));
  EXPECT_EQ(State(), "/docs/gone /docs/a /homes/b 3 1 ");
  WriteText(kFileIndexStatusCfgPath, R"({"share":{"docs":3,"homes":2}})");
  FolderReindex(Array({"/docs/a", "/docs/b", "/homes/b"}));
  EXPECT_EQ(State(), "drop create drop create /docs/gone /docs/a /homes/b 4 2 ");
  EXPECT_EQ(ReadText(kFileIndexStatusCfgPath), "{\"share\":{\"docs\":0,\"homes\":2}}\n");
  FolderDelete(std::string("docs"));
  FolderDelete(Array({"/homes/b"}));
  EXPECT_EQ(State(), "drop unwatch rm rm rm tell drop unwatch rm rm rm tell stop 4 2 ");  // rm is only noted
  world_.SetRoom("/tmp/v/docs", VEXO_ERR_VOLUME_FULL);
  const auto add = [](const auto&... records) { return [=] { FolderAdd(Array({records...}), false); }; };
  EXPECT_EQ(ReasonOf(1003, add(Record("/docs/a"))), "Share (docs) space not enough");
  EXPECT_EQ(ReasonOf(901, add(Record("/homes/b"), Record("/homes/b"))), "Duplicated ID: /homes/b");
  EXPECT_EQ(ReasonOf(903, add(Record("/homes/b"), Record("/homes/x"))), "Path cannot index: /homes/x");
  EXPECT_EQ(State(), "4 2 ");
}

TEST_F(IndexMgrFolderTest, AChangeKeepsWhatAnotherProcessChangesWhileItWaitsForTheLock) {
  Restart({Record("/docs/a")});
  Json::Value result = "as it was", changes;
  for (const auto& [member, value, code] :
       {std::tuple("path", "/docs/b", 120), {"group", kAll, 120}, {"audio", "", 120}}) {
    changes[member] = value;
    ReasonOf(code, [&] { FolderChange(result, "/docs/a", changes); });
    changes.clear();
  }
  ReasonOf(902, [&] { FolderChange(result, "/docs/b", changes); });
  ReasonOf(120, [&] { FolderChange(result, "/docs/a", "name"); });
  EXPECT_EQ(State() + result.asString(), "/docs/a 0 0 as it was");
  support::ResetCalls(1, EAGAIN);
  support::OnSleep([] { toFile(Array({Record("/docs/a", "theirs", true)}), kFileIndexFoldersCfgPath); });
  changes["name"] = "mine";
  FolderChange(result, "/docs/a", changes);
  Json::Value expected = Record("/docs/a", "theirs", true), kept;
  expected["name"] = "mine";
  FolderGet(kept, "/docs/a");
  EXPECT_EQ(toString(kept) + toString(result), toString(expected) + toString(expected));
  EXPECT_EQ(State(), "start watch tell /docs/a 1 0 ");
}

TEST_F(IndexMgrFolderTest, ABadRequestIsAnErrorAndChangesNothing) {
  Restart({Record("/docs/a")});
  const std::string zero(1, '\0'), before = State();
  const std::vector<std::string> paths = {
      "", "docs", "/", "/gone/a", "/docs/" + std::string(1 << 20, 'x'), "/docs" + zero + "/a", "/docs/a" + zero + "b"};
  std::vector<Json::Value> requests = {Json::Value(), true, 1, 1.5, "/docs/a", Json::objectValue};
  for (const Json::Value& bad : {Json::Value(), Json::Value(true), Json::Value(1), Json::Value(Json::arrayValue)})
    requests.push_back(Array({Record("/docs/b"), bad}));
  for (const char* key : {"path", "name", "document", "audio", "video", "photo"})
    requests.push_back(Array({Record("/docs/b")})), requests.back()[0][key] = 1;
  for (const std::string& path : paths) requests.insert(requests.end(), {Array({Record(path)}), Array({path})});
  for (const Json::Value& request : requests) {
    SCOPED_TRACE(toString(request).substr(0, 99));
    for (const bool mode : {false, true}) EXPECT_THROW(FolderAdd(request, mode), Error);
    EXPECT_THROW(FolderSet(request, false), Error);
    EXPECT_THROW(FolderDelete(request), Error);
    const bool passed_over = request == Array({"/gone/a"}) || request == Array({"/"});  // no folder's share
    EXPECT_THROW(FolderReindex(passed_over ? Json::Value(1) : request), Error);
    EXPECT_EQ(State(), before);
  }
  Json::Value result = "as it was";
  for (const std::string& path : paths) EXPECT_EQ(ReasonOf(902, [&] { FolderGet(result, path); }), path);
  for (const Json::Value& extra : {Json::Value(), Array({1}), Array({"statu"})})
    EXPECT_THROW(FolderList(result, 0, 9, "", "", kAll, "", extra), Error);
  EXPECT_EQ(result, "as it was");
}

// Beside each folder asked for itself.
TEST_F(IndexMgrFolderTest, AListingTellsOfEachFolderWhatItTellsItself) {
  std::mt19937 random(1);
  const auto pick = [&](const auto&... from) { return std::array{from...}[random() % sizeof...(from)]; };
  const auto path = [&] { return pick("/docs", "/homes") + std::string(pick("", "/a", "/a/b", "/a/b/c", "/none")); };
  size_t processing = 0;
  for (int round = 0; round < 1000; ++round) {
    Restart({Record(path()), Record(path()), Record(path()), Record(path())});
    for (size_t events = random() % 8; events > 0; --events) {
      Json::Value event;
      event["event"] = pick(4, 4, 4, 8, 8, 8, 0x80, 0x100, 0x10000, random() % 32 ? 8 : 0x200);
      event["is_dir"] = random() % 3 == 0;
      for (const char* key : {"path", "path_old"}) event[key] = "/tmp/v" + path() + pick("", "", "/x", "/x", "//x/");
      std::ofstream(QueuePath(pick("docs", "homes")) + pick("", ".tmp"), std::ios::app) << toString(event) << "\n";
    }
    Json::Value listed;
    FolderList(listed, 0, 99, "path", "", kAll, "", Array({"status", "status"}));
    ASSERT_LE(world_.CountCalls("VEXOShareGet"), 4U);  // by the list, and for the folders
    for (const Json::Value& data : listed["folder"])
      ASSERT_EQ(data, Folder(data).GetDataWithAdditional(Array({"status"}))) << round;
    processing += toString(listed).find("processing") != std::string::npos;
  }
  EXPECT_GT(processing, 100U);
}

TEST_F(IndexMgrFolderTest, ASummaryPutsTheFoldersOfAGroupTogetherInTheirOrder) {
  const auto summary = [](const std::string& status) {
    WriteText(kFileIndexStatusCfgPath, "{" + status + "}");
    Json::Value result;
    FolderSummary(result);
    std::string text = result["status"].asString();
    for (const Json::Value& item : result["items"])
      text += (item["group"] == true ? " *" : " ") + item["name"].asString() + "=" + item["text"].asString();
    return text;
  };
  Restart({});
  EXPECT_EQ(summary(""), "finished");
  std::vector<Json::Value> list = {Record("/docs/a", "z"), Record("/homes/a", "z"), Record("/homes/b"),
                                   Record("/homes", "g"), Record("/docs/b", "g")};
  Restart(list);
  WriteText(QueuePath("homes"), R"({"event":65536,"path":"/tmp/v/homes"})");
  const std::string marked = R"("share":{"docs":1})", paused = R"(,"resume_time":0)";
  EXPECT_EQ(summary(marked), "processing n/homes/b=processing *g=need_reindex *z=processing");
  EXPECT_EQ(summary(marked + paused), "need_reindex n/homes/b=paused *g=need_reindex *z=need_reindex");
  list.insert(list.begin() + 3, Record("/docs/none", "g"));
  Restart(list);
  EXPECT_EQ(summary(""), "error n/homes/b=finished *g=error *z=finished");
  Json::Value groups;
  FolderListGroups(groups);
  EXPECT_EQ(toString(groups), R"(["g","z"])");
}

}  // namespace quarrox::fileindex
