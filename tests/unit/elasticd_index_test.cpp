#include <map>
#include <random>
#include <set>

#include <gtest/gtest.h>

#include "common/json.h"
#include "elasticd/document_change.h"
#include "elasticd/error_code.h"
#include "elasticd/fields.h"
#include "elasticd/index.h"
#include "fileindex/elastic_control.h"
#include "support/answer_text.h"
#include "support/temp_dir.h"

namespace quarrox::elasticd {
namespace {

using Paths = std::multiset<std::string>;

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

// An index and what it should hold, path by path.
class IndexModel : public ::testing::Test {
 protected:
  void Reopen() {
    if (index_) index_->Close();
    index_ = std::make_unique<Index>(directory_.path() + "/db", fileindex::elastic::GetFileIndexMappings(), false);
    EXPECT_FALSE(index_->NeedsRecovery());
    index_->Create();
  }

  Paths Find(const std::string& qsl) {
    SearchRequest request;
    request.qsl = Parse(qsl);
    request.load_fields = {"VEXOMDPath"};
    Answer answer(directory_.path());
    index_->Find(request, answer);
    Paths paths;
    const Json::Value found = Parse("{\"data\":" + Read(answer) + "}");
    for (const Json::Value& hit : found["data"]) {
      paths.insert(hit["VEXOMDPath"].asString());
    }
    return paths;
  }

  template <typename Fits>
  Paths Expected(Fits fits) {
    Paths paths;
    for (const auto& [path, fields] : documents_) {
      if (fits(path, fields)) paths.insert(path);
    }
    return paths;
  }

  int Below(int end) { return std::uniform_int_distribution<int>(0, end - 1)(random_); }

  std::string AnyPath() {
    static const std::string kNames[] = {
        "a", "b", "ab", "Ab c", std::string(250, 'n') + "1", "\xff\xc3(", std::string(250, 'n') + "2"};
    std::string path = "/v";
    for (int left = 1 + Below(4); left > 0; --left) path += '/' + kNames[Below(7)];
    return path;
  }

  std::string KnownPath() {
    if (documents_.empty()) return AnyPath();
    return std::next(documents_.begin(), Below(static_cast<int>(documents_.size())))->first;
  }

  Json::Value AnyFields(const std::string& path) {
    Json::Value fields(Json::objectValue);
    fields["VEXOMDPath"] = path;
    fields["VEXOMDSearchFileName"] = path.substr(path.rfind('/') + 1);
    if (Below(2) == 0) fields["VEXOMDTitle"] = std::string("Word") + static_cast<char>('p' + Below(3)) + " und";
    if (Below(2) == 0)
      fields["VEXOMDTextContent"] =
          std::string(static_cast<size_t>(Below(3)) * 400, '.') + " text of " + std::to_string(Below(9));
    fields["VEXOMDFSSize"] = Below(5);
    return fields;
  }

  void Step() {
    switch (Below(8)) {
      case 0:
      case 1: {
        const std::string path = AnyPath();
        Json::Value fields = documents_[path] = AnyFields(path);
        index_->Accept(path, fields, [] {});
        if (Below(2) == 0) index_->Settle([] {});
        return;
      }
      case 2: {
        const std::string path = KnownPath();
        Json::Value fields = AnyFields(path);
        if (Below(3) == 0) fields["VEXOMDTitle"] = Json::Value();
        if (documents_.count(path) == 0) return;
        for (const std::string& name : fields.getMemberNames()) documents_[path][name] = fields[name];
        return index_->Set(path, fields);
      }
      case 3:
        return Move(KnownPath(), Below(2) == 0 ? AnyPath() : KnownPath());
      case 4: {
        const std::string path = Below(2) == 0 ? KnownPath() : AnyPath();
        documents_.erase(path);
        return index_->Remove(path);
      }
      case 5: {
        std::string prefix = AnyPath();
        prefix += Below(2) == 0 ? "/" : "";
        std::erase_if(documents_, [&](const auto& entry) { return entry.first.starts_with(prefix); });
        Json::Value qsl;
        qsl["prefix"]["VEXOMDPath"] = prefix;
        return index_->RemoveMatching(qsl);
      }
      case 6:
        return index_->Commit();
      default:
        if (Below(4) == 0) Reopen();
    }
  }

  void Move(const std::string& from, const std::string& to) {
    Json::Value fields;
    fields["VEXOMDPath"] = to;
    fields["VEXOMDSearchFileName"] = to.substr(to.rfind('/') + 1);
    if (documents_.count(from) == 0) {
      EXPECT_THROW(index_->Set(from, fields), Error);
      return;
    }
    Json::Value document = documents_[from];
    for (const std::string& name : fields.getMemberNames()) document[name] = fields[name];
    documents_.erase(from);
    documents_[to] = document;
    index_->Set(from, fields);
  }

