// The one source that knows MediaInfo.
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <span>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <MediaInfo/MediaInfo.h>
#include <unicode/unistr.h>

#include "extract/media.h"
#include "extract/media_values.h"

namespace platform::extract {
namespace {

using MediaInfoLib::MediaInfo;
using MediaInfoLib::stream_t;

// What one file may cost: it is read in blocks, wherever MediaInfo wants to look.
constexpr size_t kBlock = size_t{256} << 10;
constexpr int kMostReads = 256;

// Streams of one kind that are looked at: who has more has no use for them either.
constexpr size_t kMostStreams = 32;

// Once: the options are the process's.
void Configure() {
  static const bool configured = [] {
    const std::pair<const wchar_t*, const wchar_t*> options[] = {
        {L"Internet", L"No"},
        {L"Language", L"raw"},
        {L"ParseSpeed", L"0"},  // headers, tables, tags: no counting of frames
        {L"MpegTs_MaximumOffset",
         L"8388608"},  // bytes from either end in which streams are looked for; it would be 64 MiB
    };
    for (const auto& [option, value] : options) MediaInfo::Option_Static(option, value);
    return true;
  }();
  (void)configured;
}

void Read(const Source& source, MediaInfo& info) {
  constexpr int kAllIsKnown = 8;  // a bit of the state
  constexpr auto kGoOn = UINT64_MAX;
  static std::vector<char> block(kBlock);
  info.Open_Buffer_Init(source.size, 0);
  uint64_t at = 0;
  for (int reads = 0; reads < kMostReads; ++reads) {
    const size_t n = ReadAt(source, at, block.data(), block.size());
    if (n == 0) break;
    if ((info.Open_Buffer_Continue(reinterpret_cast<const uint8_t*>(block.data()), n) & kAllIsKnown) != 0) break;
    const uint64_t wanted = info.Open_Buffer_Continue_GoTo_Get();
    at = wanted == kGoOn ? at + n : wanted;
    if (wanted != kGoOn) info.Open_Buffer_Init(source.size, at);
  }
  info.Open_Buffer_Finalize();
}

std::string Get(MediaInfo& info, stream_t kind, size_t number, const wchar_t* name) {
  const std::wstring value = info.Get(kind, number, name);
  static_assert(sizeof(wchar_t) == sizeof(UChar32));
  std::string text;
  icu::UnicodeString::fromUTF32(reinterpret_cast<const UChar32*>(value.data()), static_cast<int32_t>(value.size()))
      .toUTF8String(text);
  return text;
}

struct Name {
  const wchar_t* name;  // MediaInfo's
  const char* field;
  Setter set;
};

// Milliseconds become seconds.
void SetDuration(const char* field, const std::string& text, Findings& findings) {
  const double duration = strtod(text.c_str(), nullptr) / 1000;
  if (duration > 0) findings.Set(field, duration);
}

// Of the file as a whole. The first of several that belong to one field wins, or they are added.
constexpr Name kGeneral[] = {
    {L"Title", "VEXOMDTitle", SetText},
    {L"Movie", "VEXOMDTitle", SetText},
    {L"Performer", "VEXOMDAuthors", AddText},
    {L"Album/Performer", "VEXOMDAuthors", AddText},
    {L"Director", "VEXOMDAuthors", AddText},
    {L"ARTIST", "VEXOMDAuthors", AddText},
    {L"Album", "VEXOMDAlbum", SetText},
    {L"Composer", "VEXOMDComposer", AddText},
    {L"Genre", "VEXOMDMusicalGenre", AddText},
    {L"Track/Position", "VEXOMDAudioTrackNumber", SetLeadingNumber},
    {L"Comment", "VEXOMDComment", AddText},
    {L"Description", "VEXOMDDescription", AddText},
    {L"Synopsis", "VEXOMDDescription", AddText},
    {L"Summary", "VEXOMDDescription", AddText},
    {L"Keywords", "VEXOMDKeywords", AddText},
    {L"ISRC", "VEXOMDIdentifier", SetText},
    {L"UniqueID", "VEXOMDIdentifier", SetText},
    {L"Lyrics", "VEXOMDTextContent", AddContent},
    {L"Encoded_Application", "VEXOMDCreator", AddText},
    {L"Encoded_Library", "VEXOMDCreator", AddText},
    {L"WM/EncodingSettings", "VEXOMDCreator", AddText},
    {L"Encoded_Hardware_CompanyName", "VEXOMDAcquisitionMake", SetText},
    {L"Encoded_Hardware_Model", "VEXOMDAcquisitionModel", SetText},
    {L"Recorded_Date", "VEXOMDContentCreationDate", SetDate},
    {L"Encoded_Date", "VEXOMDContentCreationDate", SetDate},
    {L"creation_time", "VEXOMDContentCreationDate", SetDate},
    {L"Recorded_Date", "VEXOMDRecordingYear", SetLeadingNumber},
    {L"date", "VEXOMDRecordingYear", SetLeadingNumber},
    {L"Duration", "VEXOMDDurationSecond", SetDuration},
    {L"OverallBitRate", "VEXOMDTotalBitRate", SetLeadingNumber},
};

// Of each stream.
constexpr Name kVideo[] = {
    {L"BitRate", "VEXOMDVideoBitRate", SetLeadingNumber},
    {L"BitRate_Nominal", "VEXOMDVideoBitRate", SetLeadingNumber},
    {L"Format", "VEXOMDCodecs", AddText},
    {L"Duration", "VEXOMDDurationSecond", SetDuration},
};
constexpr Name kAudio[] = {
    {L"BitRate", "VEXOMDAudioBitRate", SetLeadingNumber},
    {L"BitRate_Nominal", "VEXOMDAudioBitRate", SetLeadingNumber},
    {L"SamplingRate", "VEXOMDAudioSampleRate", SetLeadingNumber},
    {L"Channel(s)", "VEXOMDAudioChannelCount", SetLeadingNumber},
    {L"Duration", "VEXOMDDurationSecond", SetDuration},
};

void SetNamed(MediaInfo& info, stream_t kind, size_t number, std::span<const Name> names, Findings& findings) {
  for (const Name& name : names) name.set(name.field, Get(info, kind, number, name.name), findings);
}

// "MP3" where MediaInfo says "MPEG Audio", as people call it; else its own name of the format.
std::string AudioCodec(MediaInfo& info, size_t number) {
  std::string format = Get(info, MediaInfoLib::Stream_Audio, number, L"Format");
  if (format != "MPEG Audio") return format;
  const std::string profile = Get(info, MediaInfoLib::Stream_Audio, number, L"Format_Profile");
  if (profile.starts_with("Layer ")) return "MP" + profile.substr(6, 1);
  const std::string hint = Get(info, MediaInfoLib::Stream_Audio, number, L"CodecID/Hint");
  return hint.empty() ? format : hint;
}

size_t CountStreams(MediaInfo& info, stream_t kind) {
  return std::min(info.Count_Get(kind), kMostStreams);
}

}  // namespace

void ExtractStreams(const Source& source, Findings& findings) {
  Configure();
  MediaInfo info;
  Read(source, info);
  const size_t videos = CountStreams(info, MediaInfoLib::Stream_Video);
  const size_t audios = CountStreams(info, MediaInfoLib::Stream_Audio);
  if (videos + audios == 0) throw std::runtime_error("it has neither video nor sound");
  SetNamed(info, MediaInfoLib::Stream_General, 0, kGeneral, findings);
  for (size_t i = 0; i < videos; ++i) SetNamed(info, MediaInfoLib::Stream_Video, i, kVideo, findings);
  for (size_t i = 0; i < audios; ++i) {
    SetNamed(info, MediaInfoLib::Stream_Audio, i, kAudio, findings);
    findings.Add("VEXOMDCodecs", AudioCodec(info, i));
  }
  if (videos > 0) findings.Add("VEXOMDMediaTypes", "Video");
  if (audios > 0) findings.Add("VEXOMDMediaTypes", "Audio");
}

}  // namespace platform::extract
