#include <map>

#include <gmock/gmock.h>

#include "analysis.h"
#include "common/json.h"

namespace quarrox::elasticd {
namespace {

using Counts = std::map<std::string, uint32_t>;
using Groups = std::vector<std::vector<std::string>>;

Json::Value Parse(const std::string& text) {
  Json::Value value;
  fromString(value, text);
  return value;
}

struct AnalysisTest : testing::Test {
  Counts Terms(const std::string& field, const Json::Value& value) {
    Json::Value document;
    document[field] = value;
    const auto& terms = analyzer_.Analyze(document, {}).terms;
    EXPECT_TRUE(std::is_sorted(terms.begin(), terms.end()));
    return {terms.begin(), terms.end()};
  }
  // The words under a prefix, in order, with "*count" where that is not 1.
  static std::string Under(const std::string& prefix, const Counts& terms) {
    std::string words;
    for (auto at = terms.lower_bound(prefix); at != terms.end() && at->first.starts_with(prefix); ++at) {
      words += at->first.substr(prefix.size()) + (at->second == 1 ? " " : "*" + std::to_string(at->second) + " ");
    }
    return words.substr(0, words.size() - 1);
  }
  auto Words(const std::string& field, const Json::Value& json) {
    return Under(PrefixOf(Get(field)), Terms(field, json));
  }
  // Whether the terms are found by a word of a query.
  static bool Found(const Counts& terms, const WordTerms& word) {
    return std::ranges::all_of(word.groups, [&](const auto& group) {
      return std::ranges::any_of(group, [&](const std::string& term) {
        const auto at = terms.lower_bound(term);
        return at != terms.end() && (word.last_is_prefix ? at->first.starts_with(term) : at->first == term);
      });
    });
  }
  Field Get(const std::string& field) { return mapping_.Get(field); }

  const Mapping mapping_{Parse(R"({"property_id": "key", "properties": {
    "dir": {"analyzer": "white space escaped", "preprocess": ["list_ancestor"]},
    "escaped": {"analyzer": "white space escaped"}, "key": {"analyzer": "keyword", "_all": false},
    "name": {"analyzer": "white space", "preprocess": ["tolower", "ngram"]}, "number": {"type": "int"},
    "real": {"type": "double"}, "text": {}, "words": {"analyzer": "white space"}, "yes": {"type": "bool"}}})")};
  DocumentAnalyzer analyzer_{mapping_};
};

TEST_F(AnalysisTest, WordsOfTextsAreFoldedAndCountedWhereverTheyStand) {
  const std::string q(64, 'q'), r(32, 'r');
  const std::vector<std::pair<std::string, std::string>> cases{
      {"Don't snake_CASE v1.2 \x01@[`{/: a\U0001f600b", "2 a b case don snake t v1"},
      {"café cafe\u0301 CAFÉ, \u0301 Straße STRASSE ẞ ı I İ i", "cafe*3 i*3 ss strasse*2 ı"},
      {"Ａｂｃ１ ﬁn ½ x² Σίσυφος ΣΊΣΥΦΟΣ Ёж", "1 2 abc1 fin x2 σισυφοσ*2 еж"},
      {"iPhone手机。東京都 \U00020000", "iphone 京 京都 手 手机 机 東 東京 都 \U00020000"},
      {"ｶﾞ ガ 한국 \u1112\u1161\u11ab\u1100\u116e\u11a8 \355\240\200 \364\220\200\200x", "x カ*2 한국*2"},
      {q + " " + q + "r " + r + "éé " + r + r + "é ab\377cd\303", "ab cd " + q + " " + r + "ee"}};
  for (size_t i = 0; i < 70 * cases.size(); ++i) {
    const auto& [text, words] = cases[i / 70];
    EXPECT_EQ(Words("text", std::string(i % 70, ' ') + text + std::string(i * 7 % 70, ' ')), words) << i % 70;
  }
}

TEST_F(AnalysisTest, ManyWordsOfEveryLengthAreToldApart) {
  Counts expected;
  std::string text;
  for (size_t i = 0; i < 30000; ++i) {
    const std::string word = std::string(i % 40, 'x') + std::to_string(i * 7919 % 9973);
    ++expected["\x07" + word];
    text += word + (i % 3 == 0 ? "\n" : "-");
  }
  EXPECT_EQ(Terms("text", text), expected);
}

TEST_F(AnalysisTest, KeywordsNgramsAndDirectoriesAreTermsWithoutCounts) {
  EXPECT_EQ(Words("name", "Repo\u0301rt A"), "a*0 epo*0 ort*0 por*0 rep*0 rt*0 t*0");
  EXPECT_EQ(Words("name", "\377É\376東"), "e\376東*0 東*0 \376東*0 \377e\376*0");
  EXPECT_EQ(Words("words", "A\u3000b\tA \377"), "A*2 b \377");
  EXPECT_EQ(Words("escaped", R"(a\ b c\\ \)"), R"(\ a b c\)");
  EXPECT_EQ(Words("dir", "/a b//c/"), "/*0 /a b*0 /a b//c*0");
  EXPECT_EQ(Words("key", Parse(R"(["b A", null, "", "b A"])")), "*0 b A*0");

  const std::string value(300, 'k'), term = ExactTerm(Get("key"), value);
  EXPECT_EQ(Terms("key", value), (Counts{{term, 0}}));
  EXPECT_EQ(term.size(), kLongestTerm);
  EXPECT_NE(term, ExactTerm(Get("key"), value + "k"));
  EXPECT_TRUE(Terms("dir", "/" + value + "/a").contains(ExactTerm(Get("dir"), "/" + value)));
}

TEST_F(AnalysisTest, SearchesInNoFieldReachEveryTextThatIsMeantForThem) {
  const auto fields = Parse(R"({"key": "k", "name": "My_Plan.TXT", "words": "A-B a", "number": 90, "text": "t",
      "real": -1.5, "yes": true, "skipped": "s", "other": ["c", "c"], "nothing": null})");
  const auto& document = analyzer_.Analyze(fields, {"skipped"});
  EXPECT_EQ(Under("\x7d", {document.terms.begin(), document.terms.end()}), "a*2 b c*2 my plan txt");
  EXPECT_EQ(document.numbers, (std::vector<std::pair<unsigned int, double>>{{4, 90}, {5, -1.5}, {8, 1}}));
  EXPECT_EQ(QueryWordsInAll(mapping_, "T").at(0).groups, (Groups{{"\175t", "\7t"}}));
  EXPECT_EQ(Words(std::string(300, 'n'), "long name"), "long name");
}

