// Listings of documents, read as text.
#include "fileindex/index_rows.h"

#include <vector>

#include <gtest/gtest.h>

#include "common/json.h"

namespace quarrox::fileindex {
namespace {

std::vector<ListedDocument> Read(const std::string& response, bool* is_read, size_t* elements) {
  std::vector<ListedDocument> documents;
  *is_read = ReadListing(
      response, [&](ListedDocument&& document) { documents.push_back(std::move(document)); }, *elements);
  return documents;
}

TEST(ListingTest, GivesWhatTheEngineSaysWhateverTheNames) {
  const std::vector<std::string> paths = {"/v/s/a", "/v/s/\xff\xfe", "/v/s/\"\\\n\t", "/v/s/\xc3\xa4 \xf0\x9f\x98\x80",
                                          "/v/s/{[]},:"};
  Json::Value response(Json::objectValue);
  response["success"] = true;
  for (size_t i = 0; i < paths.size(); ++i) {
    Json::Value element(Json::objectValue);
    element["VEXOMDPath"] = paths[i];
    element["VEXOMDFSSize"] = Json::Int64{int64_t{1} << (10 * i)};
    element["VEXOMDFSContentChangeDate"] = -5;  // before the epoch
    if (i != 0) element["VEXOMDAttributeChangeDate"] = 7;
    element["VEXOMDIsDir"] = i == 2;
    element["VEXOMDOther"] = "text";
    response["data"].append(element);
  }
  response["data"].append(Json::Value(Json::objectValue));  // has no path, but takes its place in the page
  response["total"] = 6;
  bool is_read = false;
  size_t elements = 0;
  const std::vector<ListedDocument> documents = Read(toString(response), &is_read, &elements);
  ASSERT_TRUE(is_read);
  EXPECT_EQ(elements, paths.size() + 1);
  ASSERT_EQ(documents.size(), paths.size());
  for (size_t i = 0; i < paths.size(); ++i) {
    EXPECT_EQ(documents[i].path, paths[i]);
    EXPECT_EQ(documents[i].size, int64_t{1} << (10 * i));
    EXPECT_EQ(documents[i].changed, -5);
    EXPECT_EQ(documents[i].attributes_changed, i != 0 ? 7 : -1);
    EXPECT_EQ(documents[i].is_directory, i == 2);
  }
}

TEST(ListingTest, LeavesWhatIsNoPlainListingToTheParser) {
  const char* const kOthers[] = {
      R"({"success":false,"error":{"code":610,"msg":"paused"}})",
      R"({"success":true})",
      R"({"success":true,"data":5})",
      R"({"success":true,"data":{}})",
      R"({"success":true,"data":[5]})",
      R"({"success":true,"data":[[]]})",
      R"({"success":true,"other":[],"data":[]})",
      R"({"success":true,"data":[{"VEXOMDPath":["/a"]}]})",
      R"({"success":true,"data":[{"VEXOMDPath":"/a","VEXOMDFSSize":1.5}]})",
      R"({"success":true,"data":[{"VEXOMDPath":"/a"}])",
      R"({"data":[]})",
      "",
  };
  for (const char* other : kOthers) {
    bool is_read = true;
    size_t elements = 0;
    Read(other, &is_read, &elements);
    EXPECT_FALSE(is_read) << other;
  }
}

}  // namespace
}  // namespace quarrox::fileindex
