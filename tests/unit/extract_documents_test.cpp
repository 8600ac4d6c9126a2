#include <sys/mman.h>
#include <unistd.h>

#include <cstdlib>
#include <functional>
#include <random>
#include <tuple>

#include <gtest/gtest.h>

#include "common/json.h"
#include "common/unique_fd.h"
#include "extract/formats.h"
#include "support/packed_files.h"
#include "support/temp_dir.h"
#include "vexo/content_extract.h"

namespace {

using namespace platform::extract;
using quarrox::support::Bytes;
using quarrox::support::Members;
using quarrox::support::Pack;
using quarrox::support::PackOle;

struct Document {
  const char* type;
  std::string bytes;
  const char* fields;  // as JSON
};

struct Found {
  Json::Value fields;
  std::string damage;

  std::string text() const { return fields["VEXOMDTextContent"].asString(); }
};

// Runs of blanks in the text are one, and none is around it.
std::string Squeezed(const std::string& text) {
  std::string squeezed;
  for (const char c : text) {
    const bool is_blank = c == ' ' || c == '\n' || c == '\t';
    if (!is_blank) squeezed.push_back(c);
    if (is_blank && !squeezed.empty() && squeezed.back() != ' ') squeezed.push_back(' ');
  }
  if (!squeezed.empty() && squeezed.back() == ' ') squeezed.pop_back();
  return squeezed;
}

Found Extract(const std::string& type, std::string_view bytes) {
  const quarrox::UniqueFd fd(memfd_create("document", MFD_CLOEXEC));
  EXPECT_EQ(write(fd.get(), bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
  Findings findings;
  Found found;
  try {
    FindExtractor(type)(Source{fd.get(), bytes.size(), type, ""}, findings);
  } catch (const std::exception& error) {
    found.damage = error.what();
  }
  found.fields = findings.Take();
  if (found.fields.isMember("VEXOMDTextContent")) found.fields["VEXOMDTextContent"] = Squeezed(found.text());
  return found;
}

std::string Repeated(const std::string& text, size_t count) {
  std::string all;
  for (size_t i = 0; i < count; ++i) all += text;
  return all;
}

const std::string kWordType = "application/vnd.openxmlformats-officedocument.wordprocessingml.document";
const std::string kOdtType = "application/vnd.oasis.opendocument.text";

std::string Docx(const std::string& body) {
  return Pack("zip", "none", {{"word/document.xml", "<w:document xmlns:w='w'>" + body + "</w:document>"}});
}

const char* const kCore =
    "<c:coreProperties xmlns:c='c' xmlns:d='d' xmlns:t='t'><d:title>A &amp; B</d:title><d:creator>Ann</d:creator>"
    "<c:keywords>k1, k2</c:keywords><d:description>About</d:description><d:subject>Topic</d:subject>"
    "<t:created>2020-03-04T06:06:07+01:00</t:created></c:coreProperties>";

// A file of objects, which a reader finds by itself where there is no table of them.
std::string Pdf(const std::string& pages, const std::string& content, const std::string& trailer) {
  return R"(%PDF-1.4
1 0 obj <</Type/Catalog/Pages 2 0 R>> endobj
2 0 obj <</Type/Pages)" +
         pages + R"(>> endobj
3 0 obj <</Type/Page/Parent 2 0 R/MediaBox[0 0 300 300]/Contents 4 0 R
  /Resources<</Font<</F 5 0 R>>/XObject<</X 7 0 R>>>>>> endobj
5 0 obj <</Type/Font/Subtype/Type1/BaseFont/Helvetica>> endobj
6 0 obj <</Title(Pdf T)/Author(Ann)/Subject(About)/Keywords(k1, k2)/Creator(By hand)
  /CreationDate(D:20200304060607+01'00')>> endobj
7 0 obj <</Type/XObject/Subtype/Form/BBox[0 0 9 9]/Resources<</XObject<</X 7 0 R>>>>/Length 5>> stream
/X Do
endstream endobj
4 0 obj <</Length )" +
         std::to_string(content.size()) + ">> stream\n" + content +
         "\nendstream endobj\ntrailer <</Root 1 0 R/Info 6 0 R" + trailer + ">>\n%%EOF\n";
}

std::string Summary() {
  const auto text = [](const std::string& value) { return Bytes(30, 4) + Bytes(value.size() + 1, 4) + value + '\0'; };
  const Members properties = {{"\1", Bytes(2, 4) + Bytes(1251, 4)},
                              {"\2", text("\xcf\xf0\xe8")},
                              {"\3", text("About")},
                              {"\4", text("Ann")},
                              {"\5", text("k1")},
                              {"\6", text("Remark")},
                              {"\14", Bytes(64, 4) + Bytes((uint64_t{1583298367} + 11'644'473'600) * 10'000'000, 8)},
                              {"\22", text("Word")}};
  std::string list;
  std::string values;
  for (const auto& [number, value] : properties) {
    list += Bytes(static_cast<unsigned char>(number[0]), 4) + Bytes(8 + 8 * properties.size() + values.size(), 4);
    values += value;
  }
  return std::string(44, '\0') + Bytes(48, 4) + Bytes(0, 4) + Bytes(properties.size(), 4) + list + values;
}

std::string WordFile(uint64_t flags) {
  const std::string text = "Old w\xe4rld\r";
  std::string head = Bytes(0xa5ec, 2) + Bytes(0xc1, 2) + std::string(6, '\0') + Bytes(flags, 2);
  head.resize(24);
  head += Bytes(1024, 4) + Bytes(1024 + text.size(), 4);
  head.resize(1024);
  return PackOle({{"WordDocument", head + text}, {"\5SummaryInformation", Summary()}});
}

std::string ExcelFile() {
  const auto record = [](uint64_t type, const std::string& data) {
    return Bytes(type, 2) + Bytes(data.size(), 2) + data;
  };
  const std::string end = record(0xa, "");
  return PackOle({{"Workbook", record(0x809, Bytes(0x50600, 16)) + end + record(0x809, Bytes(0x100600, 16)) +
                                   record(0x204, std::string(6, '\0') + Bytes(8, 2) + '\0' + "Cell one") + end}});
}

std::string PowerPointFile() {
  const auto record = [](uint64_t version, uint64_t type, const std::string& data) {
    return Bytes(version, 2) + Bytes(type, 2) + Bytes(data.size(), 4) + data;
  };
  return PackOle({{"PowerPoint Document", record(15, 1000, record(0, 0xfa8, "Slide one"))}});
}

std::vector<Document> MarkupDocuments() {
  return {
      {"text/html",
       "<!DOCTYPE html><html><head><meta http-equiv=x content='text/html; charset=ISO-8859-1'>"
       "<title>T\xeft &eacute;</title><meta name=Author content='Ann A'><meta name=keywords content='x, y'>"
       "<meta name=description content=About><meta name=generator content=vi><meta name=date content=2020-03-04>"
       "<style>b{}</style><script>'<p>no</p>'</script></head>"
       "<body>He<b>ll</b>o<p>W\xf6rld<table><td>cell<td>two</table>br<br>br",
       R"({"VEXOMDAuthors":"Ann A","VEXOMDContentCreationDate":1583280000,"VEXOMDCreator":"vi","VEXOMDDescription":"About",
       "VEXOMDKeywords":"x, y","VEXOMDTextContent":"Hello Wörld cell two br br","VEXOMDTitle":"Tït é"})"},
      {"text/html", std::string("\xff\xfe<\0p\0>\0\x41\x04<\0", 12), R"({"VEXOMDTextContent":"с"})"},
      {"text/html", "<!doctype html><title>T</title><main><h1>Hi</h1>there</main>",
       R"({"VEXOMDTextContent":"Hi there","VEXOMDTitle":"T"})"},
      {"text/html", "<script charset=utf-8 src=x></script><meta charset=windows-1251><p>\xcf\xf0 and more",
       R"({"VEXOMDTextContent":"Пр and more"})"},
      {"text/html", "<p>DEFAULT CHARSET=latin1 Grö", R"({"VEXOMDTextContent":"DEFAULT CHARSET=latin1 Grö"})"},
      {"application/xhtml+xml",
       "<?xml version='1.0' encoding='gb2312'?><html><script src='x'/><body>\xc4\xe3</body></html>",
       R"({"VEXOMDTextContent":"你"})"},
      {"text/xml", "<?xml version='1.0'?><a b='no'>one<b>two</b><![CDATA[<three>]]>&#228;</a>",
       R"({"VEXOMDTextContent":"one two <three>ä"})"},
      {"text/rtf",
       R"({\rtf1\ansi\ansicpg1252{\fonttbl{\f0\fcharset0 A;}{\f1\fcharset204 B;}}{\info{\title \u1055?r{\b i}}
       {\author Ann}{\subject About}{\keywords k1}{\doccomm Remark}{\creatim\yr2020\mo3\dy4\hr5\min6}
       {\operator no}}{\*\generator no;}\f0 w\'e4rld \u-10179?\u-8704?{\field{\*\fldinst{HYPERLINK "no"}}
       {\fldrslt{ li{\b nk}}}}{\footnote note}\trowd c1\cell c2\cell\row{\pict 8950}{\f1\'cf}\bin3 }}}x\par})",
       R"({"VEXOMDAuthors":"Ann","VEXOMDComment":"Remark","VEXOMDContentCreationDate":1583298360,"VEXOMDDescription":"About",
       "VEXOMDKeywords":"k1","VEXOMDTextContent":"wärld 😀 link note c1 c2 Пx","VEXOMDTitle":"Пri"})"},
  };
}

std::vector<Document> PackageDocuments() {
  return {
      {kWordType.c_str(),
       Pack("zip", "none",
            {{"docProps/core.xml", kCore},
             {"docProps/app.xml", "<P><Application>Pen</Application></P>"},
             {"word/header1.xml", "<h><p><t>Head</t></p></h>"},
             {"word/document.xml",
              "<d xmlns:w='w'><w:p><w:r><w:t>Hel</w:t></w:r><w:r><w:t>lo</w:t></w:r></w:p><w:p>"
              "<w:pos>17</w:pos><w:t>two</w:t></w:p></d>"}}),
       R"({"VEXOMDAuthors":"Ann","VEXOMDContentCreationDate":1583298367,"VEXOMDCreator":"Pen",
       "VEXOMDDescription":"About ; Topic","VEXOMDKeywords":"k1, k2","VEXOMDTextContent":"Hello two Head","VEXOMDTitle":"A & B"})"},
      {"application/vnd.openxmlformats-officedocument.presentationml.presentation",
       Pack("zip", "none",
            {{"ppt/slides/slide10.xml", "<s><p><t>ten</t></p></s>"},
             {"ppt/notesSlides/notesSlide1.xml", "<s><t>note</t></s>"},
             {"ppt/slides/slide2.xml", "<s><p><t>two</t></p></s>"}}),
       R"({"VEXOMDTextContent":"two ten note"})"},
      {"application/vnd.openxmlformats-officedocument.spreadsheetml.sheet",
       Pack("zip", "none",
            {{"xl/worksheets/sheet1.xml",
              "<w><c t='s'><v>0</v></c><c><v>4711</v></c><c t='inlineStr'><is><t>inl</t></is></c></w>"},
             {"xl/sharedStrings.xml", "<s><si><t>sha</t><t>red</t></si><si><t>more</t></si></s>"}}),
       R"({"VEXOMDTextContent":"shared more 4711 inl"})"},
      {kOdtType.c_str(),
       Pack("zip", "none",
            {{"meta.xml",
              "<m><title>Odt</title><initial-creator>Ann</initial-creator><creator>Bob</creator><keyword>a</keyword>"
              "<keyword>b</keyword><creation-date>2020-03-04T05:06:07.9</creation-date><generator>Pen</generator></m>"},
             {"content.xml", "<c><date>no</date><p>Hel<span>lo</span></p><p>a<s/>b<tab/>c</p></c>"}}),
       R"({"VEXOMDAuthors":"Ann ; Bob","VEXOMDContentCreationDate":1583298367,"VEXOMDCreator":"Pen","VEXOMDKeywords":"a ; b",
       "VEXOMDTextContent":"Hello a b c","VEXOMDTitle":"Odt"})"},
      {kOdtType.c_str(),
       Pack("zip", "none",
            {{"content.xml", "\x12\x34"}, {"META-INF/manifest.xml", "<m><f><encryption-data/></f></m>"}}),
       R"({"VEXOMDIsEncrypted":true})"},
      {"application/epub+zip",
       Pack("zip", "none",
            {{"O/a b.xhtml", "<html><body>second</body></html>"},
             {"O/z.xhtml", "<html><head><title>no</title></head><body>first</body></html>"},
             {"O/c.opf",
              "<p><title>Book</title><creator>Ann</creator><creator>Bob</creator><identifier>urn:1</identifier>"
              "<publisher>House</publisher><date>2019</date><description>About</description><subject>k</subject>"
              "<item id='1' href='z.xhtml'/><item id='2' href='a%20b.xhtml'/>"
              "<itemref idref='1'/><itemref idref='2'/></p>"}}),
       R"({"VEXOMDAuthors":"Ann ; Bob","VEXOMDContentCreationDate":1546300800,"VEXOMDCreator":"House","VEXOMDDescription":"About",
       "VEXOMDIdentifier":"urn:1","VEXOMDKeywords":"k","VEXOMDTextContent":"first second","VEXOMDTitle":"Book"})"},
  };
}

