#include "fileindex/elastic_control.h"

#include "fileindex/status_mgr.h"
#include "support/engine_test.h"

namespace quarrox::fileindex::elastic {

using ElasticControlTest = support::EngineTest;

static std::string Refusal(int code) {
  return R"({"success":false,"error":{"code":)" + std::to_string(code) + R"(,"msg":"m"}})";
}

static std::string Found(int count, std::string hits = "") {
  const char hit[] = R"({"VEXOMDPath":"/v/s/old/d/f","VEXOMDFSName":"f","VEXOMDParent":"/v/s/old/d"})";
  while (count-- > 0) hits += hit + std::string(count > 0 ? "," : "");
  return R"({"success":true,"data":[)" + hits + "]}";
}

static Json::Value Sent(size_t index) {
  Json::Value request;
  EXPECT_TRUE(fromString(request, support::FakePlatform::Get().engine_requests.at(index)));
  return request;
}

TEST_F(ElasticControlTest, AnEngineThatIsNotReadyIsAskedAgainAndALastingShortageIsToldOnce) {
  for (int code : {607, 608, 610, 1400, 1401, 1400, 1401, 1400, 1401, 1400, 1401, 1400, 1401, 609})
    world_.engine_answers.push_back(Refusal(code));
  EXPECT_EQ(support::ReasonOf(609, [] { ShareIndexPause("s"); }), "Request failed, msg=m");
  for (int i = 0; i < 12; ++i) world_.engine_answers.push_back(Refusal(1400 + i % 2));
  ShareIndexRename("a", "b", "/db");
  EXPECT_EQ(world_.CountCalls("VLIBCExecl"), 1U);  // after ten busy answers not yet
  EXPECT_EQ(support::Sleeps().at(2) + support::Sleeps().at(4), 30000000U + 1140000000U);  // rand() was 9
  EXPECT_TRUE(log_.texts()[13].ends_with("[0] since vexoelasticd is busy. Command: index_config_set, db: fileindex_a"));
  EXPECT_EQ(toString(Sent(26)["data"]["data"]), R"({"id":"fileindex_b","path":"/db"})");
}

TEST_F(ElasticControlTest, ADocumentIsSentWithItsRawBytesAndOnlyAKnownOneIsRefreshed) {
  world_.documents["/v/s/\xff"]["VEXOMDFSName"] = "\xff";
  world_.engine_answers = {Found(0), Found(1)};
  EXPECT_THROW(IndexAttr("s", "/v/s/\xff"), Error);
  IndexAttr("s", "/v/s/\xff");
  EXPECT_EQ(Sent(2)["data"]["data"]["VEXOMDSearchFileName"], "\xff");
  EXPECT_EQ(world_.calls().at(6), "ParseFile(/v/s/\xff, false)");
  EXPECT_EQ(support::ReasonOf(914, [] { IndexUpsert("s", "/gone", true); }), "Parse failed, path=/gone");
  EXPECT_EQ(support::ReasonOf(916, [] { IsDocumentExists("s", "/v/s"); }), R"({"success":true})");
}

TEST_F(ElasticControlTest, ARenameMovesWhatIsBelowPageByPageAndAFailedCommitWithoutRoomFlagsTheShare) {
  std::filesystem::remove_all("/var/packages");
  world_.AddShare({.name = "s", .path = "/v/s"});
  world_.engine_answers = {Found(1), Found(0), Found(10000), Found(0), Found(0), Found(3), Found(0)};
  IndexRename("s", "/v/s/a/New.TXT", "/v/s/old");
  EXPECT_EQ(Sent(2)["data"]["query"]["qsl"]["prefix"]["VEXOMDPath"], "/v/s/old/");
  EXPECT_EQ(Sent(2), Sent(5));
  EXPECT_EQ(Sent(3)["compound"].size() + Sent(6)["compound"].size(), 10003U);
  EXPECT_EQ(Sent(6)["compound"][2]["data"]["data"]["VEXOMDPath"], "/v/s/a/New.TXT/d/f");
  world_.engine_answers = {Found(1), Found(0), Found(10000), Found(0), Refusal(617), Refusal(617)};
  EXPECT_EQ(support::ReasonOf(617, [] { IndexRename("s", "/v/s/b", "/v/s/old"); }), "Request failed, msg=m");
  world_.SetRoom("/v", VEXO_ERR_VOLUME_FULL);
  EXPECT_EQ(support::ReasonOf(1003, [] { IndexCommit("s"); }), "Share (s) space not enough");
  EXPECT_EQ(StatusMgr().GetShareStatus("s"), 1);
}

}  // namespace quarrox::fileindex::elastic
