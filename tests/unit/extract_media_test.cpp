// Sound, video and pictures as other programs write them: what is found in them, and that nothing hurts.
#include <fcntl.h>
#include <magic.h>
#include <sys/mman.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cmath>
#include <cstdlib>
#include <ctime>
#include <exception>
#include <filesystem>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "common/json.h"
#include "common/unique_fd.h"
#include "extract/extended_attributes.h"
#include "extract/formats.h"
#include "extract/media_values.h"
#include "support/temp_dir.h"

namespace platform::extract {
namespace {

using quarrox::support::TempDir;

constexpr const char* kMakeCorpus = R"(set -e
tags="-metadata title=Song -metadata artist=Ann -metadata album=Alb -metadata composer=Cho -metadata genre=Jazz
  -metadata track=3/12 -metadata date=1999 -metadata comment=Nice"
sound="ffmpeg -v error -f lavfi -i sine=frequency=440:duration=1:sample_rate=44100 -ac 2"
for name in a.mp3 a.flac a.ogg a.m4a a.wav a.wv a.wma a.tta a.ac3; do $sound $tags $name; done
$sound $tags -ar 48000 a.opus
$sound $tags -ar 16000 -c:a libspeex a.spx
$sound $tags -c:a flac -f ogg flac.oga
$sound $tags -c:a alac alac.m4a
$sound $tags -write_id3v2 1 a.aiff
{ printf 'ID3\3\0\0\0\0\0\14POPM\0\0\0\2\0\0\0\304'; cat a.mp3; } >rated.mp3
$sound -metadata LYRICS='sing along' -metadata ISRC=USX9P1234567 -metadata MOOD=calm -metadata RATING=80 \
  -metadata PERFORMER=Bo -metadata ARTIST=Ann -metadata DESCRIPTION='a song' -metadata ENCODED-BY=me \
  -metadata date=2001-02-03 more.flac
video="ffmpeg -v error -f lavfi -i testsrc=size=64x48:rate=25:duration=1
  -f lavfi -i sine=frequency=440:duration=1:sample_rate=48000 -pix_fmt yuv420p -metadata title=Film -metadata artist=Ann
  -metadata comment=Nice -metadata description=Long -metadata creation_time=2020-02-03T04:05:06Z"
for name in v.mp4 v.mov v.mkv v.avi v.flv v.ogv v.wmv v.mpg v.ts v.webm v.mxf; do
  case $name in *.flv) more='-ar 44100';; *.mxf) more='-s 720x576 -ac 1';; *) more=;; esac
  $video $more $name
done
convert -size 16x12 gradient:red-blue -density 300 -units PixelsPerInch p.jpg
for name in p.tif p.png p.webp p.bmp p.psd p.jp2; do convert p.jpg $name; done
cp p.jpg plain.jpg
convert p.jpg -set Title Über -set Author Ann -set comment Nice -set 'Creation Time' 2020-02-03T04:05:06Z text.png
convert p.jpg -set comment Nice p.gif
cp p.jpg windows.jpg
cat >tags <<'END'
set Exif.Image.Make Maker
set Exif.Image.Model Model 5
set Exif.Image.Software Camera 1.0
set Exif.Image.Artist Ann
set Exif.Image.XResolution 100/1
set Exif.Image.YResolution 200/1
set Exif.Image.ResolutionUnit 3
set Exif.Photo.ExposureTime 10/1250
set Exif.Photo.FNumber 28/10
set Exif.Photo.ISOSpeedRatings 400
set Exif.Photo.DateTimeOriginal 2020:02:03 04:05:06
set Exif.Photo.OffsetTimeOriginal +02:00
set Exif.Photo.UserComment charset=Unicode Süß
set Exif.Photo.ImageUniqueID 0123456789abcdef
set Xmp.dc.title lang=de-DE Titel
set Xmp.dc.title lang=x-default Title
set Xmp.dc.description lang=x-default Far away
set Xmp.dc.subject XmpBag sea
set Xmp.dc.subject sun
set Xmp.xmp.Rating 4
END
exiv2 -m tags p.jpg; exiv2 -m tags p.webp; exiv2 -m tags p.png; exiv2 -m tags p.tif; exiv2 -m tags p.psd
exiv2 -M 'set Iptc.Application2.Keywords String one' -M 'add Iptc.Application2.Keywords String two' \
  -M 'set Iptc.Application2.ObjectName String Name' -M 'set Exif.Image.XPComment 72 0 105 0 0 0' \
  -M 'set Exif.Photo.ShutterSpeedValue 7/1' -M 'set Exif.Photo.ApertureValue 3/1' -M 'set Exif.Image.Rating 5' \
  -M 'set Exif.Photo.DateTimeDigitized 2020:02:03 04:05:06' -c 'of JPEG' windows.jpg