std::vector<Document> BinaryDocuments() {
  const std::string lock = "/ID[(0123456789abcdef)(0123456789abcdef)]/Encrypt<</Filter/Standard/V 1/R 2/P -4/O(" +
                           std::string(32, 'o') + ")/U(" + std::string(32, 'u') + ")>>";
  return {
      {"application/pdf", Pdf("/Kids[3 0 R]/Count 1", "BT /F 12 Tf 9 99 Td (Hello PDF) Tj ET /X Do", ""),
       R"({"VEXOMDAuthors":"Ann","VEXOMDContentCreationDate":1583298367,"VEXOMDCreator":"By hand","VEXOMDDescription":"About",
       "VEXOMDKeywords":"k1, k2","VEXOMDTextContent":"Hello PDF","VEXOMDTitle":"Pdf T"})"},
      {"application/pdf", Pdf("/Kids[3 0 R]/Count 1", "", lock), R"({"VEXOMDIsEncrypted":true})"},
      {"application/msword", WordFile(0),
       R"({"VEXOMDAuthors":"Ann","VEXOMDComment":"Remark","VEXOMDContentCreationDate":1583298367,"VEXOMDCreator":"Word",
       "VEXOMDDescription":"About","VEXOMDKeywords":"k1","VEXOMDTextContent":"Old wärld","VEXOMDTitle":"При"})"},
      {"application/vnd.ms-excel", ExcelFile(), R"({"VEXOMDTextContent":"Cell one"})"},
      {"application/x-ole-storage", PowerPointFile(), R"({"VEXOMDTextContent":"Slide one"})"},
      {"application/encrypted", PackOle({{"EncryptedPackage", ""}}), R"({"VEXOMDIsEncrypted":true})"},
  };
}

