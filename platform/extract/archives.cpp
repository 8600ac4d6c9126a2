#include <string>
#include <string_view>
#include <utility>

#include "extract/decoder.h"
#include "extract/documents.h"
#include "extract/packed_reader.h"

namespace platform::extract {
namespace {

// What has zeros is no text, but where its encoding is made of them.
void AddContent(PackedReader& packed, Findings& findings) {
  std::string_view head = packed.Piece();
  const std::string encoding = GuessEncoding(head);
  if (head.find('\0') != head.npos && !encoding.starts_with("UTF-16") && !encoding.starts_with("UTF-32")) return;
  const auto next = [&] { return head.empty() ? packed.Piece() : std::exchange(head, {}); };
  AddPlainText(next, encoding, findings);
}

}  // namespace

void ExtractArchive(const Source& source, Findings& findings) {
  PackedReader packed(source, PackedReader::Formats::kAll);
  try {
    while (packed.Next() && !findings.IsFull()) {
      if (packed.HasEncrypted()) findings.Set("VEXOMDIsEncrypted", true);
      if (packed.IsWholeFile()) return AddContent(packed, findings);
      findings.AddText(packed.name() + "\n");
    }
  } catch (const std::exception&) {
    if (!packed.HasEncrypted()) throw;
    findings.Set("VEXOMDIsEncrypted", true);  // the names are, too
  }
}

}  // namespace platform::extract