rm tags)";

// Made once, and read-only.
const TempDir& Corpus() {
  static const TempDir dir;
  static const int status = system(("cd " + dir.path() + " && bash -c '" +
                                    [] {
                                      std::string quoted;
                                      for (const char* c = kMakeCorpus; *c != '\0'; ++c)
                                        *c == '\'' ? quoted += "'\\''" : quoted += *c;
                                      return quoted;
                                    }() +
                                    "'")
                                       .c_str());
  if (status != 0) throw std::runtime_error("no corpus");
  return dir;
}

std::vector<std::filesystem::path> CorpusFiles() {
  std::vector<std::filesystem::path> files;
  for (const auto& entry : std::filesystem::directory_iterator(Corpus().path())) files.push_back(entry.path());
  std::sort(files.begin(), files.end());
  return files;
}

std::string TypeOf(int fd) {
  static const magic_t cookie = [] {
    const magic_t made = magic_open(MAGIC_MIME_TYPE);
    magic_load(made, nullptr);
    return made;
  }();
  return magic_descriptor(cookie, fd);
}

Source Open(const quarrox::UniqueFd& fd, const std::filesystem::path& path, std::string type = {}) {
  if (type.empty()) type = TypeOf(fd.get());
  return {fd.get(), static_cast<uint64_t>(lseek(fd.get(), 0, SEEK_END)), type, path.extension().string().substr(1)};
}

Json::Value Extract(const Source& source) {
  Findings findings;
  const Extractor extract = FindExtractor(source.type);
  if (extract != nullptr) extract(source, findings);
  return findings.Take();
}

// Bit rates are as the encoders like them, durations of whole frames.
void ExpectField(const std::string& field, const Json::Value& wanted, const Json::Value& found) {
  if (found.isNumeric() && (wanted.isDouble() || field.ends_with("BitRate"))) {
    EXPECT_EQ(wanted.isDouble(), found.isDouble());
    EXPECT_NEAR(wanted.asDouble(), found.asDouble(), wanted.asDouble() * 0.2);
  } else {
    EXPECT_EQ(wanted, found);
  }
}

void ExpectFields(const std::string& name, const std::string& fields) {
  const quarrox::UniqueFd fd(open((Corpus() / name).c_str(), O_RDONLY | O_CLOEXEC));
  const Json::Value found = Extract(Open(fd, name));
  Json::Value wanted;
  ASSERT_TRUE(quarrox::fromString(wanted, "{" + fields + "}")) << fields;
  for (const std::string& field : wanted.getMemberNames()) {
    SCOPED_TRACE(name + " " + field);
    ExpectField(field, wanted[field], found[field]);
  }
}

