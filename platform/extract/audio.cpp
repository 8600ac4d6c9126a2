// The one source that knows TagLib.
#include <aifffile.h>
#include <apefile.h>
#include <flacfile.h>
#include <mpcfile.h>
#include <mpegfile.h>
#include <oggflacfile.h>
#include <opusfile.h>
#include <popularimeterframe.h>
#include <speexfile.h>
#include <sys/types.h>
#include <tdebuglistener.h>
#include <tiostream.h>
#include <tpropertymap.h>
#include <trueaudiofile.h>
#include <vorbisfile.h>
#include <wavfile.h>
#include <wavpackfile.h>

#include <algorithm>
#include <cstdlib>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>

#include <id3v2tag.h>
#include <mp4file.h>

#include "extract/media.h"
#include "extract/media_values.h"

namespace platform::extract {
namespace {

// What one file may cost, whatever its lengths say: then it ends. Tags with large pictures stay below by far.
constexpr size_t kMostBytes = size_t{64} << 20;
constexpr unsigned int kMostReads = 64 << 10;

// The file as TagLib wants it: what is beyond the end is empty.
class Stream : public TagLib::IOStream {
 public:
  explicit Stream(const Source& source) : source_(source), size_(static_cast<long>(source.size)) {}

  TagLib::FileName name() const override { return ""; }
  TagLib::ByteVector readBlock(unsigned long length) override {
    if (reads_left_ == 0 || at_ >= size_) return {};
    --reads_left_;
    length = std::min({length, static_cast<unsigned long>(size_ - at_), bytes_left_});
    TagLib::ByteVector block(static_cast<unsigned int>(length), '\0');
    const size_t done = ReadAt(source_, static_cast<uint64_t>(at_), block.data(), length);
    block.resize(static_cast<unsigned int>(done));
    bytes_left_ -= done;
    at_ += static_cast<long>(done);
    return block;
  }
  bool readOnly() const override { return true; }
  bool isOpen() const override { return true; }
  void seek(long offset, Position from) override {
    const long start = from == Beginning ? 0 : from == Current ? at_ : size_;
    at_ = offset > size_ - start ? size_ : std::max(0L, start + offset);
  }
  long tell() const override { return at_; }
  long length() override { return size_; }

  void writeBlock(const TagLib::ByteVector&) override {}
  void insert(const TagLib::ByteVector&, unsigned long, unsigned long) override {}
  void removeBlock(unsigned long, unsigned long) override {}
  void truncate(long) override {}

