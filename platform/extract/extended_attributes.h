// What programs note beside a file.
#pragma once

#include "extract/findings.h"
#include "extract/source.h"

namespace platform::extract {

// Adds tags, comment, rating and the Finder's label from the file's extended attributes, as desktops, and servers for
// Macs, write them, and the fields that nothing else fills: user.VEXOMDDateAdded and user.VEXOMDFinderOpenDate (seconds
// since the epoch, or a date), user.VEXOMDGroupId, user.VEXOMDSpotlightBoost. For a file of any type; what is there
// counts before what stands in the file. Never throws.
void ReadExtendedAttributes(const Source& source, Findings& findings);

}  // namespace platform::extract