void ExpectSound() {
  const std::string tags =
      R"("VEXOMDTitle":"Song","VEXOMDAuthors":"Ann","VEXOMDAlbum":"Alb","VEXOMDMusicalGenre":"Jazz",
      "VEXOMDAudioTrackNumber":3,"VEXOMDRecordingYear":1999,)";
  const std::string sound = R"("VEXOMDMediaTypes":"Audio","VEXOMDDurationSecond":1.0,"VEXOMDAudioChannelCount":2)";
  const std::string all = tags + R"("VEXOMDComposer":"Cho",)" + sound;
  const std::string cd = R"(,"VEXOMDAudioSampleRate":44100,"VEXOMDCodecs":)";
  ExpectFields("a.mp3", all + cd + R"("MP3","VEXOMDComment":"Nice","VEXOMDAudioBitRate":128000)");
  ExpectFields("a.flac", all + cd + R"("FLAC","VEXOMDDescription":"Nice")");
  ExpectFields("flac.oga", tags + R"("VEXOMDMediaTypes":"Audio")" + cd + R"("FLAC")");
  ExpectFields("a.ogg", all + cd + R"("Vorbis")");
  ExpectFields("a.opus", all + R"(,"VEXOMDAudioSampleRate":48000,"VEXOMDCodecs":"Opus")");
  ExpectFields("a.spx", all + R"(,"VEXOMDAudioSampleRate":16000,"VEXOMDCodecs":"Speex")");
  ExpectFields("a.m4a", all + cd + R"("AAC","VEXOMDComment":"Nice","VEXOMDAudioBitRate":129000)");
  ExpectFields("alac.m4a", all + cd + R"("ALAC")");
  ExpectFields("a.wv", all + cd + R"("WavPack")");
  ExpectFields("a.aiff", all + cd + R"("PCM","VEXOMDAudioBitRate":1411000,"VEXOMDTotalBitRate":1411000)");
  ExpectFields("a.wav", tags + sound + cd + R"("PCM","VEXOMDComment":"Nice","VEXOMDAudioBitRate":1411000)");
  ExpectFields("a.wma", all + cd + R"("WMA","VEXOMDAudioBitRate":128000,"VEXOMDTotalBitRate":146000)");
  ExpectFields("a.tta", sound + cd + R"("TTA")");
  ExpectFields("a.ac3", sound + cd + R"("AC-3","VEXOMDAudioBitRate":192000)");
  ExpectFields("rated.mp3", R"("VEXOMDStarRating":"4")");
  ExpectFields("more.flac", R"("VEXOMDTextContent":"sing along\n","VEXOMDIdentifier":"USX9P1234567",
      "VEXOMDKeywords":"calm","VEXOMDStarRating":"4","VEXOMDAuthors":"Ann ; Bo","VEXOMDDescription":"a song",
      "VEXOMDRecordingYear":2001,"VEXOMDContentCreationDate":981158400)");
}

void ExpectVideo() {
  const std::string both = R"("VEXOMDMediaTypes":"Video ; Audio","VEXOMDDurationSecond":1.0,"VEXOMDCodecs":)";
  const std::string sound = R"(,"VEXOMDAudioSampleRate":48000,"VEXOMDAudioChannelCount":1)";
  const std::string title = sound + R"(,"VEXOMDTitle":"Film")";
  const std::string date = title + R"(,"VEXOMDContentCreationDate":1580702706)";
  const std::string tags = date + R"(,"VEXOMDAuthors":"Ann","VEXOMDComment":"Nice","VEXOMDDescription":"Long")";
  ExpectFields("v.mp4", both + R"("AVC ; AAC","VEXOMDAudioBitRate":70000)" + tags);
  ExpectFields("v.mkv", both + R"("AVC ; Vorbis")" + tags);
  ExpectFields("v.mov", both + R"("AVC ; AAC")" + date);
  ExpectFields("v.webm", both + R"("VP9 ; Opus")" + date);
  ExpectFields("v.wmv", both + R"("MPEG-4 Visual ; WMA","VEXOMDAudioBitRate":128000)" + date);
  ExpectFields("v.ogv", both + R"("Theora ; Vorbis","VEXOMDVideoBitRate":200000)" + date);
  ExpectFields("v.avi", both + R"("MPEG-4 Visual ; MP3","VEXOMDAudioBitRate":64000)" + title);
  ExpectFields("v.mpg", both + R"("MPEG Video ; MP2","VEXOMDAudioBitRate":384000,"VEXOMDTotalBitRate":520000)" + sound);
  ExpectFields("v.flv", both + R"("Sorenson Spark ; MP3","VEXOMDAudioSampleRate":44100,"VEXOMDTitle":"Film")");
  ExpectFields("v.mxf", both + R"("MPEG Video ; PCM","VEXOMDAudioBitRate":768000)" + sound);
  ExpectFields("v.ts", R"("VEXOMDMediaTypes":"Video ; Audio","VEXOMDCodecs":"MPEG Video ; MPEG Audio")");
}

