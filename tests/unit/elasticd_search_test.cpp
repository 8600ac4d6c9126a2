#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <random>

#include <gmock/gmock.h>

#include "common/json.h"
#include "elasticd/error_code.h"
#include "elasticd/index.h"
#include "elasticd/line_values.h"
#include "elasticd/search_line.h"
#include "elasticd/snippet.h"
#include "fileindex/elastic_control.h"
#include "support/answer_text.h"
#include "support/temp_dir.h"

namespace quarrox::elasticd {
namespace {

using testing::ElementsAre;
using testing::StartsWith;
using Names = std::vector<std::string>;

constexpr int64_t kNow = 1714564800;  // 2024-05-01 12:00 UTC

// An index in which files are written as names below /v with their texts, and searched by lines.
class SearchTest : public testing::Test {
 protected:
  SearchTest() {
    setenv("TZ", "UTC", 1);
    tzset();
    index_.Create();
  }

  void Write(const std::string& name, const std::string& text, int64_t size = 1, int64_t changed = kNow) {
    const std::string path = "/v/" + name;
    const std::string base = path.substr(path.rfind('/') + 1);
    Json::Value fields;
    fields["VEXOMDPath"] = path;
    fields["VEXOMDSearchFileName"] = fields["VEXOMDDisplayName"] = base;
    const size_t dot = base.rfind('.');
    fields["VEXOMDExtension"] = dot == std::string::npos ? "" : base.substr(dot + 1);
    fields["VEXOMDIsDir"] = size < 0;
    fields["VEXOMDFSSize"] = Json::Int64{std::abs(size)};
    fields["VEXOMDFSContentChangeDate"] = Json::Int64{changed};
    fields["VEXOMDTextContent"] = text;
    index_.Accept(path, fields, [] {});
  }

  Json::Value Ask(const std::string& line) {
    SearchRequest request;
    request.qsl["query_string"]["query"] = line;
    request.qsl["query_string"]["now"] = Json::Int64{kNow};
    for (const char* extension : {"jpg", "png"}) request.qsl["query_string"]["types"]["photo"].append(extension);
    request.load_fields = {"VEXOMDPath", "_snippet", "_score"};
    request.suggest = true;
    Answer answer(directory_.path());
    index_.Find(request, answer);
    Json::Value parsed;
    EXPECT_TRUE(fromString(parsed, "{\"data\":" + Read(answer) + "}"));
    return parsed;
  }

  // Names of what is found, the best first.
  Names Ranked(const std::string& line) {
    Names names;
    const Json::Value answer = Ask(line);
    for (const Json::Value& hit : answer["data"]) names.push_back(hit["VEXOMDPath"].asString().substr(3));
    return names;
  }

  std::string Found(const std::string& line) {
    Names names = Ranked(line);
    std::sort(names.begin(), names.end());
    std::string joined;
    for (const std::string& name : names) joined += (joined.empty() ? "" : " ") + name;
    return joined;
  }

  std::string Refusal(const std::string& line) {
    try {
      Ask(line);
    } catch (const Error& error) {
      EXPECT_EQ(error.code, kBadQuery);
      return error.reason;
    }
    return "none";
  }