const char* const kMail = R"(From: =?utf-8?q?J=C3=B6rg?= <j@x.org>
To: a@b.c
Cc: d@e.f
Subject: =?utf-8?B?SGVsbMO2?=
Date: Wed, 04 Mar 2020 06:06:07 +0100
Message-ID: <1@x>
X-Mailer: Pen
Content-Type: multipart/mixed; boundary=q

--q
Content-Type: multipart/alternative; boundary=r

--r
Content-Type: text/plain; charset=iso-8859-1
Content-Transfer-Encoding: quoted-printable

plain w=F6rd
--r
Content-Type: text/html

<p>no
--r--
--q
Content-Type: text/html; charset=utf-8

<meta charset=iso-8859-1><p>on<b>lä</b>
--q
Content-Type: image/png
Content-Disposition: attachment; filename="att.png"
Content-Transfer-Encoding: base64

AAAA
--q--
)";

std::vector<Document> MailAndArchives() {
  const Members members = {{"../up.txt", "x"}, {"d/\xc3\xa4.txt", "y"}};
  const char* const names = R"({"VEXOMDTextContent":"../up.txt d/ä.txt"})";
  return {
      {"message/rfc822", kMail,
       R"({"VEXOMDAuthors":"Jörg <j@x.org>","VEXOMDContentCreationDate":1583298367,"VEXOMDCreator":"Pen",
       "VEXOMDIdentifier":"1@x","VEXOMDTextContent":"Hellö Jörg <j@x.org> a@b.c d@e.f plain wörd onlä att.png","VEXOMDTitle":"Hellö"})"},
      {"application/mbox",
       "From a@b Mon Jan  1 00:00:00 2020\nFrom: a@b\nSubject: s1\n\nhi\n\nFrom a@c Mon Jan  1 00:00:00 2020\n"
       "From: a@c\nSubject: s2\n\nho\n",
       R"({"VEXOMDTextContent":"s1 a@b hi s2 a@c ho"})"},
      {"application/zip", Pack("zip", "none", members), names},
      {"application/x-7z-compressed", Pack("7zip", "none", members), names},
      {"application/x-cpio", Pack("newc", "none", members), names},
      {"application/x-xz", Pack("gnutar", "xz", members), names},
      {"application/x-tar", Pack("gnutar", "none", {{"a\xff.zip", Pack("zip", "none", members)}}),
       R"({"VEXOMDTextContent":"a�.zip"})"},
      {"application/gzip", Pack("raw", "gzip", {{"", "zwei W\xf6rter und \xe4hnliches"}}),
       R"({"VEXOMDTextContent":"zwei Wörter und ähnliches"})"},
  };
}

