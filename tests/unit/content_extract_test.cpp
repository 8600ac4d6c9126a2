#include "vexo/content_extract.h"

#include <iconv.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <system_error>
#include <thread>

#include <gtest/gtest.h>

#include "support/temp_dir.h"

using quarrox::support::TempDir;
using quarrox::support::WriteText;

static Json::Value Parse(const std::string& path) {
  Json::Value options;
  options["need_meta"] = true;
  Json::Value document;
  VEXO::CONTENT_EXTRACT::ParseFile(path, options, document);
  return document;
}

static std::string Encoded(std::string text, const char* encoding) {
  const iconv_t converter = iconv_open(encoding, "UTF-8");
  std::string out(4 * text.size() + 16, '\0');
  char* from = text.data();
  char* to = out.data();
  size_t from_size = text.size();
  size_t to_size = out.size();
  EXPECT_EQ(iconv(converter, &from, &from_size, &to, &to_size), 0U) << encoding;
  iconv(converter, nullptr, nullptr, &to, &to_size);
  iconv_close(converter);
  return out.substr(0, out.size() - to_size);
}

TEST(ContentExtract, DescribesWhateverAPathNamesAndReadsText) {
  const TempDir dir;
  const auto parse = [&](const std::string& name, const std::string& content) {
    if (!content.empty()) WriteText(dir / name, content);
    return Parse(dir / name);
  };
  EXPECT_TRUE(mkfifo((dir / "pipe").c_str(), 0640) == 0 && parse("pipe", "")["VEXOMDKind"] == "other");
  EXPECT_EQ(Parse("/dev/zero")["VEXOMDKind"], "other");
  EXPECT_TRUE(symlink("pipe", (dir / "link").c_str()) == 0 && parse("link", "")["VEXOMDKind"] == "link");
  const std::string zeros("a\0b\xff", 4);
  for (const std::string& no_text : {zeros, std::string(100000, 'a') + zeros,
                                     "\x7f"
                                     "ELF" +
                                         zeros}) {
    EXPECT_FALSE(parse("f", no_text).isMember("VEXOMDTextContent"));
  }
  // The cut would fall into the middle of the last character.
  const std::string kept((4 << 20) - 1, 'y');
  const Json::Value document = parse("\xff.TXT", "\xef\xbb\xbf" + kept + "\xc3\xa4zz");
  EXPECT_TRUE(document["VEXOMDTextContent"] == kept && document["VEXOMDFSName"] == "\xff.TXT");
  // What looks like a format that is parsed goes another way, and comes back as the text that it is.
  for (const char* name : {"empty.xml", "tag\xff", "x.eml"}) {
    EXPECT_EQ(parse(name, " <no tag\n")["VEXOMDTextContent"].asString().substr(0, 8), " <no tag") << name;
  }
  EXPECT_EQ(VEXO::CONTENT_EXTRACT::LastFailure(), "");
  EXPECT_TRUE(mkdir((dir / "real").c_str(), 0700) == 0 && symlink("real", (dir / "alias").c_str()) == 0);
  WriteText(dir / "real/f", "text");
  EXPECT_THROW(parse("alias/f", ""), std::system_error);  // who may make links is not followed elsewhere
  EXPECT_THROW(parse("missing", ""), std::system_error);
  EXPECT_EQ(VEXO::CONTENT_EXTRACT::LastFailure(), "No such file or directory");
  EXPECT_THROW(parse("f/below", ""), std::system_error);
  EXPECT_EQ(VEXO::CONTENT_EXTRACT::LastFailure(), "Not a directory");
}

TEST(ContentExtract, WhatMayNotBeReadHasNoTextAndWhatMayNotBeSeenFails) {
  const TempDir dir;
  WriteText(dir / "secret", "gr\xfc\xdf");
  ASSERT_TRUE(chmod((dir / "secret").c_str(), 0) == 0 && mkdir((dir / "closed").c_str(), 0) == 0);
  chmod(dir.path().c_str(), 0755);
  const pid_t child = fork();
  if (child == 0) {
    const bool is_nobody = geteuid() != 0 || setresuid(65534, 65534, 65534) == 0;
    bool failed = false;
    try {
      Parse(dir / "closed/file");
    } catch (const std::system_error& error) {
      failed = error.code().value() == EACCES && VEXO::CONTENT_EXTRACT::LastFailure() == "Permission denied";
    }
    const bool has_text = Parse(dir / "secret").isMember("VEXOMDTextContent");
    _exit(is_nobody && failed && !has_text && VEXO::CONTENT_EXTRACT::LastFailure().empty() ? 0 : 1);
  }
  int status = -1;
  EXPECT_TRUE(waitpid(child, &status, 0) == child && status == 0) << status;
  chmod((dir / "closed").c_str(), 0700);
}

