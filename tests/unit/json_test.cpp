#include "common/json.h"

#include <sys/stat.h>

#include <cerrno>
#include <cmath>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>

#include "common/json_reader.h"
#include "support/errors.h"
#include "support/file_size_limit.h"
#include "support/json_reference.h"
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

void ExpectReadLikeJsoncpp(const std::string& text) {
  Json::Value ours;
  Json::Value theirs;
  const bool accepted = fromString(ours, text);
  EXPECT_EQ(accepted, ReadJsonByRules(theirs, text)) << text;
  EXPECT_TRUE(!accepted || (ours == theirs && toString(ours) == toString(theirs))) << text;
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

TEST(JsonText, MeansWhatJsoncppMakesOfIt) {
  ExpectReadLikeJsoncpp("[0,-0,9223372036854775807,9223372036854775808,-9223372036854775808,18446744073709551615]");
  ExpectReadLikeJsoncpp(
      "[-9223372036854775809,18446744073709551616,-0.0,1.0,1E2,4.9e-324,1e-400,0.300000000000000041]");
  ExpectReadLikeJsoncpp("[\"\x01\n 0123456789abcdef \x1f\",\"\\ud83d\\ude00\\u00e4\\/\"]");
  ExpectReadLikeJsoncpp("{\"a\\u0000b\":1,\"a\":[2],\"a\":{}}");
  for (const char* text : {"007", "[1.]", "-", "[.5]", "[+1]", "1e400", "\xef\xbb\xbf[1]", "{\"\":1,}", "\"\\ud800\"",
                           "\"\\ud800\\u0041\"", "\"\\udc00\""}) {
    ExpectReadLikeJsoncpp(text);
  }
  for (const size_t depth : {500U, 501U, 1000U, 1002U}) {
    ExpectReadLikeJsoncpp(std::string(depth, '[') + std::string(depth, ']'));
  }
  Json::Value value;
  EXPECT_TRUE(ReadPlainJson(value, R"({"a":[1,-2.5,"x\u00e4\n",true,null,{}]})")) << "the fast road is never taken";
}

TEST(JsonText, IsWrittenAsJsoncppWritesIt) {
  Json::Value value(Json::arrayValue);
  for (unsigned int i = 0; i < 17 * 256; ++i) {
    std::string text(18, '\n');
    text.replace(0, 17, 17, 'x');
    text[i / 256] = static_cast<char>(i);
    value[2 * i][text] = text;  // and an element beside it that was never assigned
  }
  for (const double number : {-0.0, 1.0, 0.1, 1e17, 1e300, -HUGE_VAL, std::nan("")}) value.append(number);
  value.append(Json::Value::maxUInt64);
  value.append(Json::Value::minInt64);
  EXPECT_EQ(toString(value), support::WriteByJsonCpp(value));
  for (int i = 0; i < 3000; ++i) {
    Json::Value outer(Json::arrayValue);
    outer.append(Json::Value()).swap(value);
    value.swap(outer);
  }
  EXPECT_EQ(toString(value), support::WriteByJsonCpp(value));
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