  support::TempDir directory_;
  Index index_{directory_.path() + "/db", fileindex::elastic::GetFileIndexMappings(), false};
};

TEST_F(SearchTest, ALineFindsWhatAPersonMeans) {
  Write("a", "red green blue");
  Write("b", "green red");
  Write("c/d", "red \xc3\x89t\xc3\xa9 12:30 http://x.org:8 AND", 2000, kNow - 86400);
  Write("c", "", -4096, kNow - 90 * 86400);
  Write("c/e.JPG", "\xe6\x97\xa5\xe6\x9c\xac\xe8\xaa\x9e\xe3\x81\xa7\xe3\x81\x99 x", 3 << 20, 1672531200);
  Write("c/sub/f g.png",
        "r\xc3\xa9"
        "d",
        1024, 1672531199);
  index_.Commit();
  const std::pair<const char*, const char*> cases[] = {
      {"red", "a b c/d c/sub/f g.png"},
      {"RED green", "a b"},
      {"\"red green\"", "a"},
      {"\"red blue\"", ""},
      {"red -green", "c/d c/sub/f g.png"},
      {"red NOT (blue OR 12)", "b c/sub/f g.png"},
      {"--blue", "a"},
      {"blue OR green -red", "a"},
      {"(blue OR 12) AND red", "a c/d"},
      {"-\"red green\" green", "b"},
      {"gre* -blue", "b"},
      {"\\-green", "a b"},
      {"\\AND", "c/d"},
      {"or", ""},
      {"e\xcc\x81t\xc3\xa9", "c/d"},
      {"\xe6\x97\xa5\xe6\x9c\xac", "c/e.JPG"},
      {"\xe6\x9c\xac\xe8\xaa\x9e\xe3\x81\xa7", "c/e.JPG"},
      {"\"\xe6\x97\xa5\xe8\xaa\x9e\"", ""},
      {"\"\xe3\x81\xa7\xe3\x81\x99 x\"", "c/e.JPG"},
      {"12:30", "c/d"},
      {"30:12", ""},
      {"http://x.org:8", "c/d"},
      {"std::red", ""},
      {"- & ?", ""},
      {"red & -", "a b c/d c/sub/f g.png"},
      {"name:G", "c/e.JPG c/sub/f g.png"},
      {"name:\"f g\"", "c/sub/f g.png"},
      {"name:*.png", "c/sub/f g.png"},
      {"name:*.pn", ""},
      {"*.jpg", "c/e.JPG"},
      {"name:\"*\" OR name:\\*", ""},
      {"Ext:jpg,.PNG", "c/sub/f g.png"},
      {"type:photo,folder", "c c/sub/f g.png"},
      {"size:1", "a b"},
      {"size:1k", "c/d c/sub/f g.png"},
      {"size:>1k -size:>=1M", "c/d"},
      {"size:..1024 -size:<=1", "c/sub/f g.png"},
      {"date:today", "a b"},
      {"date:yesterday", "c/d"},
      {"date:>2d", "a b c/d"},
      {"date:2023", "c/e.JPG"},
      {"date:<2023", "c/sub/f g.png"},
      {"date:2022-12-31..2023", "c/e.JPG c/sub/f g.png"},
      {"date:100d -date:3d", "c"},
      {"path:c", "c/d c/e.JPG c/sub/f g.png"},
      {"path:/V/C", "c/d c/e.JPG c/sub/f g.png"},
      {"path:/v/c/d", "c/d"},
      {"path:/c", ""},
      {"path:c/s*", "c/sub/f g.png"},
      {"path:/ red green", "a b"},
      {"* -path:c", "a b c"},
  };
  for (const auto& [line, names] : cases) EXPECT_EQ(Found(line), names) << line;
}

TEST_F(SearchTest, ALineThatCannotBeReadIsRefusedWithTheColumn) {
  const std::pair<const char*, const char*> cases[] = {
      {"\xc3\xa9t\xc3\xa9 \"a", "column 5: the quote"},
      {"a (b (c) d", "column 3: the parenthesis"},
      {"a b)", "column 4: no parenthesis"},
      {"a ()", "column 3: nothing stands"},
      {"AND a", "column 1: AND has nothing before"},
      {"a AND", "column 3: AND has nothing behind"},
      {"a AND OR b", "column 3: AND has nothing behind"},
      {"OR a", "column 1: OR has nothing before"},
      {"a OR", "column 3: OR has nothing behind"},
      {"a (b OR) c", "column 6: OR has nothing behind"},
      {"a NOT", "column 3: nothing follows"},
      {"a foo:b", "column 3: there is no field \"foo\", only name, ext, type, size, date, path"},
      {"name: a", "column 6: name: lacks its value, as in name:PART"},
      {"type:photos", "column 1: there is no type \"photos\", only photo, folder"},
      {"a size:10x", "column 3: \"10x\" is no size"},
      {"date:2023-02-29", "column 1: \"2023-02-29\" is no date"},
      {"date:2023-13", "column 1: \"2023-13\" is no date"},
      {"size:5..x", "column 1: \"5..x\" is no size"},
  };
  for (const auto& [line, message] : cases) EXPECT_THAT(Refusal(line), StartsWith(message)) << line;
}

TEST_F(SearchTest, NoLineTakesLongOrMuch) {
  for (int i = 0; i < 1200; ++i) Write("f" + std::to_string(i), "w" + std::to_string(i) + " one two");
  index_.Commit();
  const auto times = [](const std::string& text, size_t count) {
    std::string line;
    while (count-- > 0) line += text;
    return line;
  };
  const size_t much = 1 << 18;
  for (const std::string& line :
       {times("(", much), times("a ", much), times("a OR ", much), times("name:a ", much), times("w* ", 40),
        times("- ", much), times("(a OR ", 100), "\"" + times("a ", much) + "\"", "name:" + times("*a", much),
        "ext:" + times("a,", much)}) {
    EXPECT_THAT(Refusal(line), StartsWith("column ")) << line.substr(0, 20);
  }
  for (const std::string& line : {times("NOT ", much) + "one", times("x", much), times("\x01\xff", much),
                                  std::string("one\0two", 7), times("w* ", 20), "a" + times("\\", much)}) {
    EXPECT_EQ(Refusal(line), "none") << line.substr(0, 20);
  }
  EXPECT_TRUE(Ask("w*")["cut"].asBool());
  EXPECT_FALSE(Ask("w11*").isMember("cut"));
}

TEST_F(SearchTest, AConditionThatAllFitTakesNothingAway) {
  std::mt19937 random(3);
  const auto letters = [&](size_t count) {
    std::string text;
    while (count-- > 0) text += static_cast<char>('a' + random() % 4);
    return text;
  };
  const char* const kinds[] = {".txt", ".csv", ".md"};
  for (int i = 0; i < 200; ++i)
    Write("d" + letters(1) + "/" + letters(4) + std::to_string(i) + kinds[i % 3], letters(1));
  index_.Commit();
  for (int round = 0; round < 200; ++round) {
    std::string line;
    for (size_t left = 3 + random() % 2; left > 0; --left) {
      const std::string conditions[] = {"name:" + letters(2), "path:d" + letters(1),
                                        std::string("ext:") + (kinds[random() % 3] + 1), letters(1)};
      line += (line.empty() ? "" : " OR ") + conditions[random() % 4];
    }
    ASSERT_EQ(Found("(" + line + ") ext:txt,csv,md"), Found(line)) << line;
  }
}

TEST_F(SearchTest, AnOddLineIsAnsweredOrRefusedAtAColumnThatItHas) {
  const std::string pieces[] = {"\"",
                                "(",
                                ")",
                                " ",
                                "-",
                                "*",
                                "\\",
                                ":",
                                "OR ",
                                "AND ",
                                "NOT ",
                                "name:",
                                "size:>",
                                "date:",
                                "path:/",
                                "type:",
                                "ext:",
                                "..",
                                ",",
                                "1",
                                "k",
                                "one",
                                "\xc3\xa9",
                                "\xff",
                                "\xe6\x97",
                                "\x01",
                                "\x1b[",
                                "\n",
                                std::string(1, '\0'),
                                "\xe6\x97\xa5\xe6\x9c\xac",
                                "2024-",
                                "/"};
  Write("one.txt", "one \xe6\x97\xa5\xe6\x9c\xac 1");
  index_.Commit();
  std::mt19937 random(7);
  int answered = 0;
  for (int round = 0; round < 1000; ++round) {
    std::string line;
    for (size_t left = 1 + random() % 30; left > 0; --left) line += pieces[random() % std::size(pieces)];
    const std::string refusal = Refusal(line);
    unsigned long column = 0;
    if (refusal == "none" && ++answered > 0) continue;
    ASSERT_EQ(sscanf(refusal.c_str(), "column %lu: ", &column), 1) << line << '\n' << refusal;
    ASSERT_TRUE(column >= 1 && column <= line.size() + 1) << line << '\n' << refusal;
  }
  EXPECT_GT(answered, 20);
  EXPECT_LT(answered, 980);
}

TEST_F(SearchTest, NamesThatMatchComeFirst) {
  const std::string report = "report report report plan plan plan";
  Write("text.txt", report);
  Write("my plan, report.txt", "");
  Write("Report plan of May.txt", "");
  Write("report plan.txt", "");
  index_.Commit();
  const Names ranked = {"report plan.txt", "Report plan of May.txt", "my plan, report.txt", "text.txt"};
  for (const char* line : {"report plan", "r\xc3\xa9port plan*", "report plan -absent"}) {
    EXPECT_EQ(Ranked(line), ranked) << line;
  }
  EXPECT_THAT(Ranked("name:plan OR text"), ElementsAre("text.txt", testing::_, testing::_, testing::_));
  EXPECT_THAT(Ranked("name:\"report plan\""), ElementsAre("report plan.txt", "Report plan of May.txt"));
}

TEST_F(SearchTest, ASnippetShowsTheWordsCloseToEachOther) {
  const auto marked = [](const std::vector<std::string>& words, const std::string& text) {
    SnippetWords snippet_words;
    for (const std::string& word : words) {
      const bool beginning = word.back() == '*';
      for (const TextPiece& piece : PiecesOf(word)) snippet_words.Add(piece, beginning);
    }
    Snippet snippet = snippet_words.Find(text);
    for (auto mark = snippet.marks.rbegin(); mark != snippet.marks.rend(); ++mark) {
      snippet.text.insert(mark->first + mark->second, "]").insert(mark->first, "[");
    }
    return snippet.text;
  };
  const std::string filler(300, '-');
  EXPECT_EQ(marked({"one", "two"}, "one " + filler + " two \n\t One\n" + filler),
            "\xe2\x80\xa6[two] [One]\xe2\x80\xa6");
  EXPECT_EQ(marked({"uber", "x*"},
                   "(\xc3\x9c"
                   "ber\xe2\x80\x94XYZ)"),
            "([\xc3\x9c"
            "ber]\xe2\x80\x94[XYZ])");
  EXPECT_EQ(marked({"\xe3\x81\xa7\xe3\x81\x99"}, "\xe6\x97\xa5\xe3\x81\xa7\xe3\x81\x99"),
            "\xe6\x97\xa5[\xe3\x81\xa7\xe3\x81\x99]");
  EXPECT_EQ(marked({"one"}, "no such word"), "");
  EXPECT_EQ(marked({"one"}, std::string("\0\xff one \xfe", 8)), "\xff [one] \xfe");
}

TEST_F(SearchTest, WhatWasMeantIsAWordThatDocumentsHave) {
  Write("a.txt", "annual report");
  Write("b.txt", "quokka");
  index_.AddSuggestions("/v/a.txt");
  index_.AddSuggestions("/v/b.txt");
  index_.Remove("/v/b.txt");
  index_.Commit();
  EXPECT_EQ(Ask("anual (reprot OR \"anual\")")["suggestion"], "annual (report OR \"annual\")");
  EXPECT_EQ(Ask("(anual)")["suggestion"], "(annual)");
  for (const char* line : {"quoka", "anual quoka", "-anual", "annual", "anual*", "name:anual"}) {
    EXPECT_FALSE(Ask(line).isMember("suggestion")) << line;
  }
}

TEST(LineValues, DaysAreThoseOfTheCalendarHere) {
  setenv("TZ", "Europe/Berlin", 1);
  tzset();
  const auto length = [](const char* date) {
    const auto bounds = ParseDates(date, kNow);
    return bounds ? static_cast<int64_t>(bounds->high - bounds->low) + 1 : 0;
  };
  EXPECT_EQ(length("2024-03-31"), 23 * 3600);
  EXPECT_EQ(length("2024-02"), 29 * 86400);
  EXPECT_EQ(length("2024-01-01..2024-12-31"), length("2024"));
  EXPECT_EQ(ParseDates("2024-03-31..", kNow)->low, 1711839600);
  EXPECT_EQ(ParseDates("12h", kNow)->low, kNow - 12 * 3600);
  EXPECT_EQ(ParseDates("2m", kNow)->low, kNow - 61 * 86400 + 3600);  // over the change of the clocks
  for (const char* bad : {"", "..", "24", "2024-", "2024-5-1-1", "d", "-7d", "7x", "2024-00", "2024-01-32", "99999"}) {
    EXPECT_FALSE(ParseDates(bad, kNow)) << bad;
  }
  setenv("TZ", "UTC", 1);
  tzset();
  const auto sizes = [](const char* text) {
    const auto bounds = ParseSizes(text);
    return bounds ? std::make_pair(bounds->low, bounds->high) : std::make_pair(-1.0, -1.0);
  };
  EXPECT_EQ(sizes("1.5KiB"), std::make_pair(1536.0, 1638.0));
  EXPECT_EQ(sizes("1kb..2k"), std::make_pair(1024.0, 2048.0));
  EXPECT_EQ(sizes("0"), std::make_pair(0.0, 0.0));
  for (const char* bad : {"", ">", "k", "1kk", "-1", "1e5", "inf", "><1", "1..2..3"})
    EXPECT_FALSE(ParseSizes(bad)) << bad;
}

// Random lines, read by a person's rules, beside what the index finds.
class LineModel : public SearchTest {
 protected:
  using Fits = std::vector<bool>;