const std::vector<Document>& Documents() {
  static const std::vector<Document> documents = [] {
    std::vector<Document> all;
    for (const auto& make : {MarkupDocuments, PackageDocuments, BinaryDocuments, MailAndArchives}) {
      for (Document& document : make()) all.push_back(std::move(document));
    }
    return all;
  }();
  return documents;
}

}  // namespace

TEST(ExtractDocuments, FindsTextAndFieldsOfEachFormat) {
  for (const Document& document : Documents()) {
    const Found found = Extract(document.type, document.bytes);
    Json::Value expected;
    ASSERT_TRUE(quarrox::fromString(expected, document.fields)) << document.fields;
    EXPECT_EQ(quarrox::toString(found.fields), quarrox::toString(expected)) << document.type;
    EXPECT_EQ(found.damage, "") << document.type;
  }
}

// Where no file may be opened, and nothing be written but memory.
TEST(ExtractDocuments, AreReadByOtherProgramsInsideTheSandbox) {
  const quarrox::support::TempDir dir;
  Json::Value options(Json::objectValue);
  options["need_meta"] = true;
  const std::tuple<const char*, std::string, const char*> kFiles[] = {{"a.doc", WordFile(0), "Old w\xc3\xa4rld"},
                                                                      {"a.xls", ExcelFile(), "Cell one"},
                                                                      {"a.ppt", PowerPointFile(), "Slide one"}};
  for (const auto& [name, bytes, text] : kFiles) {
    quarrox::support::WriteText(dir / name, bytes);
    Json::Value document(Json::objectValue);
    VEXO::CONTENT_EXTRACT::ParseFile(dir / name, options, document);
    EXPECT_EQ(Squeezed(document["VEXOMDTextContent"].asString()), text) << name;
  }
}

