#include <array>
#include <string>
#include <string_view>

#include "extract/documents.h"
#include "extract/markup_text.h"

namespace platform::extract {
namespace {

// Pictures and the like in the text of an OpenDocument file that is no archive; what an SVG picture looks like.
constexpr auto kUnseen = std::to_array<std::string_view>({"binary-data", "style", "script"});
constexpr TextRules kEverything = {.read = {}, .skipped = kUnseen, .breaks = {}, .others_break = true};

}  // namespace

void ExtractHtml(const Source& source, Findings& findings) {
  ReadHtml(FilePieces(source), findings);
}

void ExtractXml(const Source& source, Findings& findings) {
  std::string text;
  TextReader reader(kEverything, &text);
  ReadMarkup(Markup::kXml, FilePieces(source), reader, [&] {
    const bool wanted = findings.AddText(text);
    text.clear();
    return wanted;
  });
}

}  // namespace platform::extract