TEST_F(AnalysisTest, QueriesFindTheTextsThatTheyAreTakenFrom) {
  for (const std::string text : {"Plain words, twice WORDS", "Ångström cafe\u0301 東京都A東 x",
                                 "a ab abc \377\303 é\377", R"(C:\dir\ with\ blanks \)", "/a b/c/", ""}) {
    for (const std::string field : {"dir", "escaped", "key", "name", "text", "words", "other"}) {
      const Counts terms = Terms(field, text);
      auto words = QueryWords(Get(field), text);
      if (field != "key") std::ranges::move(QueryWordsInAll(mapping_, text), std::back_inserter(words));
      for (const WordTerms& word : words) EXPECT_TRUE(Found(terms, word)) << field << ": " << text;
    }
  }
  EXPECT_EQ(QueryWords(Get("name"), "Re").at(0).groups, (Groups{{"\4re"}}));
  EXPECT_EQ(QueryWords(Get("name"), "aaaaab").at(0).groups, (Groups{{"\4aaa"}, {"\4aab"}}));
  EXPECT_EQ(ExactTerm(Get("text"), " Été ") + ExactTerm(Get("text"), "two words"), "\7ete");
}

TEST_F(AnalysisTest, WrongValuesAreNamed) {
  const auto names = [](const std::string& place) { return testing::ThrowsMessage<Error>(testing::HasSubstr(place)); };
  for (const std::string wrong :
       {R"(number": "5")", R"(number": 1.5)", R"(real": true)", R"(yes": 1)", R"(text": [5])"}) {
    EXPECT_THAT([&] { analyzer_.Analyze(Parse("{\"" + wrong + "}"), {}); }, names(wrong.substr(0, wrong.find('"'))));
  }
  for (const std::string wrong : {R"(type": "date")", R"(stored": 1)", R"(preprocess": ["stem"])"}) {
    EXPECT_THAT([&] { Mapping(Parse(R"({"property_id": "a", "properties": {"a": {")" + wrong + "}}}")); },
                names("properties.a." + wrong.substr(0, wrong.find('"'))));
  }
}

}  // namespace
}  // namespace quarrox::elasticd