void ExpectPictures() {
  const std::string camera = R"("VEXOMDAcquisitionMake":"Maker","VEXOMDAcquisitionModel":"Model 5",
      "VEXOMDExposureTimeString":"1/125","VEXOMDAperture":"f/2.8","VEXOMDISOSpeed":400,
      "VEXOMDContentCreationDate":1580695506,"VEXOMDIdentifier":"0123456789abcdef")";
  const std::string people = R"(,"VEXOMDAuthors":"Ann","VEXOMDComment":"Süß","VEXOMDTitle":"Title",
      "VEXOMDDescription":"Far away","VEXOMDKeywords":"sea ; sun","VEXOMDStarRating":"4")";
  const std::string metric =
      R"(,"VEXOMDCreator":"Camera 1.0","VEXOMDResolutionWidthDPI":254,"VEXOMDResolutionHeightDPI":508)";
  ExpectFields("p.tif", camera + people);
  ExpectFields("p.webp", camera + people + metric);
  ExpectFields("p.jpg", camera + people);
  ExpectFields("p.png", camera + people);
  ExpectFields("p.psd", camera + people);
  const std::string inches = R"("VEXOMDResolutionWidthDPI":300,"VEXOMDResolutionHeightDPI":300)";
  ExpectFields("plain.jpg", inches + R"(,"VEXOMDContentCreationDate":null,"VEXOMDComment":null)");
  ExpectFields("p.bmp", inches);
  ExpectFields("text.png", inches + R"(,"VEXOMDTitle":"Über","VEXOMDAuthors":"Ann","VEXOMDComment":"Nice",
      "VEXOMDContentCreationDate":1580702706)");
  ExpectFields("p.gif", R"("VEXOMDComment":"Nice")");
  ExpectFields("windows.jpg", R"("VEXOMDKeywords":"one ; two","VEXOMDTitle":"Name","VEXOMDComment":"Hi ; of JPEG",
      "VEXOMDExposureTimeString":"1/128","VEXOMDAperture":"f/2.8","VEXOMDStarRating":"5",
      "VEXOMDContentCreationDate":1580702706)");
}

// The corpus takes seconds, so it is made for few tests.
TEST(ExtractMedia, FindsWhatOtherProgramsWrote) {
  ExpectSound();
  ExpectVideo();
  ExpectPictures();
}

// Whether looking costs no more than this, whatever the file says of itself. In seconds of the processor.
bool ExtractInTime(const Source& source) {
  constexpr double kMostTime = 5;
  const clock_t start = clock();
  try {
    Extract(source);
  } catch (const std::exception&) {
  }
  return static_cast<double>(clock() - start) / CLOCKS_PER_SEC < kMostTime;
}

