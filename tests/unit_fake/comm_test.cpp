#include "support/engine_test.h"

namespace quarrox {

using CommTest = support::EngineTest;

// What one exchange throws with this code, the engine answering so; "" where it returns.
static std::string Exchange(const std::string& answer, int code, const std::string& request = "{}") {
  Json::Value res, req;
  EXPECT_TRUE(fromString(req, request));
  support::FakePlatform::Get().engine_answers = {answer};
  return support::ReasonOf(code, [&] { SendRequestImpl(res, req); });
}

TEST_F(CommTest, AnEngineWithoutASocketIsWaitedForHalfAMinuteAndTheReasonIsTheConnections) {
  std::filesystem::remove(kElasticdSocketPath);
  world_.Fail("DomainSockConnection::Connect", VEXO_ERR_SYSTEM, ECONNREFUSED);
  EXPECT_EQ(Exchange("", 913), "Connect failed");
  EXPECT_EQ(support::Sleeps(), std::vector<useconds_t>(31, 1000000));
  EXPECT_TRUE(log_.texts().at(30).ends_with(" elastic socket is not ready, retry ... 31"));
  EXPECT_TRUE(log_.texts().at(31).ends_with(", reason: Connect failed [err: Connection refused]"));
}

TEST_F(CommTest, WhatIsNoResponseIsAFailureOfTheChannelAndARefusalBearsTheEnginesCode) {
  EXPECT_EQ(Exchange("[1]", 913), "Recv failed, res=[1]");
  EXPECT_EQ(Exchange(R"({"success":"true"})", 913), R"(Recv failed, res={"success":"true"})");
  EXPECT_EQ(Exchange(R"({"success":false,"error":{"code":617,"msg":"disk"}})", 617), "Request failed, msg=disk");
  EXPECT_TRUE(Exchange(R"({"success":false,"error":{"msg":"m"}})", 120).starts_with("Missing property: code"));
}

TEST_F(CommTest, OfACompoundRequestTheFailedItemsAreLoggedAndOnlyABusyEngineFailsTheWhole) {
  const std::string items = R"("data":[{"success":true},{"success":false,"error":{"code":614,"msg":"none"}})";
  const std::string busy = items + R"(,{"success":false,"error":{"code":1400,"msg":"full"}}]})";
  const std::string failed = R"({"success":true,"has_fail":true,)", request = R"({"compound":[1,2]})";
  EXPECT_EQ(Exchange(failed + items + "]}", 0, request) + Exchange(failed + busy, 1400, request), "full");
  EXPECT_EQ(Exchange(R"({"success":true,)" + busy, 0, request), "");
  EXPECT_EQ(log_.texts().size(), 2U);
  EXPECT_TRUE(log_.texts().at(0).ends_with(" (SendRequestImpl) Compound failed: 2 (614) none"));
}

}  // namespace quarrox
