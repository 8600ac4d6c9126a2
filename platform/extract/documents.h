// The extractors of documents; see formats.h for what an extractor does.
#pragma once

#include "extract/findings.h"
#include "extract/source.h"

namespace platform::extract {

void ExtractHtml(const Source& source, Findings& findings);
void ExtractXml(const Source& source, Findings& findings);
void ExtractPdf(const Source& source, Findings& findings);
void ExtractRtf(const Source& source, Findings& findings);

// Word, Excel and PowerPoint since 2007; OpenDocument; books.
void ExtractOoxml(const Source& source, Findings& findings);
void ExtractOpenDocument(const Source& source, Findings& findings);
void ExtractEpub(const Source& source, Findings& findings);

// Word, Excel and PowerPoint before 2007, and newer ones that are encrypted.
void ExtractOldOffice(const Source& source, Findings& findings);

// A message; a mailbox of them.
void ExtractMail(const Source& source, Findings& findings);
void ExtractMailbox(const Source& source, Findings& findings);

// The names of an archive's members; the text of a compressed file.
void ExtractArchive(const Source& source, Findings& findings);

}  // namespace platform::extract
