#include <string_view>
#include <vector>

#include "extract/formats.h"
#include "extract/media.h"

namespace platform::extract {
namespace {

// As libmagic names them.
constexpr const char* kStreams[] = {"video/mp4",
                                    "video/x-m4v",
                                    "video/quicktime",
                                    "video/3gpp",
                                    "video/3gpp2",
                                    "video/mj2",
                                    "video/x-matroska",
                                    "video/webm",
                                    "video/x-msvideo",
                                    "video/x-ms-asf",
                                    "video/mpeg",
                                    "video/mpeg4-generic",
                                    "video/MP2T",
                                    "video/x-cdxa",
                                    "video/x-flv",
                                    "video/ogg",
                                    "video/x-dv",
                                    "video/x-ifo",
                                    "application/mxf",
                                    "application/ogg",
                                    "application/vnd.rn-realmedia",
                                    "application/x-shockwave-flash",
                                    "audio/x-pn-realaudio",
                                    "audio/x-hx-aac-adts",
                                    "audio/x-hx-aac-adif",
                                    "audio/x-mp4a-latm",
                                    "audio/vnd.dolby.dd-raw",
                                    "audio/basic",
                                    "audio/x-w64",
                                    "audio/x-dsf",
                                    "audio/x-dff",
                                    "audio/amr"};
constexpr const char* kPictures[] = {"image/jpeg",
                                     "image/tiff",
                                     "image/png",
                                     "image/webp",
                                     "image/heic",
                                     "image/heif",
                                     "image/heic-sequence",
                                     "image/heif-sequence",
                                     "image/avif",
                                     "image/jxl",
                                     "image/jp2",
                                     "image/jpx",
                                     "image/vnd.adobe.photoshop",
                                     "image/x-canon-cr2",
                                     "image/x-canon-crw",
                                     "image/x-fuji-raf",
                                     "image/x-olympus-orf",
                                     "image/x-eps"};
constexpr const char* kHeaders[] = {"image/bmp", "image/x-ms-bmp", "image/gif"};

struct Extension {
  std::string_view extension;
  const char* type;
};

// What libmagic has no type for, by its name; the type is one of those read here. Whoever reads it still looks whether
// it is that.
constexpr Extension kExtensions[] = {
    {"ts", "video/MP2T"},   {"m2ts", "video/MP2T"},         {"m2t", "video/MP2T"},
    {"mts", "video/MP2T"},  {"trp", "video/MP2T"},          {"tp", "video/MP2T"},
    {"f4v", "video/mp4"},   {"mpg", "video/mpeg"},          {"mpeg", "video/mpeg"},
    {"vob", "video/mpeg"},  {"dat", "video/x-cdxa"},        {"vdr", "video/mpeg"},
    {"mp4", "video/mp4"},   {"mov", "video/quicktime"},     {"qt", "video/quicktime"},
    {"mp1", "audio/mpeg"},  {"mp2", "audio/mpeg"},          {"mp3", "audio/mpeg"},
    {"mpa", "audio/mpeg"},  {"aac", "audio/x-hx-aac-adts"}, {"ac3", "audio/vnd.dolby.dd-raw"},
    {"ape", "audio/x-ape"}, {"wv", "audio/x-wavpack"},      {"tta", "audio/x-tta"},
    {"caf", "audio/basic"}, {"mrw", "image/tiff"},          {"rw2", "image/tiff"},
    {"raw", "image/tiff"},  {"orf", "image/tiff"},          {"raf", "image/tiff"},
};

void ExtractByExtension(const Source& source, Findings& findings) {
  for (const Extension& known : kExtensions) {
    if (known.extension != source.extension) continue;
    Source named = source;
    named.type = known.type;
    return FindExtractor(named.type)(named, findings);
  }
}

}  // namespace

std::span<const Format> MediaFormats() {
  static const std::vector<Format> formats = [] {
    std::vector<Format> all = {{"application/octet-stream", ExtractByExtension}};
    for (const Format& format : AudioFormats()) all.push_back(format);
    for (const char* type : kStreams) all.push_back({type, ExtractStreams});
    for (const char* type : kPictures) all.push_back({type, ExtractPicture});
    for (const char* type : kHeaders) all.push_back({type, ReadPictureHeader});
    return all;
  }();
  return formats;
}

}  // namespace platform::extract
