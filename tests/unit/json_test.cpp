#include "common/json.h"

#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "support/file_size_limit.h"
#include "support/temp_dir.h"

namespace quarrox {
namespace {

using ::testing::ElementsAre;

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

template <typename T>
std::string ReasonOf(const std::string& object, const std::string& key) {
  T out{};
  try {
    GetJsonValue(out, Parse(object), key, true);
  } catch (const Error& error) {
    EXPECT_EQ(error.code, kErrBadParameter);
    return error.reason;
  }
  return "";
}

std::vector<std::string> NamesIn(const std::string& directory) {
  std::vector<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(directory)) names.push_back(entry.path().filename());
  return names;
}

mode_t ModeOf(const std::string& path) {
  struct stat info;
  return stat(path.c_str(), &info) == 0 ? info.st_mode & 07777 : 0;
}

TEST(JsonText, PassesAnyBytesThroughBothWays) {
  const std::string text = "{\"path\":\"/v/\xff\xfe \xc3\xa4 \xe2\x82\xac \xed\xa0\x80 / \x7f\"}";
  const Json::Value value = Parse(text);
  EXPECT_EQ(value["path"].asString(), "/v/\xff\xfe \xc3\xa4 \xe2\x82\xac \xed\xa0\x80 / \x7f");
  EXPECT_EQ(toString(value), text);
}

TEST(JsonText, IsOneLineWithControlCharactersEscaped) {
  Json::Value value(Json::objectValue);
  value["a\nb"].append(std::string("\0\x01\t\"\\", 5));
  value["a\nb"].append(Json::Value(Json::objectValue));
  const std::string text = toString(value);
  EXPECT_EQ(text, R"({"a\nb":["\u0000\u0001\t\"\\",{}]})");
  EXPECT_EQ(Parse(text), value);
}

TEST(JsonText, TakesAValueOfAnyType) {
  EXPECT_EQ(Parse(" \"a\" ").asString(), "a");
  EXPECT_TRUE(Parse("null").isNull());
  EXPECT_TRUE(Parse("true\n").asBool());
  EXPECT_EQ(Parse("-7").asInt(), -7);
  EXPECT_EQ(Parse("[18446744073709551615]")[0].asUInt64(), 18446744073709551615U);
  EXPECT_EQ(toString(Parse("[1,{},[]]\r\n")), "[1,{},[]]");
}

TEST(JsonText, RefusesWhatIsNotExactlyOneValue) {
  for (const std::string& text : {std::string(),
                                  std::string(" "),
                                  std::string("{"),
                                  std::string("{} {}"),
                                  std::string("{}x"),
                                  std::string("{} x"),
                                  std::string("{}]"),
                                  std::string("1 2"),
                                  std::string("// c\n1"),
                                  std::string("1 // c"),
                                  std::string("/**/1"),
                                  std::string("[1,/**/2]"),
                                  std::string("[1,]"),
                                  std::string("{\"a\":1,}"),
                                  std::string("[,1]"),
                                  std::string("{'a':1}"),
                                  std::string("{a:1}"),
                                  std::string("{1:2}"),
                                  std::string("NaN"),
                                  std::string("[Infinity]"),
                                  std::string("\"a"),
                                  std::string("\"\\x\""),
                                  std::string("tru"),
                                  std::string("{}\0", 3),
                                  std::string("{}\0{\"a\":1}", 10),
                                  std::string("\0{}", 3),
                                  std::string("[1,\0", 4)}) {
    Json::Value value;
    EXPECT_FALSE(fromString(value, text)) << text;
  }
}

TEST(JsonText, OfDoubledKeysTheLastWinsWhole) {
  EXPECT_EQ(toString(Parse(R"({"a":{"x":1},"b":2,"a":{"y":3}})")), R"({"a":{"y":3},"b":2})");
  EXPECT_EQ(toString(Parse(R"({"a":[1,2],"a":"s"})")), R"({"a":"s"})");
}

TEST(JsonText, NestingTooDeepIsAFailureNotACrash) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, std::string(900, '[') + std::string(900, ']')));
  for (const size_t depth : {1100U, 100000U}) {
    EXPECT_FALSE(fromString(value, std::string(depth, '[')));
    EXPECT_FALSE(fromString(value, std::string(depth, '[') + std::string(depth, ']')));
    std::string objects;
    for (size_t i = 0; i < depth; ++i) objects += "{\"a\":";
    EXPECT_FALSE(fromString(value, objects + "1" + std::string(depth, '}')));
  }
}

TEST(JsonFile, ReplacesWholeKeepingTheModeAndLeavesNothingBeside) {
  const support::TempDir dir;
  const std::string path = dir / "state";
  const mode_t mask = umask(077);
  ASSERT_TRUE(toFile(Parse("{\"a\":1}"), path));
  umask(mask);
  EXPECT_EQ(ModeOf(path), 0644U);
  ASSERT_EQ(chmod(path.c_str(), 0600), 0);
  ASSERT_TRUE(toFile(Parse("[\"\xff\"]"), path));
  EXPECT_EQ(ModeOf(path), 0600U);
  Json::Value value;
  ASSERT_TRUE(fromFile(value, path));
  EXPECT_EQ(toString(value), "[\"\xff\"]");
  EXPECT_THAT(NamesIn(dir.path()), ElementsAre("state"));
}

