#include "vexo/content_extract.h"

#include <sys/stat.h>

#include <gtest/gtest.h>

#include "support/temp_dir.h"

TEST(ContentExtract, DescribesWhateverAPathNamesAndReadsOnlyPlainText) {
  const quarrox::support::TempDir dir;
  Json::Value options;
  options["need_meta"] = true;
  const auto parse = [&](const std::string& name, const std::string& content, Json::Value document = {}) {
    if (!content.empty()) quarrox::support::WriteText(dir / name, content);
    VEXO::CONTENT_EXTRACT::ParseFile(dir / name, options, document);
    return document;
  };
  EXPECT_TRUE(mkfifo((dir / "pipe").c_str(), 0640) == 0 && parse("pipe", "")["VEXOMDKind"] == "other");
  for (const char* no_text : {"\xff", "cut \xc3"}) EXPECT_FALSE(parse("f", no_text).isMember("VEXOMDTextContent"));
  EXPECT_FALSE(parse("f", std::string("a\0b", 3)).isMember("VEXOMDTextContent"));
  // The cut would fall into the middle of the last character.
  const std::string kept((4 << 20) - 1, 'y');
  const Json::Value document = parse("\xff.TXT", "\xef\xbb\xbf" + kept + "\xc3\xa4zz");
  EXPECT_TRUE(document["VEXOMDTextContent"] == kept && document["VEXOMDFSName"] == "\xff.TXT");
  EXPECT_THROW(parse("missing", ""), std::system_error);
}