TEST(ExtractDocuments, SurviveWhateverIsCutOffOrChanged) {
  const size_t count = getenv("FILEINDEX_LONG") == nullptr ? 100 : 1000;
  std::mt19937 random(1);
  for (const Document& document : Documents()) {
    for (size_t i = 0; i < count; ++i) {
      Extract(document.type, document.bytes.substr(0, document.bytes.size() * i / count));
      std::string changed = document.bytes;
      for (size_t bits = 1 + i % 3; bits > 0; --bits)
        changed[random() % changed.size()] ^= static_cast<char>(1U << random() % 8);
      Extract(document.type, changed);
    }
  }
}

TEST(ExtractDocuments, KeepWhatWasFoundBeforeDamage) {
  const Found page = Extract("text/xml", "<a>one<b>two</a>");
  EXPECT_EQ(page.text(), "one two");
  EXPECT_EQ(page.damage, "not well-formed XML");
  const Found word =
      Extract(kWordType, Pack("zip", "none", {{"word/document.xml", "<a><t>one</b>"}, {"docProps/core.xml", kCore}}));
  EXPECT_EQ(word.text(), "one");
  EXPECT_EQ(word.fields["VEXOMDTitle"], "A & B");
  EXPECT_EQ(word.damage, "not well-formed XML");
  const Found old =
      Extract("application/msword", PackOle({{"WordDocument", "x"}, {"\5SummaryInformation", Summary()}}));
  EXPECT_EQ(old.fields["VEXOMDAuthors"], "Ann");
  EXPECT_EQ(Extract("application/pdf", "%PDF-1.4 nothing").damage, "damaged PDF");
  EXPECT_FALSE(Extract("application/zip", "PK no").damage.empty());
  EXPECT_EQ(Extract("application/msword", WordFile(0x100)).fields["VEXOMDIsEncrypted"], true);
}

