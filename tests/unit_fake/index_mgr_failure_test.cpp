#include <set>

#include "common/lock_file.h"
#include "fileindex/index_mgr.h"
#include "support/index_mgr_test.h"

namespace quarrox::fileindex {

using support::ReadText, support::WriteText;

class IndexMgrFailureTest : public support::IndexMgrTest {
 protected:
  using Operation = std::function<void()>;
  struct Row {
    const char* name;
    Operation operation;
    Operation before = [] {};
    Operation mend = operation;            // what is called after a failure
    bool queues_again = true;              // or else the index's own note of its folders makes up for the event
    std::deque<std::string> answers = {};  // of the engine
  };
  struct State {
    std::string files;             // lists, flags and monitor configurations
    std::string queues;            // what is in them, by share
    std::string done;              // steps that others took
    std::set<std::string> queued;  // shares with events
  };
  enum Fault { kBroken, kRefused, kCut, kBusy };

  static Json::Value Records(const std::vector<std::string>& paths, bool audio) {
    Json::Value records(Json::arrayValue);
    for (const std::string& path : paths)
      records.append(Folder(path, "n" + path, "al", "", true, audio, true, true, false, false).GetData());
    return records;
  }
  // Steps are exchanges with the engine and the daemons, and what changes the machine. The switch to root comes before
  // a list is written.
  static bool IsStep(const std::string& call) {
    static const std::regex start("^(DomainSock|SockConn|Daemon|Monitor|VLIBServ|VLIBCExec|ResetCred)");
    return std::regex_search(call, start);
  }
  // What a step that fails ends the operation with; 0 where that is only logged.
  static int CodeOf(const std::string& step, Fault fault) {
    if (fault == kBusy || step.starts_with("VLIB")) return 0;
    if (fault == kRefused) return 617;
    if (step.starts_with("ResetCred")) return 503;
    return step.find("Sock") != step.npos ? 913 : 502;
  }
  State Look() const {
    State state;
    for (const char* file : {kFileIndexFoldersCfgPath, kFileIndexStatusCfgPath, kUserInfosPath})
      state.files += ReadText(file);
    for (const auto& [queue, config] : world_.monitors) state.files += toString(config);
    for (const std::string share : {"docs", "docsx", "homes", "new"}) {
      const std::string text = ReadText(QueuePath(share));
      state.queues += share + text;
      if (!text.empty()) state.queued.insert(share);
    }
    for (const std::string& call : world_.calls()) state.done += IsStep(call) ? call + "\n" : "";
    return state;
  }
  void Restart(const Row& row) {
    SetUp();
    world_.AddShare({.name = "new", .path = "/tmp/v/new"});
    for (const char* place : {"docs/a", "docs/b", "docsx/b", "homes/al", "new/a", "@fileindex/new"})
      std::filesystem::create_directories(std::string("/tmp/v/") + place);
    WriteText(kUserInfosPath, R"({"al":1})");
    row.before();
    world_.ForgetCalls();
    world_.engine_answers = row.answers;
  }
  // Runs the operation, whose step `at` fails in some way; notes what the steps were, and how all was before each.
  void Run(const Row& row, int code, size_t at = SIZE_MAX, Fault fault = kBroken) {
    Restart(row);
    steps_.clear();
    world_.on_call = [=, this](const std::string& call) {
      if (!IsStep(call)) return;
      steps_.emplace_back(call, Look());
      if (steps_.size() != at + 1) return;
      if (fault == kBroken) throw int{VEXO_ERR_SYSTEM};
      const std::string refusal = R"({"success":false,"error":{"msg":"m","code":)";
      world_.engine_answers.push_front(fault == kCut ? "{" : refusal + (fault == kBusy ? "608}}" : "617}}"));
    };
    int thrown = 0;
    try {
      row.operation();
    } catch (const Error& error) {
      thrown = error.code;
    }
    EXPECT_EQ(thrown, code);
    world_.on_call = nullptr;
    const LockFile free(kFolderLockPath, true);
  }
  void FailEachStep(const Row& row) {
    Run(row, 0);
    const auto healthy = steps_;
    const State end = Look();
    for (size_t at = 0; at < healthy.size(); ++at) {
      const auto& [step, state] = healthy[at];
      for (const Fault fault : {kBroken, kRefused, kCut, kBusy}) {
        if (fault != kBroken && step != "SockConnection::Recv") continue;
        SCOPED_TRACE(row.name + (", step " + std::to_string(at)) + " " + step + ", fault " + std::to_string(fault));
        const int code = CodeOf(step, fault);
        Run(row, code, at, fault);
        const State after = Look();
        EXPECT_EQ(after.files + after.queues, code == 0 ? end.files + end.queues : state.files + state.queues);
        EXPECT_TRUE(fault != kBroken || code == 0 || after.done == state.done) << after.done;
        world_.engine_answers = row.answers;
        if (code != 0) row.mend();
        EXPECT_EQ(Look().files, end.files);
        EXPECT_TRUE(!row.queues_again || Look().queued == end.queued);
      }
    }
  }
  std::vector<std::pair<std::string, State>> steps_;
};

TEST_F(IndexMgrFailureTest, AnOperationStopsAtTheStepThatFailsAndIsMendedByCallingItAgain) {
  const Json::Value added = Records({"/new/a", "/docsx/b"}, true), set = Records({"/docs/a", "/docs/b"}, false);
  const auto again = [=] { FolderMgr().HasFolder("/new/a") ? FolderSet(added, false) : FolderAdd(added, false); };
  const auto flag = [](const char* share) { return [=] { StatusMgr().SetShareStatus(share, 3); }; };
  const Json::Value paths = Vec2JsonArr(std::vector<std::string>{"/docs/a", "/homes/al", "/docsx/"});
  const auto none = [] {};
  const auto volume = [] { VolumePause("/tmp/v"); };
  const auto change = [=] { FolderSet(set, false); };
  const auto remove = [=] { FolderDelete(paths); };
  const std::deque<std::string> missing = {R"({"success":true,"data":{"unavail":["fileindex_docs"]}})",
                                           R"({"success":true,"data":[{"VEXOMDPath":"/tmp/v/docs/f"}]})"};
  const Row rows[] = {{"FolderAdd", [=] { FolderAdd(added, false); }, none, again, false},
                      {"FolderSet", change, none, change, false},
                      {"FolderDelete", remove, none, remove, false},
                      {"FolderDelete of a share", [] { FolderDelete(std::string("docs")); }},
                      {"FolderReindex", [=] { FolderReindex(paths); }, flag("homes")},
                      {"ShareRename", [] { ShareRename("docs", "new"); }},
                      {"ShareMigrate", [] { ShareMigrate("docs", "/x/docs", "/tmp/v/docs"); }},
                      {"ShareCheckRecycle", [] { ShareCheckRecycle("docs"); }},
                      {"SharePause", [] { SharePause("docs"); }},
                      {"ShareResume", [] { ShareResume("docs"); }, [] { SharePause("docs"); }},
                      {"ShareRebuild", [] { ShareRebuild("docs"); }},
                      {"ShareAutoClean", [] { ShareAutoClean("docs"); }, flag("docs")},
                      {"ShareClearPaused", [] { ShareClearPaused("docs", "/tmp/v/docs"); }, flag("docs")},
                      {"VolumePause", volume},
                      {"VolumeResume", [] { VolumeResume("/tmp/v"); }, volume},
                      {"VolumeClean", [] { VolumeClean("/tmp/v"); }, volume},
                      {"UserRename", [] { UserRename("al", "bo"); }},
                      {"UserDelete", [] { UserDelete("al"); }},
                      {"HomeEnable", [] { HomeEnable(true); }, [] { HomeEnable(false); }},
                      {"PrepareServices", PrepareServices},
                      {"UpdateTermSuggestion", UpdateTermSuggestion, none, UpdateTermSuggestion, true, missing}};
  for (const Row& row : rows) FailEachStep(row);
}

}  // namespace quarrox::fileindex