// In very few damaged files MediaInfo believes a count: what looks into files of others' has a time limit for them.
void LookIntoDamagedFiles() {
  int looked = 0;
  int slow = 0;
  const int rounds = getenv("FILEINDEX_LONG") != nullptr ? 1000 : 100;
  std::mt19937 random(8);
  const quarrox::UniqueFd fd(memfd_create("damaged", MFD_CLOEXEC));
  for (const auto& path : CorpusFiles()) {
    SCOPED_TRACE(path.filename());
    const std::string whole = quarrox::support::ReadText(path);
    const quarrox::UniqueFd original(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    const std::string type = Open(original, path).type;
    for (int round = 0; round < 2 * rounds; ++round) {
      std::string damaged = whole;
      // Most of what is looked at stands near the beginning.
      const size_t reach = round % 2 == 0 ? whole.size() : std::min<size_t>(whole.size(), 2048);
      if (round < rounds) {
        damaged.resize(random() % reach);
      } else {
        for (int flips = 1 << random() % 6; flips > 0; --flips)
          damaged[random() % reach] ^= static_cast<char>(1 << random() % 8);
      }
      ASSERT_EQ(ftruncate(fd.get(), 0), 0);
      ASSERT_EQ(pwrite(fd.get(), damaged.data(), damaged.size(), 0), static_cast<ssize_t>(damaged.size()));
      ++looked;
      if (!ExtractInTime(Open(fd, path, type))) ++slow;
    }
  }
  EXPECT_LE(slow, looked / 5000);
}

void LookIntoHugeFiles() {
  const TempDir dir;
  for (const auto& path : CorpusFiles()) {
    const std::string copy = dir / path.filename();
    std::filesystem::copy_file(path, copy);
    const quarrox::UniqueFd fd(open(copy.c_str(), O_RDWR | O_CLOEXEC));
    const std::string type = Open(fd, path).type;
    ASSERT_EQ(ftruncate(fd.get(), off_t{4} << 30), 0);
    EXPECT_TRUE(ExtractInTime(Open(fd, path, type))) << path;
  }
}

TEST(ExtractMedia, CostsLittleForDamagedAndHugeFiles) {
  LookIntoDamagedFiles();
  LookIntoHugeFiles();
}

TEST(ExtractMedia, LooksAtFilesWithoutTypeByTheirNames) {
  const quarrox::UniqueFd fd(memfd_create("junk", MFD_CLOEXEC));
  ASSERT_EQ(write(fd.get(), "junk", 4), 4);
  std::istringstream extensions("mp3 mp1 mpa aac ac3 ape wv tta mpg ts m2ts f4v mov mrw rw2 raw orf raf dat vob");
  for (std::string extension; extensions >> extension;) {
    EXPECT_THROW(Extract(Open(fd, "f." + extension, "application/octet-stream")), std::exception) << extension;
  }
  EXPECT_TRUE(Extract(Open(fd, "f.unknown", "application/octet-stream")).empty());
}

TEST(ExtractMedia, ReadsDatesOfAllSpellings) {
  const std::pair<const char*, int64_t> dates[] = {{"2020:02:03 04:05:06", 1580702706},
                                                   {"2020-02-03T04:05:06Z", 1580702706},
                                                   {"2020-02-03T05:05:06.25+01:00", 1580702706},
                                                   {"2020-02-02 23:35:06-0430", 1580702706},
                                                   {"UTC 2020-02-03 04:05:06", 1580702706},
                                                   {"2020-02-03 04:05:06.000 UTC", 1580702706},
                                                   {"2020-02-03", 1580688000},
                                                   {"1912:06:23 00:00:00", -1815350400}};
  for (const auto& [text, seconds] : dates) EXPECT_EQ(ParseDate(text), seconds) << text;
  for (const char* none : {"", "1999", "0000:00:00 00:00:00", "2020-13-01", "2020-02-03 25:00:00",
                           "1970-01-01 00:00:00", "    :  :     :  :  ", "2020-02"}) {
    EXPECT_EQ(ParseDate(none), std::nullopt) << none;
  }
}

TEST(ExtractMedia, TakesTagsAndLabelsFromExtendedAttributes) {
  const TempDir dir;
  quarrox::support::WriteText(dir / "f.txt", "x");
  const quarrox::UniqueFd fd(open((dir / "f.txt").c_str(), O_RDONLY | O_CLOEXEC));
  const auto set = [&](const char* name, const std::string& value) {
    return fsetxattr(fd.get(), name, value.data(), value.size(), 0) == 0;
  };
  if (!set("user.xdg.tags", "red, big ones")) GTEST_SKIP() << "no extended attributes in " << dir.path();
  set("user.xdg.comment", "Nice");
  set("user.baloo.rating", "8");
  const auto read = [&] {
    Findings findings;
    ReadExtendedAttributes(Open(fd, "f.txt"), findings);
    return findings.Take();
  };
  set("user.VEXOMDDateAdded", "1583280000");
  set("user.VEXOMDFinderOpenDate", "2020-03-04");
  set("user.VEXOMDGroupId", "g1");
  set("user.VEXOMDSpotlightBoost", "boost");
  const Json::Value found = read();
  EXPECT_EQ(found["VEXOMDDateAdded"], 1583280000);
  EXPECT_EQ(found["VEXOMDFinderOpenDate"], 1583280000);
  EXPECT_TRUE(found["VEXOMDGroupId"] == "g1" && found["VEXOMDSpotlightBoost"] == "boost");
  EXPECT_EQ(found["_VEXOMDUserTags"], "red ; big ones");
  EXPECT_EQ(found["VEXOMDComment"], "Nice");
  EXPECT_EQ(found["VEXOMDStarRating"], "4");
  const std::string info = std::string(9, '\0') + '\x0c' + std::string(22, '\0');
  const std::string header("\0\5\x16\7\0\2\0\0................\0\1\0\0\0\x09\0\0\0\x26\0\0\0\x20", 38);
  for (const auto& [name, value] : {std::pair<const char*, std::string>{"user.com.apple.FinderInfo", info},
                                    {"user.org.netatalk.Metadata", header + info},
                                    {"user.DosStream.AFP_AfpInfo:$DATA", "AFP" + std::string(13, '\0') + info}}) {
    EXPECT_TRUE(set(name, value));
    EXPECT_EQ(read()["VEXOMDFinderLabel"], 6) << name;
    set(name, value.substr(0, value.size() / 2 - 8));
    EXPECT_FALSE(read().isMember("VEXOMDFinderLabel")) << name;
    fremovexattr(fd.get(), name);
  }
}

}  // namespace
}  // namespace platform::extract
