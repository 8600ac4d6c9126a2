// Documents that are zip archives of XML.
#include <algorithm>
#include <array>
#include <charconv>
#include <cstdlib>
#include <exception>
#include <map>
#include <string>
#include <tuple>
#include <utility>

#include "common/strings.h"
#include "extract/documents.h"
#include "extract/markup_text.h"
#include "extract/packed_reader.h"

namespace platform::extract {
namespace {

using Name = std::string_view;

constexpr auto kOfficeFields = std::to_array<FieldRule>({
    {"title", "VEXOMDTitle", FieldKind::kText},
    {"initial-creator", "VEXOMDAuthors", FieldKind::kList},
    {"creator", "VEXOMDAuthors", FieldKind::kList},
    {"description", "VEXOMDDescription", FieldKind::kList},
    {"subject", "VEXOMDDescription", FieldKind::kList},
    {"keyword", "VEXOMDKeywords", FieldKind::kList},
    {"keywords", "VEXOMDKeywords", FieldKind::kList},
    {"identifier", "VEXOMDIdentifier", FieldKind::kText},
    {"generator", "VEXOMDCreator", FieldKind::kText},
    {"Application", "VEXOMDCreator", FieldKind::kText},
    {"created", "VEXOMDContentCreationDate", FieldKind::kDate},
    {"creation-date", "VEXOMDContentCreationDate", FieldKind::kDate},
});
constexpr auto kBookFields = std::to_array<FieldRule>({
    {"title", "VEXOMDTitle", FieldKind::kText},
    {"creator", "VEXOMDAuthors", FieldKind::kList},
    {"description", "VEXOMDDescription", FieldKind::kText},
    {"subject", "VEXOMDKeywords", FieldKind::kList},
    {"publisher", "VEXOMDCreator", FieldKind::kText},
    {"identifier", "VEXOMDIdentifier", FieldKind::kText},
    {"date", "VEXOMDContentCreationDate", FieldKind::kDate},
});

constexpr auto kRuns = std::to_array<Name>({"t"});
constexpr auto kRunBreaks = std::to_array<Name>({"p", "tab", "br", "cr", "si", "is", "tc"});
constexpr TextRules kOoxmlText = {.read = kRuns, .skipped = {}, .breaks = kRunBreaks};

constexpr auto kValues = std::to_array<Name>({"t", "v"});
constexpr auto kCells = std::to_array<Name>({"c"});
constexpr TextRules kSheetText = {.read = kValues, .skipped = {}, .breaks = kCells};

constexpr auto kParagraphs = std::to_array<Name>({"p", "h"});
constexpr auto kChanges = std::to_array<Name>({"tracked-changes"});
constexpr auto kParagraphBreaks = std::to_array<Name>({"p", "h", "s", "tab", "line-break"});
constexpr TextRules kOpenDocumentText = {.read = kParagraphs, .skipped = kChanges, .breaks = kParagraphBreaks};

// The members that hold text, by how their names begin, in the order in which they are read.
constexpr auto kOoxmlParts = std::to_array<Name>(
    {"word/document", "ppt/slides/slide", "xl/sharedStrings", "xl/worksheets/sheet", "word/header", "word/footer",
     "word/footnotes", "word/endnotes", "word/comments", "ppt/notesSlides/notesSlide", "ppt/comments/", "xl/comments",
     "xl/threadedComments/", "ppt/diagrams/data", "word/diagrams/data", "xl/diagrams/data"});
constexpr auto kOpenDocumentParts = std::to_array<Name>({"content.xml", "styles.xml"});

// Texts in an order that is not the archive's: by part, number at the end of the name, name.
class Texts {
 public:
  // Where the text of a member goes. The one before is complete then.
  std::string& At(size_t part, const std::string& name) {
    if (last_ != nullptr) size_ += last_->size();
    constexpr const char* kDigits = "0123456789";
    const size_t end = name.find_last_of(kDigits);
    const size_t start = name.find_last_not_of(kDigits, end) + 1;
    const uint64_t number = end == std::string::npos ? 0 : strtoull(name.c_str() + start, nullptr, 10);
    last_ = &texts_[{part, number, name}];
    return *last_;
  }

  // Whether there is as much as is kept of a file, without the last text.
  bool IsFull() const { return size_ >= kLongestText; }

  void AddTo(Findings& findings) const {
    for (const auto& [key, text] : texts_) {
      if (!findings.AddText(text + "\n")) return;
    }
  }

 private:
  std::map<std::tuple<size_t, uint64_t, std::string>, std::string> texts_;
  std::string* last_ = nullptr;
  size_t size_ = 0;
};

// Damage of one member keeps no other from being read; the first of it is the result.
template <typename Read>
std::exception_ptr ReadMembers(const Source& source, const Read& read) {
  std::exception_ptr damage;
  try {
    PackedReader package(source, PackedReader::Formats::kZip);
    while (package.Next()) {
      try {
        read(package.name(), [&package] { return package.Piece(); });
      } catch (const std::exception&) {
        if (!damage) damage = std::current_exception();
      }
    }
  } catch (const std::exception&) {
    if (!damage) damage = std::current_exception();
  }
  return damage;
}

void ReadText(const Pieces& pieces, MarkupHandler& handler, const std::string& text) {
  ReadMarkup(Markup::kXml, pieces, handler, [&text] { return text.size() < kLongestText; });
}

// The place of a member's name among the beginnings of names; their number where there is none.
size_t PartOf(const std::string& name, std::span<const Name> parts) {
  const auto part = std::find_if(parts.begin(), parts.end(), [&](Name each) { return name.starts_with(each); });
  return name.ends_with(".xml") ? static_cast<size_t>(part - parts.begin()) : parts.size();
}

// A worksheet. What its cells have in common with others is not in it.
class SheetReader : public TextReader {
 public:
  explicit SheetReader(std::string* text) : TextReader(kSheetText, text) {}

