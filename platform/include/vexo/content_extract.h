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
// Throws std::exception's children where the file cannot be looked at or read; `document` is then as it was. A
// std::system_error says why, and may pass; where its content is the reason, which ends, hangs or bloats whoever reads
// it, it is another exception. Thread-safe.
void ParseFile(const std::string& path, const Json::Value& options, Json::Value& document);

// Why the last ParseFile of this thread failed, in words, without the path; empty where it did not.
std::string LastFailure();

// What reads the contents of files, and what keeps it from doing anything else, as found by starting it:
//   program     where it lies                                                                           string
//   failure     why it cannot be used; the others are not there then                                    string
//   landlock    the version of the kernel's interface, 0 where there is none                            number
//   seccomp     only the system calls that reading takes are allowed                                    bool
//   user        it is not root, and has no capabilities                                                 bool
//   limits      of memory, time and files                                                               bool
Json::Value ReaderFeatures();

}  // namespace VEXO::CONTENT_EXTRACT