TEST(ContentExtract, ReadsTextInItsEncoding) {
  const TempDir dir;
  const std::string german =
      "Im Frühjahr öffnen die Gärten von Köln ihre Tore. Über die Straße geht es zum größten Café der Stadt, wo man "
      "süße "
      "Törtchen und Äpfel bekommt.\n";
  const std::string russian =
      "Весной в городе открываются сады, и люди выходят на улицы. Дети играют во дворе, а старики сидят на скамейках и "
      "рассказывают истории.\n";
  const std::string greek =
      "Την άνοιξη ανοίγουν οι κήποι της πόλης και οι άνθρωποι βγαίνουν στους δρόμους. Τα παιδιά παίζουν στην αυλή.\n";
  const std::string japanese =
      "春になると町の庭が開き、人々は通りに出てきます。子どもたちは中庭で遊び、お年寄りはベンチに座って昔の話をしていま"
      "す。\n";
  const std::string simplified =
      "春天来了，城里的花园都开放了，人们纷纷走上街头。孩子们在院子里玩耍，老人们坐在长椅上讲故事。\n";
  const std::string traditional =
      "春天來了，城裡的花園都開放了，人們紛紛走上街頭。孩子們在院子裡玩耍，老人們坐在長椅上講故事。\n";
  const std::string korean =
      "봄이 오면 도시의 정원이 열리고 사람들은 거리로 나옵니다. 아이들은 마당에서 놀고 노인들은 벤치에 앉아 이야기를 "
      "나눕니다.\n";
  const std::pair<const char*, std::string> cases[] = {
      {"ISO-8859-1", german},    {"WINDOWS-1252", german + "„Ja“ – 5 €\n"},
      {"UTF-16", german},        {"UTF-32", german},
      {"WINDOWS-1251", russian}, {"KOI8-R", russian},
      {"ISO-8859-5", russian},   {"IBM866", russian},
      {"ISO-8859-7", greek},     {"SHIFT_JIS", japanese},
      {"EUC-JP", japanese},      {"ISO-2022-JP", japanese},
      {"GB18030", simplified},   {"BIG5", traditional},
      {"EUC-KR", korean}};
  for (const auto& [encoding, text] : cases) {
    for (const std::string& before : {std::string(), std::string(200000, '-') + "\n"}) {
      WriteText(dir / "text", Encoded(before + text, encoding));
      EXPECT_EQ(Parse(dir / "text")["VEXOMDTextContent"].asString(), before + text) << encoding;
    }
  }
  // The cap holds for what is converted, too.
  std::string long_text;
  while (long_text.size() < 5U << 20) long_text += german;
  WriteText(dir / "text", Encoded(long_text, "ISO-8859-1"));
  const std::string kept = Parse(dir / "text")["VEXOMDTextContent"].asString();
  EXPECT_TRUE(kept.size() > (4U << 20) - 4 && kept.size() <= 4U << 20 && long_text.starts_with(kept)) << kept.size();
}

TEST(ContentExtract, AFileThatChangesAndVanishesFailsAtMostItself) {
  const TempDir dir;
  std::atomic<bool> done = false;
  std::thread writer([&] {
    for (unsigned int i = 0; !done; ++i) {
      if (i % 3 == 0) WriteText(dir / "file", std::string(i * 999 % 300000, '\xfc'));
      if (i % 3 == 1) truncate((dir / "file").c_str(), 9) == 0 ? void() : std::this_thread::yield();
      if (i % 3 == 2) unlink((dir / "file").c_str());
    }
  });
  for (int i = 0; i < 300; ++i) {
    try {
      Parse(dir / "file");
    } catch (const std::system_error& error) {
      EXPECT_EQ(error.code().value(), ENOENT) << error.what();
    }
  }
  done = true;
  writer.join();
  WriteText(dir / "file", "gr\xfc\xdf");
  EXPECT_EQ(Parse(dir / "file")["VEXOMDTextContent"], "grüß");
}

TEST(ContentExtract, AForkedProcessHasReadersOfItsOwn) {
  const TempDir dir;
  const std::string text = Encoded("größer", "ISO-8859-1");
  WriteText(dir / "text", text);
  const auto is_read = [&] {
    for (int i = 0; i < 50; ++i) {
      if (Parse(dir / "text")["VEXOMDTextContent"] != "größer") return false;
    }
    return true;
  };
  EXPECT_TRUE(is_read());
  const pid_t child = fork();
  if (child == 0) _exit(is_read() ? 0 : 1);
  EXPECT_TRUE(is_read());
  int status = -1;
  EXPECT_TRUE(waitpid(child, &status, 0) == child && status == 0) << status;
}