TEST(JsonFile, AFailedWriteLeavesTheOldTextWhole) {
  const support::TempDir dir;
  const std::string path = dir / "state";
  ASSERT_TRUE(toFile(Parse("{\"old\":true}"), path));
  {
    const support::FileSizeLimit limit(4096);
    errno = 0;
    EXPECT_FALSE(toFile(Json::Value(std::string(100000, 'x')), path));
    EXPECT_EQ(errno, EFBIG);
  }
  Json::Value value;
  ASSERT_TRUE(fromFile(value, path));
  EXPECT_EQ(toString(value), "{\"old\":true}");
  EXPECT_THAT(NamesIn(dir.path()), ElementsAre("state"));

  EXPECT_FALSE(toFile(value, dir / "missing/state"));
  EXPECT_EQ(errno, ENOENT);
  std::filesystem::create_directory(dir / "state.d");
  EXPECT_FALSE(toFile(value, dir / "state.d"));
  EXPECT_EQ(NamesIn(dir.path()).size(), 2U);
}

TEST(JsonFile, ReadingFailsOnWhatIsNoFileOrNoJson) {
  const support::TempDir dir;
  Json::Value value;
  EXPECT_FALSE(fromFile(value, dir / "missing"));
  EXPECT_FALSE(fromFile(value, dir.path()));
  support::WriteText(dir / "empty", "");
  EXPECT_FALSE(fromFile(value, dir / "empty"));
  support::WriteText(dir / "torn", "{\"a\":");
  EXPECT_FALSE(fromFile(value, dir / "torn"));
}

TEST(GetJsonValue, NamesTheFaultAndShowsTheObject) {
  EXPECT_EQ(ReasonOf<std::string>(R"(["a"])", "a"), R"(Not an object, data=["a"])");
  EXPECT_EQ(ReasonOf<Json::Value>("null", "a"), "Not an object, data=null");
  EXPECT_EQ(ReasonOf<int>(R"({"b":1})", "a"), R"(Missing property: a, data={"b":1})");
  EXPECT_EQ(ReasonOf<Json::Value>("{}", "a"), "Missing property: a, data={}");
  EXPECT_EQ(ReasonOf<bool>(R"({"a":"x"})", "a"), R"(Not a string, data={"a":"x"})");
  EXPECT_EQ(ReasonOf<int>(R"({"a":2147483648})", "a"), R"(Not a string, data={"a":2147483648})");
  EXPECT_EQ(ReasonOf<unsigned int>(R"({"a":-1})", "a"), R"(Not a string, data={"a":-1})");
  EXPECT_EQ(ReasonOf<std::string>(R"({"a":null})", "a"), R"(Not a string, data={"a":null})");
  EXPECT_EQ(ReasonOf<Json::Value>(R"({"a":null})", "a"), "");
}

TEST(GetJsonValue, ReadsEachTypeAndLeavesAnOptionalOneAlone) {
  const Json::Value object = Parse(R"({"s":"t","b":true,"u":4294967295,"i":-9223372036854775808,"d":1.5})");
  std::string text = "default";
  bool flag = false;
  unsigned int number = 0;
  int64_t wide = 0;
  double real = 0;
  GetJsonValue(text, object, "b", false);
  GetJsonValue(text, object, "missing", false);
  EXPECT_EQ(text, "default");
  GetJsonValue(text, object, "s", true);
  GetJsonValue(flag, object, "b", false);
  GetJsonValue(number, object, "u", true);
  GetJsonValue(wide, object, "i", true);
  GetJsonValue(real, object, "d", true);
  EXPECT_EQ(text, "t");
  EXPECT_TRUE(flag);
  EXPECT_EQ(number, 4294967295U);
  EXPECT_EQ(wide, INT64_MIN);
  EXPECT_EQ(real, 1.5);
  EXPECT_THROW(GetJsonValue(text, Json::Value("s"), "s", false), Error);
}

TEST(JsonApplyChanges, RemovesMergesAndReplaces) {
  const auto applied = [](const std::string& target, const std::string& changes) {
    Json::Value value = Parse(target);
    JsonApplyChanges(value, Parse(changes));
    return toString(value);
  };
  EXPECT_EQ(applied(R"({"a":1,"b":{"d":2}})", R"({"a":null,"b":{"c":1}})"), R"({"b":{"c":1,"d":2}})");
  EXPECT_EQ(applied(R"({"a":7,"l":[1,2]})", R"({"a":{"x":{"y":null}},"l":[3]})"), R"({"a":{"x":{}},"l":[3]})");
  EXPECT_EQ(applied(R"({"a":{"x":1}})", R"({"a":{},"z":null})"), R"({"a":{"x":1}})");
  EXPECT_EQ(applied("null", R"({"a":1})"), R"({"a":1})");
  EXPECT_EQ(applied("[1]", R"({"a":1})"), R"({"a":1})");
}

TEST(JsonArrays, KeepTheOrderOfTexts) {
  const std::vector<std::string> texts = {"b", "", "a\xff", "b"};
  EXPECT_EQ(toString(Vec2JsonArr(texts)), "[\"b\",\"\",\"a\xff\",\"b\"]");
  EXPECT_EQ(JsonArr2Vec<std::string>(Vec2JsonArr(texts)), texts);
  EXPECT_EQ(toString(Vec2JsonArr(std::vector<std::string>())), "[]");
}

}  // namespace
}  // namespace quarrox