TEST(ExtractDocuments, ExpandNoEntityAndFetchNothing) {
  std::string entities =
      "<!ENTITY e0 'lol'><!ENTITY f SYSTEM 'file:///etc/passwd'><!ENTITY % p SYSTEM 'file:///etc/passwd'>%p;";
  for (int i = 1; i < 10; ++i) {
    entities += "<!ENTITY e" + std::to_string(i) + " '" + Repeated("&e" + std::to_string(i - 1) + ";", 10) + "'>";
  }
  const std::string bomb = "<!DOCTYPE t [" + entities + "]><t a='&e9;'>one &e9; &f; two</t>";
  EXPECT_EQ(Extract("text/xml", bomb).text(), "one two");
  EXPECT_EQ(Extract(kWordType, Pack("zip", "none", {{"word/document.xml", bomb}})).text(), "one two");
}

TEST(ExtractDocuments, EndWhereThereIsNoEnd) {
  EXPECT_EQ(Extract("text/html", "<p>one" + Repeated("<b>", 200'000) + Repeated("</i>", 200'000)).damage,
            "elements are nested too deeply");
  EXPECT_FALSE(Extract("text/xml", "<a>one" + Repeated("<a>", 200'000)).damage.empty());
  EXPECT_EQ(Extract("text/rtf", "{\\rtf1 one" + Repeated("{", 200'000)).damage, "groups are nested too deeply");
  EXPECT_EQ(Extract("text/html", "<p>one" + Repeated("&", 1 << 20)).text().size(), 3U + (1 << 20));
  std::string mail = "Subject: one\n";
  for (int i = 0; i < 5000; ++i) {
    const std::string boundary = "b" + std::to_string(i);
    mail += "Content-Type: multipart/mixed; boundary=" + boundary + "\n\n--" + boundary + "\n";
  }
  EXPECT_EQ(Extract("message/rfc822", mail).fields["VEXOMDTitle"], "one");
  for (const char* const pages :
       {"/Kids[2 0 R]/Count 1", "/Kids[2 0 R 3 0 R 2 0 R]/Count 99999999", "/Kids[3 0 R]/Count -1"}) {
    Extract("application/pdf", Pdf(pages, "BT /F 12 Tf (x) Tj ET /X Do", ""));
  }
  std::string cyclic = PackOle({{"\5SummaryInformation", Summary()}});
  for (size_t at = cyclic.size() - 512; at < cyclic.size(); at += 4) cyclic.replace(at, 4, Bytes(0, 4));
  EXPECT_EQ(Extract("application/msword", cyclic).text(), "");
}

TEST(ExtractDocuments, UnpackOnlySoMuchOfAnArchive) {
  const std::string huge((size_t{256} << 20) + (1 << 20), '\0');
  EXPECT_EQ(Extract("application/gzip", Pack("gnutar", "gzip", {{"huge", huge}, {"after", ""}})).text(), "huge");
  const std::string blanks(size_t{65} << 20, ' ');
  const Found word = Extract(kWordType, Docx("<w:t>one</w:t>" + blanks + "<w:t>two</w:t>"));
  EXPECT_EQ(word.text(), "one");
  EXPECT_EQ(word.damage, "not well-formed XML");
  std::string matryoshka = "text";
  for (int i = 0; i < 40; ++i) matryoshka = Pack("raw", "gzip", {{"", matryoshka}});
  EXPECT_EQ(Extract("application/gzip", matryoshka).text(), "");
  const Found many = Extract("application/x-tar", Pack("ustar", "none", Members(100'001, {"n", ""})));
  EXPECT_EQ(many.text().size(), 2U * 100'000 - 1);
}

TEST(ExtractDocuments, KeepNoMoreTextThanIsKept) {
  const std::string words = Repeated("word ", 1 << 20);
  for (const auto& [type, bytes] : Members{{"text/html", "<p>" + words},
                                           {"text/xml", "<p>" + words + "</p>"},
                                           {"text/rtf", "{\\rtf1 " + words + "}"},
                                           {kWordType, Docx("<w:t>" + words + "</w:t>")},
                                           {"message/rfc822", "Subject: x\n\n" + words},
                                           {"application/gzip", Pack("raw", "gzip", {{"", words}})}}) {
    const Found found = Extract(type, bytes);
    EXPECT_LE(found.text().size(), platform::kLongestText) << type;
    EXPECT_GT(found.text().size(), platform::kLongestText - 100) << type;
    EXPECT_EQ(found.damage, "") << type;
  }
}