  void Start(Name name, const Attributes& attributes) override {
    if (name == "c") is_word_ = attributes["t"] != "s" && attributes["t"] != "b" && attributes["t"] != "e";
    TextReader::Start(name, attributes);
  }
  void Text(Name text) override {
    if (is_word_) TextReader::Text(text);
  }

 private:
  bool is_word_ = false;
};

class ManifestReader : public MarkupHandler {
 public:
  explicit ManifestReader(Findings& findings) : findings_(findings) {}
  void Start(Name name, const Attributes& /*attributes*/) override {
    if (name == "encryption-data") findings_.Set("VEXOMDIsEncrypted", true);
  }
  void End(Name /*name*/) override {}
  void Text(Name /*text*/) override {}

 private:
  Findings& findings_;
};

std::string Unescaped(Name text) {
  std::string plain;
  for (size_t i = 0; i < text.size(); ++i) {
    unsigned char byte = 0;
    const char* const digits = text.data() + i + 1;
    if (text[i] == '%' && i + 2 < text.size() && std::from_chars(digits, digits + 2, byte, 16).ptr == digits + 2) {
      plain.push_back(static_cast<char>(byte));
      i += 2;
    } else {
      plain.push_back(text[i]);
    }
  }
  return plain;
}

// A book's package file: its fields, and which of its members is read when.
class BookReader : public FieldReader {
 public:
  BookReader(const std::string& name, Findings& findings)
      : FieldReader(kBookFields, findings), directory_(name.substr(0, name.rfind('/') + 1)) {}

  void Start(Name name, const Attributes& attributes) override {
    if (name == "item") paths_[std::string(attributes["id"])] = directory_ + Unescaped(attributes["href"]);
    if (name == "itemref") places_.emplace(paths_[std::string(attributes["idref"])], places_.size());
    FieldReader::Start(name, attributes);
  }

  const std::map<std::string, size_t>& places() const { return places_; }

 private:
  std::string directory_;
  std::map<std::string, std::string> paths_;
  std::map<std::string, size_t> places_;
};

bool IsChapter(const std::string& name) {
  const std::string extension = quarrox::GetFileExtension(name, true);
  return extension == "xhtml" || extension == "html" || extension == "htm";
}

}  // namespace

void ExtractOoxml(const Source& source, Findings& findings) {
  Texts texts;
  const std::exception_ptr damage = ReadMembers(source, [&](const std::string& name, const Pieces& pieces) {
    const size_t part = PartOf(name, kOoxmlParts);
    if (name == "docProps/core.xml" || name == "docProps/app.xml") {
      FieldReader reader(kOfficeFields, findings);
      ReadMarkup(Markup::kXml, pieces, reader);
    } else if (part < kOoxmlParts.size() && !texts.IsFull()) {
      std::string& text = texts.At(part, name);
      TextReader runs(kOoxmlText, &text);
      SheetReader cells(&text);
      const bool is_sheet = name.starts_with("xl/worksheets/");
      ReadText(pieces, is_sheet ? static_cast<MarkupHandler&>(cells) : runs, text);
    }
  });
  texts.AddTo(findings);
  if (damage) std::rethrow_exception(damage);
}

void ExtractOpenDocument(const Source& source, Findings& findings) {
  Texts texts;
  const std::exception_ptr damage = ReadMembers(source, [&](const std::string& name, const Pieces& pieces) {
    const size_t part = PartOf(name, kOpenDocumentParts);
    if (name == "meta.xml") {
      FieldReader reader(kOfficeFields, findings);
      ReadMarkup(Markup::kXml, pieces, reader);
    } else if (name == "META-INF/manifest.xml") {
      ManifestReader reader(findings);
      ReadMarkup(Markup::kXml, pieces, reader);
    } else if (part < kOpenDocumentParts.size()) {
      std::string& text = texts.At(part, name);
      TextReader reader(kOpenDocumentText, &text);
      ReadText(pieces, reader, text);
    }
  });
  if (findings.Has("VEXOMDIsEncrypted")) return;  // then that is why the rest looks damaged
  texts.AddTo(findings);
  if (damage) std::rethrow_exception(damage);
}

void ExtractEpub(const Source& source, Findings& findings) {
  std::map<std::string, std::string> chapters;
  size_t size = 0;
  std::map<std::string, size_t> places;
  const std::exception_ptr damage = ReadMembers(source, [&](const std::string& name, const Pieces& pieces) {
    if (name.ends_with(".opf")) {
      BookReader reader(name, findings);
      ReadMarkup(Markup::kXml, pieces, reader);
      places = reader.places();
    } else if (IsChapter(name) && size < kLongestText) {
      std::string& text = chapters[name] = HtmlText(pieces);
      size += text.size();
    }
  });
  Texts texts;
  for (auto& [name, text] : chapters) {
    const auto place = places.find(name);
    texts.At(place == places.end() ? places.size() : place->second, name) = std::move(text);
  }
  texts.AddTo(findings);
  if (damage) std::rethrow_exception(damage);
}

}  // namespace platform::extract