 private:
  const Source& source_;
  const long size_;
  long at_ = 0;
  size_t bytes_left_ = kMostBytes;
  unsigned int reads_left_ = kMostReads;
};

// TagLib says on stderr what it dislikes.
class Silence : public TagLib::DebugListener {
 public:
  Silence() { TagLib::setDebugListener(this); }
  void printMessage(const TagLib::String&) override {}
};

struct Tag {
  const char* key;
  const char* field;
  Setter set;
};

// Stars from 1 to 5, or percents.
void SetRating(const char* /*field*/, const std::string& text, Findings& findings) {
  const double rating = strtod(text.c_str(), nullptr);
  SetStars(rating <= 5 ? rating : rating / 20, findings);
}

// TagLib's names for the tags of all formats. The first of several that belong to one field wins, or they are added.
constexpr Tag kTags[] = {
    {"TITLE", "VEXOMDTitle", SetText},
    {"ARTIST", "VEXOMDAuthors", AddText},
    {"ALBUMARTIST", "VEXOMDAuthors", AddText},
    {"PERFORMER", "VEXOMDAuthors", AddText},
    {"CONDUCTOR", "VEXOMDAuthors", AddText},
    {"LYRICIST", "VEXOMDAuthors", AddText},
    {"ALBUM", "VEXOMDAlbum", SetText},
    {"COMPOSER", "VEXOMDComposer", AddText},
    {"GENRE", "VEXOMDMusicalGenre", AddText},
    {"COMMENT", "VEXOMDComment", AddText},
    {"DESCRIPTION", "VEXOMDDescription", AddText},
    {"SUBTITLE", "VEXOMDDescription", AddText},
    {"PODCASTDESC", "VEXOMDDescription", AddText},
    {"TRACKNUMBER", "VEXOMDAudioTrackNumber", SetLeadingNumber},
    {"DATE", "VEXOMDRecordingYear", SetLeadingNumber},
    {"ORIGINALDATE", "VEXOMDRecordingYear", SetLeadingNumber},
    {"DATE", "VEXOMDContentCreationDate", SetDate},
    {"ENCODEDBY", "VEXOMDCreator", AddText},
    {"ENCODER", "VEXOMDCreator", AddText},
    {"ENCODING", "VEXOMDCreator", AddText},
    {"KEYWORDS", "VEXOMDKeywords", AddText},
    {"PODCASTKEYWORDS", "VEXOMDKeywords", AddText},
    {"MOOD", "VEXOMDKeywords", AddText},
    {"ISRC", "VEXOMDIdentifier", SetText},
    {"MUSICBRAINZ_TRACKID", "VEXOMDIdentifier", SetText},
    {"RATING", "VEXOMDStarRating", SetRating},
    {"LYRICS", "VEXOMDTextContent", AddContent},
    {"UNSYNCEDLYRICS", "VEXOMDTextContent", AddContent},
};

// Values that one tag may have: who writes more has nothing to say.
constexpr unsigned int kMostValues = 100;

void SetTags(const TagLib::PropertyMap& properties, Findings& findings) {
  for (const Tag& tag : kTags) {
    const auto found = properties.find(tag.key);
    if (found == properties.end()) continue;
    unsigned int values = 0;
    for (const TagLib::String& value : found->second) {
      if (++values > kMostValues) break;
      tag.set(tag.field, value.to8Bit(true), findings);
    }
  }
}

// A rating by players is a byte. 1, 64, 128, 196 and 255 are what they write for one to five stars.
void SetPopularity(const TagLib::ID3v2::Tag* tag, Findings& findings) {
  if (tag == nullptr) return;
  for (const TagLib::ID3v2::Frame* frame : tag->frameList("POPM")) {
    const auto* const popularity = dynamic_cast<const TagLib::ID3v2::PopularimeterFrame*>(frame);
    if (popularity != nullptr && popularity->rating() > 0) {
      findings.Set("VEXOMDStarRating", std::to_string(1 + (popularity->rating() + 32) / 64));
    }
  }
}

std::string CodecOf(const TagLib::MPEG::Properties& properties) {
  return "MP" + std::to_string(properties.layer());
}

std::string CodecOf(const TagLib::MP4::Properties& properties) {
  if (properties.codec() == TagLib::MP4::Properties::ALAC) return "ALAC";
  return properties.codec() == TagLib::MP4::Properties::AAC ? "AAC" : "";
}

std::string CodecOf(const TagLib::RIFF::WAV::Properties& properties) {
  switch (properties.format()) {
    case 1:  // integers
    case 3:  // floating point
      return "PCM";
    case 2:
    case 0x11:
      return "ADPCM";
    case 0x50:
      return "MP2";
    case 0x55:
      return "MP3";
    default:
      return "";
  }
}

std::string CodecOf(const TagLib::RIFF::AIFF::Properties& properties) {
  const TagLib::ByteVector type = properties.compressionType();
  const std::string compression(type.data(), type.size());
  return compression.empty() || compression == "NONE" || compression == "sowt" ? "PCM" : compression;
}

std::string CodecOf(const TagLib::FLAC::Properties&) {
  return "FLAC";
}
std::string CodecOf(const TagLib::Vorbis::Properties&) {
  return "Vorbis";
}
std::string CodecOf(const TagLib::Ogg::Opus::Properties&) {
  return "Opus";
}
std::string CodecOf(const TagLib::Ogg::Speex::Properties&) {
  return "Speex";
}
std::string CodecOf(const TagLib::APE::Properties&) {
  return "APE";
}
std::string CodecOf(const TagLib::MPC::Properties&) {
  return "Musepack";
}
std::string CodecOf(const TagLib::WavPack::Properties&) {
  return "WavPack";
}
std::string CodecOf(const TagLib::TrueAudio::Properties&) {
  return "TTA";
}

void SetPositive(const char* field, int number, Findings& findings) {
  if (number > 0) findings.Set(field, number);
}

template <typename Properties>
void SetProperties(const Properties& properties, Findings& findings) {
  if (properties.lengthInMilliseconds() > 0) {
    findings.Set("VEXOMDDurationSecond", properties.lengthInMilliseconds() / 1000.0);
  }
  const int64_t bits = int64_t{1000} * properties.bitrate();  // kbit/s there
  if (bits > 0) {
    findings.Set("VEXOMDAudioBitRate", bits);
    findings.Set("VEXOMDTotalBitRate", bits);
  }
  SetPositive("VEXOMDAudioSampleRate", properties.sampleRate(), findings);
  SetPositive("VEXOMDAudioChannelCount", properties.channels(), findings);
  findings.Set("VEXOMDCodecs", CodecOf(properties));
  findings.Set("VEXOMDMediaTypes", "Audio");
}

// What TagLib leaves out of RIFF's own tags.
void SetInfo(const TagLib::RIFF::Info::Tag* info, Findings& findings) {
  if (info == nullptr) return;
  constexpr std::pair<const char*, const char*> kFields[] = {
      {"ISFT", "VEXOMDCreator"}, {"IKEY", "VEXOMDKeywords"}, {"ISBJ", "VEXOMDDescription"}, {"IMUS", "VEXOMDComposer"}};
  for (const auto& [id, field] : kFields) findings.Add(field, info->fieldText(id).to8Bit(true));
}

template <typename File>
void Extract(const Source& source, File& file, Findings& findings) {
  const auto* const properties = file.audioProperties();
  // It may be another format under the same name.
  if (!file.isValid() || properties == nullptr || properties->sampleRate() <= 0)
    return ExtractStreams(source, findings);
  SetTags(file.properties(), findings);
  if constexpr (requires { file.ID3v2Tag(); }) SetPopularity(file.ID3v2Tag(), findings);
  if constexpr (requires { file.InfoTag(); }) SetInfo(file.InfoTag(), findings);
  SetProperties(*properties, findings);
}

template <typename File>
void ExtractTags(const Source& source, Findings& findings) {
  static Silence silence;
  Stream stream(source);
  if constexpr (std::is_same_v<File, TagLib::MPEG::File> || std::is_same_v<File, TagLib::FLAC::File>) {
    File file(&stream, TagLib::ID3v2::FrameFactory::instance());
    Extract(source, file, findings);
  } else {
    File file(&stream);
    Extract(source, file, findings);
  }
}

void ExtractOgg(const Source& source, Findings& findings) {
  // The first packet stands behind the header of the first page, which has one segment.
  constexpr size_t kHeader = 28;
  const std::string head = ReadHead(source, 2 * kHeader);
  const std::string_view packet = std::string_view(head).substr(std::min(head.size(), kHeader));
  if (packet.starts_with("OpusHead")) return ExtractTags<TagLib::Ogg::Opus::File>(source, findings);
  if (packet.starts_with("Speex")) return ExtractTags<TagLib::Ogg::Speex::File>(source, findings);
  if (packet.starts_with("\x7f"
                         "FLAC"))
    return ExtractTags<TagLib::Ogg::FLAC::File>(source, findings);
  ExtractTags<TagLib::Ogg::Vorbis::File>(source, findings);
}

constexpr Format kFormats[] = {
    {"audio/mpeg", ExtractTags<TagLib::MPEG::File>},
    {"audio/flac", ExtractTags<TagLib::FLAC::File>},
    {"audio/ogg", ExtractOgg},
    {"audio/mp4", ExtractTags<TagLib::MP4::File>},
    {"audio/x-m4a", ExtractTags<TagLib::MP4::File>},
    {"audio/x-wav", ExtractTags<TagLib::RIFF::WAV::File>},
    {"audio/x-aiff", ExtractTags<TagLib::RIFF::AIFF::File>},
    {"audio/x-ape", ExtractTags<TagLib::APE::File>},
    {"audio/x-musepack", ExtractTags<TagLib::MPC::File>},
    {"audio/x-wavpack", ExtractTags<TagLib::WavPack::File>},
    {"audio/x-tta", ExtractTags<TagLib::TrueAudio::File>},
};

}  // namespace

std::span<const Format> AudioFormats() {
  return kFormats;
}

}  // namespace platform::extract
