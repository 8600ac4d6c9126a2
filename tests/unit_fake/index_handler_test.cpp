#include "fileindexd/index_handler.h"

#include <numeric>
#include <regex>

#include "fileindex/status_mgr.h"
#include "support/engine_test.h"

namespace quarrox::fileindexd {

namespace fs = std::filesystem;
using namespace fileindex;

static const std::string kNoIndex = R"({"success":false,"error":{"code":609,"msg":"m"}})";

static std::string Found(const std::string& hits) {
  return R"({"success":true,"data":[)" + hits.substr(!hits.empty()) + "]}";
}

struct IndexHandlerTest : support::EngineTest {
  void SetUp() override {
    EngineTest::SetUp();
    if (IsSkipped()) return;
    const std::string beside = docs_ + "../@fileindex/docs";
    for (const std::string& place : {std::string("/var/packages"), beside, docs_}) fs::remove_all(place);
    for (const std::string& place : {docs_ + "in/sub", beside}) fs::create_directories(place);
    for (const char* name : {"in", "in/sub", "in/a.txt", "in/b.txt", "in/c.jpg", "out.txt"}) {
      if (!fs::exists(docs_ + name)) std::ofstream(docs_ + name) << name;
      world_.documents[docs_ + name]["VEXOMDFSName"] = name;
    }
    fs::create_symlink("a.txt", docs_ + "in/link");
    world_.AddShare({.name = "docs", .path = docs_.substr(0, docs_.size() - 1)});
    FolderMgr folders;
    std::shared_ptr<Folder> diff, in(new Folder("/docs/in", "n", "", "", true, true, true, false, true, false));
    folders.Upsert(diff, in);
    folders.Save();
  }
  // What the index has of a file where it agrees with the disk, but for what is added.
  std::string Hit(const std::string& name, int size = 0, int attributes_changed = 0) {
    const struct stat info = LookAt(docs_ + name).info;
    const auto number = [](const char* name, int64_t value) { return name + std::to_string(value); };
    return R"(,{"VEXOMDPath":")" + docs_ + name + number(R"(","VEXOMDIsDir":)", S_ISDIR(info.st_mode)) +
           number(R"(,"VEXOMDFSSize":)", info.st_size + size) +
           number(R"(,"VEXOMDFSContentChangeDate":)", info.st_mtim.tv_sec) +
           number(R"(,"VEXOMDAttributeChangeDate":)", info.st_ctim.tv_sec + attributes_changed) + "}";
  }
  // The commands since the last look, sorted: "upsert in/a.txt, ".
  std::string Sent() {
    const std::regex word(R"re("command":"(?:\w+?_)?([a-z]+)|"(?:doc_id|VEXOMDPath)":"(?:[^"]*/docs/)?([^"]*))re");
    std::vector<std::string> all;
    for (const std::string& text : std::exchange(world_.engine_requests, {})) {
      for (std::sregex_iterator i(text.begin(), text.end(), word), end; i != end; ++i)
        (*i)[1].matched ? all.push_back(i->str(1)) : void(all.back() += " " + i->str(2));
    }
    std::sort(all.begin(), all.end());
    return std::accumulate(all.begin(), all.end(), std::string(), [](auto a, auto& b) { return a + b + ", "; });
  }
  // What an operation sends where the engine answers these first.
  std::string Handle(FileIndexOP op, std::string name, std::deque<std::string> answers = {}, Json::Value data = {}) {
    world_.engine_answers = answers;
    handler_.Handle({tree_.GetNodeByPath(docs_ + name), op, docs_ + "in/old", data});
    return Sent();
  }
  const std::string docs_ = support::PrivateMachine().scratch() + "/v/docs/";
  OPTree tree_{""};
  IndexHandler handler_{"docs"};
  const OperationHandler::CheckPoint go_on_ = [] { return false; };
};