  unsigned int Below(unsigned int end) { return static_cast<unsigned int>(random_() % end); }

  Fits Each(const std::function<bool(const std::string& text)>& fits) {
    Fits result;
    for (const std::string& text : texts_) result.push_back(fits(text));
    return result;
  }

  // Appends a condition to a line and says which documents fit it.
  Fits Condition(std::string& line, int depth) {
    const std::string word(1, static_cast<char>('p' + Below(4)));
    const std::string next(1, static_cast<char>('p' + Below(4)));
    switch (Below(depth > 0 ? 6 : 3)) {
      case 0:
      case 1:
        line += word;
        return Each([&](const std::string& text) { return text.find(" " + word + " ") != std::string::npos; });
      case 2:
        line += Below(2) == 0 ? "\"" + word + " " + next + "\"" : word + "." + next;
        return Each([&](const std::string& t) { return t.find(" " + word + "  " + next + " ") != std::string::npos; });
      case 3: {
        line += Below(2) == 0 ? "-" : "NOT ";
        Fits fits = Condition(line, 0);
        fits.flip();
        return fits;
      }
      default: {
        line += "(";
        const Fits fits = Any(line, depth - 1);
        line += ")";
        return fits;
      }
    }
  }

  Fits All(std::string& line, int depth) {
    Fits fits = Condition(line, depth);
    for (unsigned int left = Below(3); left > 0; --left) {
      line += Below(2) == 0 ? " " : " AND ";
      const Fits more = Condition(line, depth);
      for (size_t i = 0; i < fits.size(); ++i) fits[i] = fits[i] && more[i];
    }
    return fits;
  }

