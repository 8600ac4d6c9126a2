#include <algorithm>
#include <memory>
#include <stdexcept>
#include <string>

#include <gmime/gmime.h>

#include "extract/decoder.h"
#include "extract/documents.h"
#include "extract/markup_text.h"

namespace platform::extract {
namespace {

// How much of a file is searched for messages. In bytes.
constexpr int64_t kLongestMailbox = int64_t{256} << 20;

struct Free {
  void operator()(char* text) const { g_free(text); }
  void operator()(GMimePartIter* iterator) const { g_mime_part_iter_free(iterator); }
  void operator()(gpointer object) const { g_object_unref(object); }
};
template <typename T>
using Owned = std::unique_ptr<T, Free>;

constexpr FieldRule kHeaders[] = {
    {"X-Mailer", "VEXOMDCreator", FieldKind::kText},
    {"User-Agent", "VEXOMDCreator", FieldKind::kText},
    {"Keywords", "VEXOMDKeywords", FieldKind::kText},
    {"Comments", "VEXOMDComment", FieldKind::kText},
};

std::string Addresses(GMimeMessage* message, GMimeAddressType type) {
  InternetAddressList* const list = g_mime_message_get_addresses(message, type);
  if (list == nullptr) return {};
  const Owned<char> text(internet_address_list_to_string(list, nullptr, FALSE));
  return text ? text.get() : "";
}

std::string Subject(GMimeMessage* message) {
  const char* const subject = g_mime_message_get_subject(message);
  return subject == nullptr ? "" : subject;
}

void SetFields(GMimeMessage* message, Findings& findings) {
  findings.Set("VEXOMDTitle", Subject(message));
  findings.Set("VEXOMDAuthors", Addresses(message, GMIME_ADDRESS_TYPE_FROM));
  const char* const id = g_mime_message_get_message_id(message);
  if (id != nullptr) findings.Set("VEXOMDIdentifier", id);
  GDateTime* const date = g_mime_message_get_date(message);
  if (date != nullptr) findings.Set("VEXOMDContentCreationDate", int64_t{g_date_time_to_unix(date)});
  for (const FieldRule& rule : kHeaders) {
    const char* const value = g_mime_object_get_header(GMIME_OBJECT(message), rule.name.data());
    if (value != nullptr) findings.Set(rule.field, value);
  }
}

bool Is(GMimeObject* part, const char* type, const char* subtype) {
  return part != nullptr && g_mime_content_type_is_type(g_mime_object_get_content_type(part), type, subtype) != 0;
}

// Whether the same is there as plain text.
bool HasPlainTwin(GMimeObject* parent) {
  if (!Is(parent, "multipart", "alternative") || !GMIME_IS_MULTIPART(parent)) return false;
  auto* const multipart = GMIME_MULTIPART(parent);
  for (int i = 0; i < g_mime_multipart_get_count(multipart); ++i) {
    if (Is(g_mime_multipart_get_part(multipart, i), "text", "plain")) return true;
  }
  return false;
}

// What a part holds, without its encoding for the transfer.
Pieces ContentOf(GMimePart* part) {
  GMimeDataWrapper* const content = g_mime_part_get_content(part);
  if (content == nullptr) return [] { return std::string_view(); };
  GMimeStream* const raw = g_mime_data_wrapper_get_stream(content);
  g_mime_stream_reset(raw);
  const std::shared_ptr<GMimeStream> stream(g_mime_stream_filter_new(raw), Free());
  const Owned<GMimeFilter> filter(g_mime_filter_basic_new(g_mime_data_wrapper_get_encoding(content), FALSE));
  g_mime_stream_filter_add(GMIME_STREAM_FILTER(stream.get()), filter.get());
  return [stream, buffer = std::string(kPiece, '\0')]() mutable {
    const ssize_t n = g_mime_stream_read(stream.get(), buffer.data(), buffer.size());
    return std::string_view(buffer.data(), static_cast<size_t>(std::max<ssize_t>(n, 0)));
  };
}

void AddPart(GMimeObject* part, GMimeObject* parent, Findings& findings) {
  if (Is(parent, "multipart", "encrypted") || Is(part, "application", "pkcs7-mime")) {
    findings.Set("VEXOMDIsEncrypted", true);
  }
  if (!GMIME_IS_PART(part)) return;
  const char* const name = g_mime_part_get_filename(GMIME_PART(part));
  if (name != nullptr) findings.AddText(std::string(name) + "\n");
  const char* const charset = g_mime_object_get_content_type_parameter(part, "charset");
  const std::string encoding = charset == nullptr ? "" : charset;
  if (Is(part, "text", "html")) {
    if (!HasPlainTwin(parent)) findings.AddText(HtmlText(ContentOf(GMIME_PART(part)), encoding));
  } else if (Is(part, "text", "*")) {
    AddPlainText(ContentOf(GMIME_PART(part)), encoding, findings);
  }
  findings.AddText("\n");
}

void AddMessage(GMimeMessage* message, Findings& findings) {
  findings.AddText(Subject(message) + "\n");
  for (const GMimeAddressType type : {GMIME_ADDRESS_TYPE_FROM, GMIME_ADDRESS_TYPE_TO, GMIME_ADDRESS_TYPE_CC}) {
    findings.AddText(Addresses(message, type) + "\n");
  }
  const Owned<GMimePartIter> iterator(g_mime_part_iter_new(GMIME_OBJECT(message)));
  if (g_mime_part_iter_is_valid(iterator.get()) == 0) return;
  do {
    AddPart(g_mime_part_iter_get_current(iterator.get()), g_mime_part_iter_get_parent(iterator.get()), findings);
  } while (!findings.IsFull() && g_mime_part_iter_next(iterator.get()) != 0);
}

Owned<GMimeParser> MakeParser(const Source& source, GMimeFormat format) {
  static const bool ready = (g_mime_init(), true);
  static_cast<void>(ready);
  const int64_t end = std::min<int64_t>(static_cast<int64_t>(source.size), kLongestMailbox);
  const Owned<GMimeStream> stream(g_mime_stream_fs_new_with_bounds(source.fd, 0, end));
  g_mime_stream_fs_set_owner(GMIME_STREAM_FS(stream.get()), FALSE);
  g_mime_stream_reset(stream.get());
  Owned<GMimeParser> parser(g_mime_parser_new_with_stream(stream.get()));
  g_mime_parser_set_format(parser.get(), format);
  return parser;
}

}  // namespace

void ExtractMail(const Source& source, Findings& findings) {
  const Owned<GMimeParser> parser = MakeParser(source, GMIME_FORMAT_MESSAGE);
  const Owned<GMimeMessage> message(g_mime_parser_construct_message(parser.get(), nullptr));
  if (!message) throw std::runtime_error("not a message");
  SetFields(message.get(), findings);
  AddMessage(message.get(), findings);
}

void ExtractMailbox(const Source& source, Findings& findings) {
  const Owned<GMimeParser> parser = MakeParser(source, GMIME_FORMAT_MBOX);
  while (!findings.IsFull() && g_mime_parser_eos(parser.get()) == 0) {
    const Owned<GMimeMessage> message(g_mime_parser_construct_message(parser.get(), nullptr));
    if (!message) throw std::runtime_error("not a mailbox");
    AddMessage(message.get(), findings);
  }
}

}  // namespace platform::extract
