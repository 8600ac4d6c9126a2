// What is in a file, as the fields of a document.
#pragma once

#include <string>

#include <json/json.h>

namespace VEXO::CONTENT_EXTRACT {

// Sets in `document` (an object; other members stay) the fields of the file at an absolute path. Always those that the
// file system knows:
//   VEXOMDPath, VEXOMDFSName, VEXOMDDisplayName, VEXOMDParent, VEXOMDExtension (lower case), VEXOMDKind
//   ("folder", "file", "link" or "other")                                                           strings
//   VEXOMDIsDir                                                                                     bool
//   VEXOMDFSSize, VEXOMDLogicalSize, VEXOMDPhysicalSize                                             bytes
//   VEXOMDFSContentChangeDate, VEXOMDContentModificationDate, VEXOMDAttributeChangeDate, VEXOMDLastUsedDate,
//   VEXOMDFSCreationDate (where the file system keeps it)                                           seconds since the
//   epoch VEXOMDOwnerUserID, VEXOMDOwnerGroupID (decimal numbers), VEXOMDPrivilege (mode as octal digits) strings
// With options["need_meta"] true also what the content offers, VEXOMDTextContent first (at most 4 MiB of UTF-8);
// without it no byte of the content is read. A symbolic link is described as itself.
//
// Throws std::exception's children where the file cannot be looked at; `document` is then as it was. Thread-safe.
void ParseFile(const std::string& path, const Json::Value& options, Json::Value& document);

}  // namespace VEXO::CONTENT_EXTRACT
