#include "common/json.h"

#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>

#include "support/errors.h"
#include "support/file_size_limit.h"
#include "support/temp_dir.h"

namespace quarrox {
namespace {

namespace fs = std::filesystem;
using namespace std::string_literals;

// A text as it comes back out, "refused" where it does not go in.
std::string Through(const std::string& text) {
  Json::Value value;
  return fromString(value, text) ? toString(value) : "refused";
}

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

template <typename T>
std::string ReasonOf(const std::string& object) {
  T out{};
  return support::ReasonOf(kErrBadParameter, [&] { GetJsonValue(out, Parse(object), "a", true); });
}

TEST(JsonText, PassesAnyBytesThroughBothWaysOnOneLine) {
  const std::string text = "{\"a\\nb\":[\"/v/\xff\xfe \xc3\xa4 \xed\xa0\x80 \x7f\",\"\\u0000\\u0001\\t\\\"\\\\\",{}]}";
  const Json::Value value = Parse(text);
  EXPECT_EQ(value["a\nb"][0].asString(), "/v/\xff\xfe \xc3\xa4 \xed\xa0\x80 \x7f");
  EXPECT_EQ(value["a\nb"][1].asString(), "\0\x01\t\"\\"s);
  EXPECT_EQ(toString(value), text);
}

TEST(JsonText, IsExactlyOneValueOfAnyTypeAndOfDoubledKeysTheLast) {
  EXPECT_EQ(Through(" \"a\"\r\n"), "\"a\"");
  EXPECT_EQ(Through("[null,true,-7,18446744073709551615]"), "[null,true,-7,18446744073709551615]");
  EXPECT_EQ(Through(R"({"a":{"x":1},"b":2,"a":{"y":3}})"), R"({"a":{"y":3},"b":2})");
  const char* const refused[] = {"",        " ",      "{",          "{} {}", "{}x",     "{}]",
                                 "// c\n1", "1 // c", "[1,/**/2]",  "[1,]",  "{'a':1}", "{1:2}",
                                 "[,1]",    "NaN",    "[Infinity]", "\"a",   "\"\\x\"", "tru"};
  for (const char* text : refused) EXPECT_EQ(Through(text), "refused") << text;
  EXPECT_EQ(Through("{}\0"s), "refused");
}

TEST(JsonText, NestingTooDeepIsAFailureNotACrash) {
  EXPECT_NE(Through(std::string(900, '[') + std::string(900, ']')), "refused");
  EXPECT_EQ(Through(std::string(100000, '[')), "refused");
}

TEST(JsonFile, ReplacesWholeOrNotAtAllAndLeavesNothingBeside) {
  const support::TempDir dir;
  const std::string path = dir / "state";
  const mode_t mask = umask(077);
  ASSERT_TRUE(toFile(Parse("{\"a\":1}"), path));
  umask(mask);
  EXPECT_EQ(fs::status(path).permissions(), fs::perms{0644});
  fs::permissions(path, fs::perms{0600});
  ASSERT_TRUE(toFile(Parse("[\"\xff\"]"), path));
  {
    const support::FileSizeLimit limit(4096);
    EXPECT_FALSE(toFile(Json::Value(std::string(100000, 'x')), path));
    EXPECT_EQ(errno, EFBIG);
  }
  EXPECT_EQ(fs::status(path).permissions(), fs::perms{0600});
  Json::Value value;
  EXPECT_TRUE(fromFile(value, path) && !fromFile(value, dir.path()));
  EXPECT_EQ(toString(value), "[\"\xff\"]");
  EXPECT_EQ(std::distance(fs::directory_iterator(dir.path()), {}), 1);
}

TEST(GetJsonValue, NamesTheFaultAndShowsTheObjectAndLeavesAnOptionalOneAlone) {
  EXPECT_EQ(ReasonOf<std::string>(R"(["a"])"), R"(Not an object, data=["a"])");
  EXPECT_EQ(ReasonOf<Json::Value>("{}"), "Missing property: a, data={}");
  EXPECT_EQ(ReasonOf<bool>(R"({"a":"x"})"), R"(Not a string, data={"a":"x"})");
  EXPECT_EQ(ReasonOf<int>(R"({"a":2147483648})"), R"(Not a string, data={"a":2147483648})");
  EXPECT_EQ(ReasonOf<unsigned int>(R"({"a":-1})"), R"(Not a string, data={"a":-1})");
  std::string text = "default";
  GetJsonValue(text, Parse(R"({"a":true})"), "a", false);
  EXPECT_EQ(text, "default");
}

TEST(JsonApplyChanges, RemovesMergesAndReplaces) {
  const auto applied = [](const std::string& target, const std::string& changes) {
    Json::Value value = Parse(target);
    JsonApplyChanges(value, Parse(changes));
    return toString(value);
  };
  EXPECT_EQ(applied(R"({"a":1,"b":{"d":2}})", R"({"a":null,"b":{"c":1}})"), R"({"b":{"c":1,"d":2}})");
  EXPECT_EQ(applied(R"({"a":7,"l":[1,2]})", R"({"a":{"x":{"y":null}},"l":[3]})"), R"({"a":{"x":{}},"l":[3]})");
  EXPECT_EQ(applied("[1]", R"({"a":1})"), R"({"a":1})");
}

}  // namespace
}  // namespace quarrox
