#include "fileindex/optree.h"

#include <array>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "support/syslog_capture.h"
#include "support/temp_dir.h"

namespace quarrox::fileindex {
namespace {

using support::SyslogCapture;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;

using Texts = std::vector<std::string>;

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

std::string Print(const OP& op) {
  std::ostringstream stream;
  stream << op;
  return stream.str();
}

Texts HandedOut(OPTree& tree) {
  Texts texts;
  tree.ProcessOP([&](const std::shared_ptr<OP>& op) { texts.push_back(Print(*op)); });
  return texts;
}

std::string Line(uint32_t event, const std::string& path, const std::string& more = "") {
  return "{\"event\":" + std::to_string(event) + ",\"path\":\"" + path + "\"" + more + "}";
}

Texts Fold(const Texts& lines) {
  OPTree tree("");
  for (const std::string& line : lines) tree.InsertEvent(std::make_shared<Event>(line));
  return HandedOut(tree);
}

// A tree built from a queue file with this text.
struct Built {
  explicit Built(const std::string& text) : tree(directory / "queue") {
    support::WriteText(directory / "queue", text);
    tree.BuildTree();
  }
  support::TempDir directory;
  SyslogCapture log;
  OPTree tree;
};

// A damaged line between two good ones costs itself only.
void ExpectSkipped(const std::string& line, const std::string& reason) {
  Built built(Line(4, "/before") + "\n" + line + "\n" + Line(4, "/after"));
  EXPECT_THAT(HandedOut(built.tree), ElementsAre("[03] /before, data=null", "[03] /after, data=null")) << reason;
  EXPECT_EQ(built.tree.counts().lines, 3U);
  EXPECT_EQ(built.tree.counts().bad_lines, 1U);
  ASSERT_FALSE(built.log.lines().empty());
  EXPECT_THAT(built.log.texts().back(), HasSubstr("(BuildTree) InsertEvent failed, event_raw=" + line.substr(0, 99)));
  EXPECT_THAT(built.log.texts().back(), HasSubstr(reason));
}

Error ErrorOf(const std::string& line) {
  try {
    const Event event(line);
  } catch (const Error& error) {
    return error;
  }
  ADD_FAILURE() << line;
  return Error(kErrInternal);
}

TEST(Event, HasEveryMemberOfItsLineInWhateverOrder) {
  const Event event(
      R"({"data":{"x":[1]},"path_old":"/o","is_dir":true,"path":"/dropped","event":4294967295,"path":"/p"})");
  EXPECT_EQ(event.event, 0xffffffffU);
  EXPECT_TRUE(event.is_dir);
  EXPECT_EQ(event.path, "/p");
  EXPECT_EQ(event.path_old, "/o");
  EXPECT_EQ(event.data, Parse(R"({"x":[1]})"));

  const Event bare(R"({"event":4,"path":"/p","is_dir":"yes","path_old":7})");
  EXPECT_FALSE(bare.is_dir);
  EXPECT_EQ(bare.path_old, "");
  EXPECT_TRUE(bare.data.isNull());
}

TEST(Event, SaysWhatIsWrongWithItsLine) {
  SyslogCapture log;
  const Error malformed = ErrorOf("{");
  EXPECT_EQ(malformed.code, kErrMalformedEvent);
  EXPECT_EQ(malformed.reason, "Malformed event_raw: {");
  EXPECT_THAT(log.texts(),
              ElementsAre(EndsWith("(Event) Failed [!data.fromString(event_raw)], reason: Malformed event_raw: {")));
  EXPECT_EQ(ErrorOf(R"({"event":4})").reason, R"(Missing property: path, data={"event":4})");
  EXPECT_EQ(ErrorOf(R"({"event":-1,"path":"/"})").reason, R"(Not a string, data={"event":-1,"path":"/"})");
  EXPECT_EQ(ErrorOf("[]").reason, "Not an object, data=[]");
  EXPECT_EQ(ErrorOf("[]").code, kErrBadParameter);
}

TEST(OP, MergedDataOnlyEverWidens) {
  OP op(nullptr, kOpUpdateDirectory, "", Parse(R"({"document":true,"audio":false,"photo":"yes","x":1})"));
  op.MergeData(Parse(R"({"document":false,"audio":true,"video":"yes","y":1})"));
  const std::string merged = R"({"audio":true,"basic":false,"document":true,"photo":false,"video":false,"x":1})";
  EXPECT_EQ(toString(op.data), merged);
  op.MergeData(Json::Value("text"));
  EXPECT_EQ(toString(op.data), merged);
  op.data = Json::Value(Json::arrayValue);
  op.MergeData(Parse(R"({"basic":true})"));
  EXPECT_EQ(toString(op.data), R"({"audio":false,"basic":true,"document":false,"photo":false,"video":false})");
}

TEST(OP, IsPrintedWithItsNodesPathAndFailsWithoutTheNode) {
  EXPECT_THAT(Fold({Line(0x100, "/volume1/a/y", R"(,"path_old":"/volume1/a/x","data":{"x":"ä"})")}),
              ElementsAre("[05] /volume1/a/x -> /volume1/a/y, data={\"x\":\"ä\"}"));
  EXPECT_THROW(Print(OP(nullptr, kOpDelete, "", Json::Value())), std::bad_weak_ptr);
}

// What is pending on a path, by its kind; each cell of the table in optree.h.
TEST(OPTree, MeetsAPendingOperationByTheTable) {
  struct Row {
    const char* name;
    std::string line;
    std::array<const char*, 6> kinds;  // what is left, for each kind that was pending
  };
  const std::array<std::string, 6> pending{Line(0x80, "/p"),
                                           Line(0x40, "/p"),
                                           Line(0x04, "/p"),
                                           Line(0x20000, "/p"),
                                           Line(0x100, "/p", R"(,"path_old":"/o")"),
                                           Line(0x10000, "/p")};
  const std::array<Row, 7> rows{{
      {"create", Line(0x40, "/p"), {"2", "2", "2", "4", "52", "6"}},
      {"modify", Line(0x02, "/p"), {"1", "2", "2", "4", "52", "6"}},
      {"attr", Line(0x04, "/p"), {"1", "2", "3", "4", "53", "6"}},
      {"delete", Line(0x80, "/p"), {"1", "1", "1", "41", "51", "61"}},
      {"update", Line(0x20000, "/p"), {"1", "4", "4", "4", "54", "6"}},
      {"reindex", Line(0x10000, "/p"), {"1", "6", "6", "6", "56", "6"}},
      {"directory", Line(0x80, "/p", R"(,"is_dir":true)"), {"1", "6", "6", "6", "56", "6"}},
  }};
  for (const Row& row : rows) {
    for (size_t i = 0; i < pending.size(); ++i) {
      std::string kinds;
      for (const std::string& text : Fold({pending[i], row.line})) kinds += text[2];
      EXPECT_EQ(kinds, row.kinds[i]) << row.name << " after kind " << i + 1;
    }
  }
}

TEST(OPTree, AnUpdateOfADirectoryTakesOrWidensData) {
  const std::string photo = Line(0x20000, "/p", R"(,"data":{"photo":true})");
  EXPECT_THAT(Fold({Line(4, "/p", R"(,"data":{"x":1})"), photo}), ElementsAre("[04] /p, data={\"photo\":true}"));
  EXPECT_THAT(
      Fold({Line(0x20000, "/p", R"(,"data":{"audio":true,"x":1})"), photo}),
      ElementsAre(HasSubstr(R"({"audio":true,"basic":false,"document":false,"photo":true,"video":false,"x":1})")));
}

TEST(OPTree, ARenameTakesWorkAlongAndLeavesDeletesBelow) {
  EXPECT_THAT(Fold({Line(0x40, "/a"), Line(0x80, "/b"), Line(0x04, "/a/x"), Line(0x80, "/a/y"), Line(0x04, "/ab"),
                    Line(0x100, "/b/", R"(,"path_old":"//a","data":1)")}),
              ElementsAre("[03] /b/x, data=null", "[01] /a/y, data=null", "[03] /ab, data=null",
                          "[05] //a -> /b, data=1", "[02] /b, data=1"));
  EXPECT_THAT(Fold({Line(0x04, "/b/x"), Line(0x100, "/b", R"(,"path_old":"a")")}), ElementsAre("[06] /b, data=null"));
}

TEST(OPTree, ADamagedQueueYieldsOneOperationForTheShare) {
  Built built(Line(4, "/a") + "\n" + Line(0x204, "nowhere") + "\n" + Line(4, "/b"));
  EXPECT_TRUE(built.tree.queue_crashed());
  EXPECT_THAT(HandedOut(built.tree), ElementsAre("[07] , data=null"));
  EXPECT_THAT(built.log.texts().back(), EndsWith(" Queue crashed: " + built.directory / "queue"));
  EXPECT_EQ(built.tree.ProcessOP([](const std::shared_ptr<OP>&) {}), 1U);
}

TEST(OPTree, ReadsLinesAsTheyStandInTheFile) {
  Built empty("");
  EXPECT_EQ(empty.tree.ProcessOP([](const std::shared_ptr<OP>&) { FAIL(); }), 0U);
  Built built(Line(4, "/crlf") + "\r\n" + Line(4, "/\xff\xfe") + "\n" + Line(4, "/\\u00e4\\ud83d\\ude00\\n") + "\n" +
              Line(4, "/no newline"));
  EXPECT_THAT(HandedOut(built.tree),
              ElementsAre("[03] /crlf, data=null", "[03] /\xff\xfe, data=null", "[03] /ä\xf0\x9f\x98\x80\n, data=null",
                          "[03] /no newline, data=null"));
  EXPECT_EQ(built.tree.counts().bad_lines, 0U);
}

TEST(OPTree, SkipsABadLineAndSaysWhich) {
  const std::string deep(100'000, '[');
  ExpectSkipped("no JSON", "code=906, reason=Malformed event_raw: no JSON");
  ExpectSkipped("", "code=906");
  ExpectSkipped("[4]", "code=120, reason=Not an object, data=[4]");
  ExpectSkipped(R"({"event":4})", "code=120, reason=Missing property: path");
  ExpectSkipped(Line(4, "/a\",\"path\":7,\"x\":\""), "code=120, reason=Not a string");
  ExpectSkipped(R"({"event":4.5,"path":"/a"})", "code=120, reason=Not a string");
  ExpectSkipped(Line(4, "a"), "code=9999, reason=GetNodeByPath failed, path=a");
  ExpectSkipped(Line(4, ""), "code=9999, reason=GetNodeByPath failed, path=");
  ExpectSkipped(Line(4, "/\\u0000"), "code=9999");
  ExpectSkipped(Line(4, "/\\ud800"), "code=906");
  ExpectSkipped(R"({"event":4,"path":"/torn)", "code=906");
  ExpectSkipped(Line(4, "/a", ",\"data\":" + deep), "code=906");
  std::string components;
  for (int i = 0; i < 200'000; ++i) components += "/a";
  ExpectSkipped(Line(4, components), "code=9999");
  ExpectSkipped(Line(4, "/a", ",\"data\":\"" + std::string(64 << 20, 'x') + "\""), "code=906, reason=Line too long");
}

TEST(OPTree, ABinaryLineIsOneBadLine) {
  Built built(Line(4, "/a") + "\n" + std::string("\0\x01{\0", 4) + "\n" + Line(4, "/b"));
  EXPECT_THAT(HandedOut(built.tree), ElementsAre("[03] /a, data=null", "[03] /b, data=null"));
  EXPECT_EQ(built.tree.counts().bad_lines, 1U);
}

TEST(OPTree, LogsEachEventWhenAskedTo) {
  const int level = std::exchange(log_level, kLogVerbose);
  Built built(Line(4, "/a") + "\n");
  log_level = level;
  EXPECT_THAT(built.log.texts(), ElementsAre(EndsWith(" Got event: " + Line(4, "/a"))));
  EXPECT_EQ(built.log.lines().front().format, "%s:%d Got event: %s");
}

TEST(OPTree, CannotBeBuiltFromWhatIsNoFile) {
  const support::TempDir directory;
  for (const auto& [path, text] :
       {std::pair(directory / "missing", "No such file or directory"), std::pair(directory.path(), "Is a directory")}) {
    const SyslogCapture log;
    try {
      OPTree(path).BuildTree();
      ADD_FAILURE() << path;
    } catch (const Error& error) {
      EXPECT_EQ(error.code, kErrSystem);
      EXPECT_EQ(error.reason, std::string("Failed to open queue, reason=") + text);
    }
    EXPECT_THAT(log.texts(),
                ElementsAre(HasSubstr("(BuildTree) Failed [!input_stream], reason: Failed to open queue")));
  }
}

TEST(OPTree, KeepsTheNodeOfAKeptOperationAsLongAsItLives) {
  std::shared_ptr<OP> kept;
  {
    OPTree tree("");
    tree.InsertEvent(std::make_shared<Event>(Line(4, "/a/b")));
    EXPECT_EQ(tree.ProcessOP([&](const std::shared_ptr<OP>& op) { kept = op; }), 1U);
    EXPECT_EQ(Print(*kept), "[03] /a/b, data=null");
    const std::shared_ptr<OPNode> node = kept->node.lock();
    EXPECT_EQ(node, tree.GetNodeByPath("//a//b/"));
    EXPECT_EQ(node->GetParent()->GetChild("b"), node);
    EXPECT_EQ(node->GetParent()->GetParent(), tree.root());
    EXPECT_EQ(tree.root()->GetParent(), nullptr);
    EXPECT_EQ(tree.root()->GetChild("c"), nullptr);
    std::ostringstream printed;
    printed << *node;
    EXPECT_EQ(printed.str(), "Node[/a/b]: [03] /a/b, data=null");
  }
  EXPECT_THROW(Print(*kept), std::bad_weak_ptr);
}

}  // namespace
}  // namespace quarrox::fileindex