  void CompareAccepted() {
    const auto all = [](const auto&...) { return true; };
    ASSERT_EQ(Expected(all), Find(R"({"prefix":{"VEXOMDPath":"/"}})"));
    const std::string prefix = AnyPath();
    Json::Value qsl;
    qsl["prefix"]["VEXOMDPath"] = prefix;
    ASSERT_EQ(Expected([&](const std::string& path, const auto&) { return path.starts_with(prefix); }),
              Find(toString(qsl)));
  }

  void CompareCommitted() {
    index_->Commit();
    const auto title = [](const char* word) {
      return
          [word](const auto&, const Json::Value& fields) { return fields["VEXOMDTitle"].asString().find(word) == 0; };
    };
    ASSERT_EQ(Expected(title("Wordp")), Find(R"({"match":{"_all":"WORDP und"}})"));
    ASSERT_EQ(Expected(title("Wordq")), Find(R"({"match":{"VEXOMDTitle":"wordq"}})"));
    ASSERT_EQ(Expected([](const auto&, const Json::Value& f) { return f["VEXOMDFSSize"].asInt() >= 3; }),
              Find(R"({"range":{"VEXOMDFSSize":{"gte":3}}})"));
    ASSERT_EQ(
        Expected([](const auto&, const Json::Value& f) { return f["VEXOMDTextContent"].asString().ends_with(" 7"); }),
        Find(R"({"match":{"VEXOMDTextContent":"text 7"}})"));
    ASSERT_EQ(
        Expected([](const std::string& path, const auto&) { return path.ends_with("b") || path.ends_with("b c"); }),
        Find(R"({"match":{"VEXOMDSearchFileName":"B"}})"));
    ASSERT_EQ(Expected([](const std::string& path, const auto&) { return path.starts_with("/v/ab/"); }),
              Find(R"({"bool":{"must":[{"prefix":{"VEXOMDPath":"/v/ab/"}}]}})"));
    ASSERT_EQ(
        Expected([](const std::string& path, const auto&) { return path.rfind('/') == 4 && path.starts_with("/v/b"); }),
        Find(R"({"term":{"VEXOMDParent":"/v/b"}})"));
  }

  support::TempDir directory_;
  std::unique_ptr<Index> index_;
  std::map<std::string, Json::Value> documents_;
  std::mt19937 random_{20};
};

TEST_F(IndexModel, HoldsWhatAModelOfItHolds) {
  const int rounds = getenv("FILEINDEX_LONG") != nullptr ? 300 : 12;
  for (int round = 0; round < rounds; ++round) {
    if (index_) index_->Delete();
    documents_.clear();
    Reopen();
    for (int step = 0; step < 120; ++step) {
      Step();
      if (step % 10 == 0) CompareAccepted();
      if (step % 30 == 29) CompareCommitted();
      if (HasFatalFailure()) return;
    }
  }
}

TEST(Fields, WhenADocumentWasMadeIsKeptBesideItsFieldsAndUnknownOfOlderOnes) {
  const support::TempDir directory;
  Writer writer(directory.path() + "/db", Writer::kCreate);
  const Mapping mapping(fileindex::elastic::GetFileIndexMappings());
  const PathFields path_fields(mapping);
  const Json::Value fields = Parse(R"({"VEXOMDTitle":"four","VEXOMDSearchFileName":"a","VEXOMDFSSize":7})");
  const auto show = [&](const std::vector<std::string>& names) {
    return ShowFields(writer, mapping, path_fields, 1, "/v", "a", names);
  };
  for (const int64_t time : {int64_t{0}, int64_t{1}, int64_t{0x7d7d7d01}, int64_t{0xffffffff}}) {
    KeptFields kept = PartFields(fields, path_fields);
    kept.indexed = time;
    SaveFields(writer, 1, kept, Texts::kBoth);
    const FieldChange change = ChangeFields(writer, 1, path_fields, Parse(R"({"VEXOMDFSSize":8})"), "a", "a");
    SaveFields(writer, 1, change.kept, change.texts);
    EXPECT_EQ(show({"VEXOMDFSSize", kIndexedField}).get(kIndexedField, 0).asInt64(), time);
    EXPECT_EQ(show({kTextBytesField})[kTextBytesField].asUInt64(), 4U);
    EXPECT_EQ(show({}).isMember(kIndexedField) || show({}).isMember(kTextBytesField), false);
  }
}

}  // namespace
}  // namespace quarrox::elasticd
