#include <climits>
#include <memory>
#include <stdexcept>
#include <string>

#include <poppler/cpp/poppler-document.h>
#include <poppler/cpp/poppler-global.h>
#include <poppler/cpp/poppler-page.h>

#include "extract/documents.h"

namespace platform::extract {
namespace {

std::string Utf8(const poppler::ustring& text) {
  const poppler::byte_array bytes = text.to_utf8();
  return {bytes.begin(), bytes.end()};
}

void SetFields(const poppler::document& document, Findings& findings) {
  findings.Set("VEXOMDTitle", Utf8(document.get_title()));
  findings.Set("VEXOMDAuthors", Utf8(document.get_author()));
  findings.Set("VEXOMDDescription", Utf8(document.get_subject()));
  findings.Set("VEXOMDKeywords", Utf8(document.get_keywords()));
  findings.Set("VEXOMDCreator", Utf8(document.get_creator()));
  const time_t created = document.get_creation_date_t();
  if (created != static_cast<time_t>(-1)) findings.Set("VEXOMDContentCreationDate", int64_t{created});
}

}  // namespace

void ExtractPdf(const Source& source, Findings& findings) {
  poppler::set_debug_error_function([](const std::string&, void*) {}, nullptr);
  static_assert(kLongestMapping <= INT_MAX);
  const Mapping file(source);
  const std::unique_ptr<poppler::document> document(
      poppler::document::load_from_raw_data(file.bytes().data(), static_cast<int>(file.bytes().size())));
  if (!document) throw std::runtime_error("damaged PDF");
  if (document->is_locked()) return findings.Set("VEXOMDIsEncrypted", true);
  SetFields(*document, findings);
  const int pages = document->pages();
  for (int i = 0; i < pages; ++i) {
    const std::unique_ptr<poppler::page> page(document->create_page(i));
    if (!page) continue;
    const std::string text = Utf8(page->text(poppler::rectf(), poppler::page::non_raw_non_physical_layout));
    if (!findings.AddText(text + "\n")) return;
  }
}

}  // namespace platform::extract
