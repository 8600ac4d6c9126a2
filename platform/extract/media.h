// Sound, video and pictures: who reads them. All functions but the first are an Extractor.
#pragma once

#include <span>

#include "extract/findings.h"
#include "extract/formats.h"
#include "extract/source.h"

namespace platform::extract {

// Tags and properties of sound.
std::span<const Format> AudioFormats();

// Streams and tags of video and of any other sound.
void ExtractStreams(const Source& source, Findings& findings);

// What a camera, a scanner or a person wrote into a picture.
void ExtractPicture(const Source& source, Findings& findings);

// What the headers of JPEG, PNG, BMP and GIF say themselves; any other type says nothing.
void ReadPictureHeader(const Source& source, Findings& findings);

}  // namespace platform::extract