TEST_F(IndexHandlerTest, WhatIsOnTheDiskDecidesWhateverAnOperationSays) {
  const std::string gone = "del in/gone, del in/gone/, ", a = "upsert in/a.txt, ";
  const std::string known = Hit("in") + Hit("in/sub") + Hit("in/b.txt", 0, 1) + Hit("in/c.jpg");
  const std::string strange = Hit("in/gone/x") + Hit("in/link") + Hit("out.txt"), some = Found(",{}");
  const std::deque<std::string> in = {Found(""), Found(known + Hit("in/a.txt", 1) + Hit("in/b.txt"))};
  const std::deque<std::string> sub = {some, some, some, some, some, Found(""), Found(Hit("in/sub")), Found("")};
  const std::string moved =
      "del in/sub, del in/sub/, get in/old, get in/old, get in/old/, get in/sub, get in/sub/, set in/sub in/old, ";
  const Json::Value photo = Folder("/docs", "n", "", "", false, false, false, true, false, false).GetIndexCfg();
  const std::vector<std::tuple<std::string, FileIndexOP, std::string, std::deque<std::string>>> cases = {
      {a, kOpCreate, "in/a.txt", {}},
      {a, kOpDelete, "in/a.txt", {}},
      {gone, kOpCreate, "in/gone", {}},
      {"get in/a.txt, " + a, kOpAttr, "in/a.txt", {Found("")}},
      {"get in/a.txt, set in/a.txt, ", kOpAttr, "in/a.txt", {Found(",{}"), Found(",{}")}},
      {"del in/link, del in/link/, ", kOpCreate, "in/link", {}},
      {"del in/gone/x, del in/link, del out.txt, get /, get in/b.txt, set in/b.txt, " + a,
       kOpQueueCrashed,
       "",
       {Found(known + strange), some, some}},
      {"get in, get in/, upsert in/a.txt, upsert in/c.jpg, ", kOpUpdateDirectory, "in", in},
      {"del in/old, del in/old/, " + moved, kOpRename, "in/sub", sub}};
  for (const auto& [expected, op, name, answers] : cases) {
    handler_.Begin(go_on_);
    EXPECT_EQ(Handle(op, name, answers, photo), expected) << op << name;
  }
}

TEST_F(IndexHandlerTest, WhatTheEngineRefusesForGoodIsTriedAgainOnlyWhenItChangesOrAReindexAsks) {
  const std::string refused = R"({"success":false,"error":{"code":612,"msg":"m"}})", a = "upsert in/a.txt, ";
  const std::deque<std::string> both = {refused, refused}, known = {Found(Hit("in")), Found(Hit("in/a.txt"))};
  handler_.Begin(go_on_);
  EXPECT_EQ(Handle(kOpCreate, "in/a.txt", both), a + a);  // the second without the contents
  EXPECT_EQ(Handle(kOpCreate, "in/a.txt"), "");
  handler_.Begin(go_on_);  // nothing was committed
  EXPECT_EQ(Handle(kOpCreate, "in/a.txt", {refused}), a + a);
  handler_.Commit();
  Sent();
  handler_.Begin(go_on_);
  EXPECT_EQ(Handle(kOpCreate, "in/a.txt"), a);  // the index may have lost it
  EXPECT_NE(Handle(kOpReindex, "in", known).find(a), std::string::npos);
  handler_.Begin(go_on_);
  Handle(kOpCreate, "in/a.txt", both);
  std::ofstream(docs_ + "in/a.txt") << "other";
  EXPECT_EQ(Handle(kOpCreate, "in/a.txt", both), a + a);
}

TEST_F(IndexHandlerTest, AFolderListThatChangedIsFollowedWithoutAnyEvent) {
  support::SetTime(time(nullptr) + 3600);  // or else the files count as changed lately
  handler_.Begin(go_on_);
  handler_.Commit();
  FolderMgr folders;
  std::shared_ptr<Folder> diff, in(new Folder("/docs/in", "n", "", "", true, true, true, true, true, false));
  folders.Upsert(diff, in);
  folders.Save();
  IndexHandler next("docs");
  EXPECT_TRUE(next.HasWork());
  Sent();
  world_.engine_answers = {Found(""), Found(Hit("in/a.txt") + Hit("in/b.txt") + Hit("in/c.jpg") + Hit("in/sub"))};
  next.Begin(go_on_);
  next.Commit();
  EXPECT_EQ(Sent(), "commit, get in, get in/, upsert in, upsert in/c.jpg, ");
  EXPECT_FALSE(next.HasWork());
}

