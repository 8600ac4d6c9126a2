// The language of the lines that people type to search: the engine knows its fields from here, and the command explains
// it from here.
#pragma once

namespace quarrox {

enum class SearchField { kNone, kName, kExtension, kType, kSize, kDate, kPath };

struct SearchElement {
  SearchField field;
  const char* name;     // what stands before the colon; empty for what is no field
  const char* written;  // an example, or the form
  const char* meaning;
};

inline constexpr SearchElement kSearchLanguage[] = {
    {SearchField::kNone, "", "WORD WORD",
     "all of these words, in the text or the name; case and accents do not matter"},
    {SearchField::kNone, "", "\"SOME WORDS\"", "these words one behind the other"},
    {SearchField::kNone, "", "WORD*", "words that begin so"},
    {SearchField::kNone, "", "-WORD, NOT WORD", "without it"},
    {SearchField::kNone, "", "A OR B, (A B)", "either; what stands side by side or has AND between binds closer"},
    {SearchField::kName, "name", "name:PART", "a part of the name; name:*.txt and name:img*7.jpg fit whole names"},
    {SearchField::kExtension, "ext", "ext:pdf,docx", "one of these extensions"},
    {SearchField::kType, "type", "type:photo", "document, audio, video, photo or folder; with commas between several"},
    {SearchField::kSize, "size", "size:>10M", "also size:0, size:<=1k, size:1k..2M; k, M, G and T are powers of 1024"},
    {SearchField::kDate, "date", "date:2024-05",
     "changed then; also 2024, 2024-05-01, >=2024-05, 2023..2024, today, yesterday, 7d: no longer ago (or h, w, m, y)"},
    {SearchField::kPath, "path", "path:docs/old",
     "below such a directory; path:/srv/docs is a whole path, * any letters"},
    {SearchField::kNone, "", "\\", "takes its meaning from the next character; in quotes all are plain but \\ and \""},
};

}  // namespace quarrox
