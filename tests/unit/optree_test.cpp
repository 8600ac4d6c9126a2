#include "fileindex/optree.h"

#include <cerrno>
#include <memory>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "common/log.h"
#include "support/errors.h"
#include "support/reference_fold.h"
#include "support/syslog_capture.h"

namespace quarrox::fileindex {
namespace {

using support::ReasonOf;
using support::SyslogCapture;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;

std::string Line(uint32_t event, const std::string& path, const std::string& more = "") {
  return "{\"event\":" + std::to_string(event) + ",\"path\":\"" + path + "\"" + more + "}\n";
}

std::vector<std::string> Fold(const std::string& queue) {
  return support::Fold(queue).operations;
}

TEST(Event, SaysWhatIsWrongWithItsLine) {
  const SyslogCapture log;
  errno = 0;
  EXPECT_EQ(ReasonOf(kErrMalformedEvent, [] { Event("{"); }), "Malformed event_raw: {");
  EXPECT_THAT(log.texts(),
              ElementsAre(EndsWith("(Event) Failed [!data.fromString(event_raw)], reason: Malformed event_raw: {")));
}

TEST(OP, MergedDataOnlyEverWidens) {
  const Event older(Line(0, "/", R"(,"data":{"document":true,"audio":false,"photo":"yes","x":1})"));
  const Event newer(Line(0, "/", R"(,"data":{"document":false,"audio":true,"video":"yes","y":1})"));
  OP op(nullptr, kOpUpdateDirectory, "", older.data);
  op.MergeData(newer.data);
  op.MergeData(Json::Value("text"));
  EXPECT_EQ(toString(op.data), R"({"audio":true,"basic":false,"document":true,"photo":false,"video":false,"x":1})");
}

// What is left, for each kind that was pending; each cell of the table in optree.h.
TEST(OPTree, MeetsAPendingOperationByTheTable) {
  const std::vector<std::pair<std::string, const char*>> rows{
      {Line(0x40, "/p"), "2 2 2 4 52 6 "},
      {Line(0x02, "/p"), "1 2 2 4 52 6 "},
      {Line(0x04, "/p"), "1 2 3 4 53 6 "},
      {Line(0x80, "/p"), "1 1 1 41 51 61 "},
      {Line(0x20000, "/p"), "1 4 4 4 54 6 "},
      {Line(0x10000, "/p"), "1 6 6 6 56 6 "},
      {Line(0x80, "/p", R"(,"is_dir":true)"), "1 6 6 6 56 6 "},
  };
  for (const auto& [line, expected] : rows) {
    std::string kinds;
    for (const uint32_t pending : {0x80U, 0x40U, 0x04U, 0x20000U, 0x100U, 0x10000U}) {
      for (const std::string& text : Fold(Line(pending, "/p", R"(,"path_old":"/o")") + line)) kinds += text[2];
      kinds += " ";
    }
    EXPECT_EQ(kinds, expected) << line;
  }
}

TEST(OPTree, ARenameTakesWorkAlongAndLeavesDeletesBelow) {
  EXPECT_THAT(Fold(Line(0x40, "/a") + Line(0x80, "/b") + Line(0x04, "/a/x") + Line(0x80, "/a/y") + Line(0x04, "/ab") +
                   Line(0x100, "/b/", R"(,"path_old":"//a","data":{"x":"ä"})")),
              ElementsAre("[03] /b/x, data=null", "[01] /a/y, data=null", "[03] /ab, data=null",
                          "[05] //a -> /b, data={\"x\":\"ä\"}", "[02] /b, data={\"x\":\"ä\"}"));

  // Where two lists meet and the longer one is there already, the other keeps its order behind it.
  std::string queue = Line(0x04, "/1/x") + Line(0x40, "/2/x");
  for (const std::string from : {"/1", "/p", "/q", "/r", "/2"}) {
    queue += Line(0x100, from == "/1" ? "/2" : from == "/2" ? "/3" : "/3/x", R"(,"path_old":")" + from + "\"");
  }
  EXPECT_THAT(Fold(queue + Line(0x100, "/y", R"(,"path_old":"/3/x")")), Contains("[03] /y, data=null"));
}

TEST(OPTree, ADamagedQueueYieldsOneOperationForTheShare) {
  const SyslogCapture log;
  EXPECT_THAT(Fold(Line(4, "/a") + Line(0x204, "nowhere") + Line(4, "/b")), ElementsAre("[07] , data=null"));
  EXPECT_THAT(log.texts(), Contains(HasSubstr(" Queue crashed: /proc/self/fd/")));
}

TEST(OPTree, ReadsLinesAsTheyStandInTheFile) {
  const int level = std::exchange(log_level, kLogVerbose);
  const SyslogCapture log;
  EXPECT_THAT(Fold("{\"event\":4,\"path\":\"/crlf\"}\r\n" + Line(4, "/\xff\xfe") +
                   Line(4, "/\\u00e4\\ud83d\\ude00\\n") + R"({"event":4,"path":"/no newline"})"),
              ElementsAre("[03] /crlf, data=null", "[03] /\xff\xfe, data=null", "[03] /ä\xf0\x9f\x98\x80\n, data=null",
                          "[03] /no newline, data=null"));
  log_level = level;
  ASSERT_EQ(log.lines().size(), 4U);  // each event, no failure
  EXPECT_THAT(log.texts().back(), EndsWith(R"( Got event: {"event":4,"path":"/no newline"})"));
}

TEST(OPTree, TakesMembersInAnyOrderTheLastOfDoubledOnesAndOptionalOnesOfTheirTypeOnly) {
  EXPECT_THAT(Fold(R"({"data":{"x":[1]},"path_old":"/o","path":"/dropped","event":4294705408,"path":"/p"})"),
              ElementsAre(R"([05] /o -> /p, data={"x":[1]})"));
  EXPECT_THAT(Fold(Line(0x80, "/p", R"(,"is_dir":"yes")") + Line(0x100, "/r", R"(,"path_old":7)")),
              ElementsAre("[01] /p, data=null", "[06] /r, data=null"));
}

// A damaged line between two good ones costs itself only.
TEST(OPTree, SkipsABadLineAndSaysWhich) {
  std::string components;
  for (int i = 0; i < 200'000; ++i) components += "/a";
  const std::string path = R"({"event":4,"path":)";
  const std::vector<std::pair<std::string, const char*>> cases{
      {"no JSON", "(BuildTree) InsertEvent failed, event_raw=no JSON, code=906, reason=Malformed event_raw: no JSON"},
      {"", "code=906"},
      {"[4]", "code=120, reason=Not an object, data=[4]"},
      {R"({"event":-1,"path":"/"})", R"(code=120, reason=Not a string, data={"event":-1,"path":"/"})"},
      {R"({"event":4})", R"(code=120, reason=Missing property: path, data={"event":4})"},
      {path + R"("/a","path":7})", "code=120, reason=Not a string"},
      {path + R"("a"})", "code=9999, reason=GetNodeByPath failed, path=a"},
      {path + R"(""})", "code=9999, reason=GetNodeByPath failed, path="},
      {path + R"("/\u0000"})", "code=9999"},
      {path + R"("/\ud800"})", "code=906"},
      {path + R"("/torn)", "code=906"},
      {std::string("\0\x01{\0", 4), "code=906"},
      {path + R"("/a","data":)" + std::string(100'000, '['), "code=906"},
      {path + "\"" + components + "\"}", "code=9999"},
      {path + R"("/a","data":")" + std::string(64 << 20, 'x') + "\"}", "code=906, reason=Line too long"},
  };
  for (const auto& [line, reason] : cases) {
    const SyslogCapture log;
    const support::Folded folded = support::Fold(Line(4, "/before") + line + "\n" + Line(4, "/after"));
    EXPECT_EQ(folded, (support::Folded{{"[03] /before, data=null", "[03] /after, data=null"}, 2, 3, 1})) << reason;
    EXPECT_THAT(log.texts(), Contains(HasSubstr(reason)));
  }
}

TEST(OPTree, CannotBeBuiltFromWhatIsNoFile) {
  const SyslogCapture log;
  const auto reason = [](const std::string& path) { return ReasonOf(kErrSystem, [&] { OPTree(path).BuildTree(); }); };
  EXPECT_EQ(reason("/missing"), "Failed to open queue, reason=No such file or directory");
  EXPECT_EQ(reason("/"), "Failed to open queue, reason=Is a directory");
  EXPECT_THAT(log.texts(), Contains(HasSubstr("(BuildTree) Failed [!input_stream], reason: Failed to open queue")));
}

TEST(OPTree, KeepsTheNodeOfAKeptOperationAsLongAsItLives) {
  std::shared_ptr<OP> kept;
  std::ostringstream printed;
  {
    OPTree tree("");
    tree.InsertEvent(std::make_shared<Event>(Line(4, "/a/b")));
    EXPECT_EQ(tree.ProcessOP([&](const std::shared_ptr<OP>& op) { kept = op; }), 1U);
    const std::shared_ptr<OPNode> node = kept->node.lock();
    EXPECT_EQ(node, tree.GetNodeByPath("//a//b/"));
    EXPECT_EQ(node->GetParent()->GetChild("b"), node);
    EXPECT_EQ(node->GetParent()->GetParent(), tree.root());
    EXPECT_EQ(tree.root()->GetParent(), nullptr);
    const auto print = [&](const std::shared_ptr<OPNode>& below) { printed << *below << "; "; };
    tree.TraverseNodeDescendant(tree.root(), print, true);
    tree.TraverseNodeDescendant(tree.root(), print, false);
    EXPECT_EQ(printed.str(), "Node[/a]: ; Node[/a/b]: [03] /a/b, data=null; Node[/a]: ; ");
  }
  EXPECT_THROW(printed << *kept, std::bad_weak_ptr);
}

}  // namespace
}  // namespace quarrox::fileindex