TEST_F(IndexHandlerTest, WhatIsPausedStaysAsItIsAndIsComparedAfterwardsNotTrustingTimesSinceThen) {
  const auto set = [](const std::string& path, bool photo, bool paused) {
    FolderMgr folders;
    std::shared_ptr<Folder> diff, folder(new Folder(path, "n", "", "", true, true, true, photo, true, paused));
    folders.Upsert(diff, folder);
    folders.Save();
  };
  const std::string all = Hit("in") + Hit("in/a.txt") + Hit("in/b.txt") + Hit("in/c.jpg"), sub = Hit("in/sub");
  const std::string changed = "upsert in, upsert in/a.txt, upsert in/b.txt, upsert in/c.jpg, ";
  set("/docs/in/sub", false, false);
  for (const int64_t later : {0, 3600}) {  // when the files count as changed since they were seen, and when not
    support::SetTime(time(nullptr) + later);
    IndexHandler handler("docs");
    const auto pass = [&](const std::deque<std::string>& answers) {
      world_.engine_answers = answers;
      handler.Begin(go_on_);
      handler.Commit();
      return Sent();
    };
    pass({Found(""), Found("")});
    set("/docs/in", false, true);
    EXPECT_TRUE(handler.HasWork());
    EXPECT_EQ(pass({}), "commit, ");
    set("/docs/in", true, true);  // which is for afterwards
    EXPECT_FALSE(handler.HasWork());
    handler.Begin(go_on_);
    const auto handle = [&](FileIndexOP op, const std::string& name, const std::deque<std::string>& answers) {
      world_.engine_answers = answers;
      handler.Handle({tree_.GetNodeByPath(docs_ + name), op, docs_ + "in/old", {}});
      return Sent();
    };
    for (const auto op : {kOpCreate, kOpDelete, kOpAttr, kOpRename}) EXPECT_EQ(handle(op, "in/gone", {}), "");
    EXPECT_EQ(handle(kOpQueueCrashed, "", {Found(all + Hit("in/x") + Hit("in/sub/x"))}),
              "del in/sub/x, get /, upsert in/sub, ");
    handler.Begin(go_on_);
    EXPECT_EQ(handle(kOpReindex, "in", {Found(""), Found("")}), "get in/sub, get in/sub/, upsert in/sub, ");
    set("/docs/in", true, false);
    support::SetTime(time(nullptr) + 100);
    EXPECT_TRUE(IndexHandler("docs").HasWork());
    EXPECT_EQ(pass({Found(""), Found(all + sub)}),
              "commit, get in, get in/, " + (later == 0 ? changed : "upsert in/c.jpg, "));
    EXPECT_FALSE(handler.HasWork());
    handler.Begin([&] { return set("/docs/in", false, true), true; });
    world_.engine_answers = {Found("")};
    EXPECT_THROW(handler.Handle({tree_.GetNodeByPath(docs_), kOpQueueCrashed, "", {}}), StartAnew);
    set("/docs/in", false, false);
  }
}

TEST_F(IndexHandlerTest, AShareWhoseDiskGoesAwayKeepsItsIndexAndASignalEndsAWalk) {
  int calls = 0;
  handler_.Begin([&]() -> bool {
    if (++calls == 3) fs::rename(docs_, support::PrivateMachine().scratch() + "/away");
    return calls > 8 ? throw calls : false;
  });
  EXPECT_NE(support::ReasonOf(502, [&] { Handle(kOpQueueCrashed, "", {Found(Hit("in") + Hit("in/a.txt"))}); }), "");
  EXPECT_EQ(Sent(), "get /, ");
  fs::rename(support::PrivateMachine().scratch() + "/away", docs_);
  EXPECT_THROW(Handle(kOpQueueCrashed, "", {Found("")}), int);
}

TEST_F(IndexHandlerTest, AMissingIndexIsMadeOnceAPassAndOnlyTheEngineThatCommitsMayForgetTheQueue) {
  handler_.Begin(go_on_);
  EXPECT_TRUE(
      Handle(kOpCreate, "in/gone", {kNoIndex, Found(""), Found("")}).starts_with("create, del in/gone, get /, "));
  EXPECT_EQ(Handle(kOpCreate, "in/a.txt"), "");  // it has just been indexed
  EXPECT_NE(support::ReasonOf(609, [&] { Handle(kOpDelete, "in/gone", {kNoIndex}); }), "");
  for (const bool is_another : {true, false}) {
    world_.engine_answers = {Found("")};
    handler_.Begin(go_on_);
    EXPECT_EQ(StatusMgr().GetShareStatus("docs"), 3);
    if (is_another) fs::last_write_time(kElasticdSocketPath, fs::file_time_type::min());
    EXPECT_EQ(support::ReasonOf(913, [&] { handler_.Commit(); }).empty(), !is_another);
  }
  EXPECT_FALSE(handler_.HasWork());
}

}  // namespace quarrox::fileindexd