  Fits Any(std::string& line, int depth) {
    Fits fits = All(line, depth);
    for (unsigned int left = Below(3); left > 0; --left) {
      line += " OR ";
      const Fits more = All(line, depth);
      for (size_t i = 0; i < fits.size(); ++i) fits[i] = fits[i] || more[i];
    }
    return fits;
  }

  std::mt19937 random_{9};
  std::vector<std::string> texts_;
};

TEST_F(LineModel, FindsWhatThePartsOfALineFind) {
  for (int i = 0; i < 60; ++i) {
    std::string text;
    for (unsigned int left = Below(6); left > 0; --left) {
      text += std::string(" ") + static_cast<char>('p' + Below(4)) + " ";
    }
    texts_.push_back(text);
    Write(std::to_string(100 + i), text);
  }
  index_.Commit();
  for (int round = getenv("FILEINDEX_LONG") != nullptr ? 20000 : 500; round > 0; --round) {
    std::string line;
    const Fits fits = Any(line, 3);
    std::string expected;
    for (size_t i = 0; i < fits.size(); ++i) {
      if (fits[i]) expected += (expected.empty() ? "" : " ") + std::to_string(100 + i);
    }
    ASSERT_EQ(Found(line), expected) << line;
  }
}

}  // namespace
}  // namespace quarrox::elasticd
