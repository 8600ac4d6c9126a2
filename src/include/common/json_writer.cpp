#include <array>
#include <bit>
#include <charconv>
#include <cstdint>
#include <cstring>
#include <limits>
#include <string>
#include <string_view>
#include <utility>

#include "common/json.h"

namespace quarrox {
namespace {

constexpr uint64_t kEveryByte = 0x0101010101010101;
constexpr uint64_t kHighBits = 0x80 * kEveryByte;
constexpr size_t kBlock = sizeof(uint64_t);

// What one byte becomes at most: \u001f.
constexpr size_t kLongestEscape = 6;

bool MustEscape(char byte) {
  return static_cast<unsigned char>(byte) < ' ' || byte == '"' || byte == '\\';
}

// How many of the eight bytes at `at` come before the first that must be escaped. A subtraction borrows into the high
// bit of a byte that it finds below what it takes away; marks above the first one may be wrong.
size_t PlainBytes(const char* at) {
  uint64_t bytes;
  memcpy(&bytes, at, kBlock);
  if constexpr (std::endian::native == std::endian::big) bytes = __builtin_bswap64(bytes);
  const uint64_t quotes = bytes ^ ('"' * kEveryByte);
  const uint64_t backslashes = bytes ^ ('\\' * kEveryByte);
  const uint64_t marks = ((bytes - ' ' * kEveryByte) & ~bytes) | ((quotes - kEveryByte) & ~quotes) |
                         ((backslashes - kEveryByte) & ~backslashes);
  return static_cast<size_t>(std::countr_zero(marks & kHighBits)) / 8;
}

// The text as it grows. Room is asked for ahead, so that bytes are then written without a look at the end.
class Text {
 public:
  Text() { text_.resize(256); }
  // A place for `size` more bytes; good until the next call.
  char* Room(size_t size) {
    if (text_.size() - used_ < size) text_.resize(2 * text_.size() + size);
    return text_.data() + used_;
  }
  void WrittenTo(const char* end) { used_ = static_cast<size_t>(end - text_.data()); }

  void Append(char byte) {
    *Room(1) = byte;
    ++used_;
  }
  void Append(std::string_view bytes) {
    memcpy(Room(bytes.size()), bytes.data(), bytes.size());
    used_ += bytes.size();
  }

  std::string Take() {
    text_.resize(used_);
    return std::move(text_);
  }

 private:
  std::string text_;
  size_t used_ = 0;
};

// What follows the backslash of the bytes that have a short escape, zero for the others.
constexpr std::array<char, 128> kShortEscapes = [] {
  std::array<char, 128> letters{};
  letters['"'] = '"';
  letters['\\'] = '\\';
  letters['\b'] = 'b';
  letters['\f'] = 'f';
  letters['\n'] = 'n';
  letters['\r'] = 'r';
  letters['\t'] = 't';
  return letters;
}();

char* Escape(char* out, char byte) {
  static constexpr char kHex[] = "0123456789abcdef";
  *out++ = '\\';
  if (const char letter = kShortEscapes[static_cast<unsigned char>(byte)]; letter != 0) {
    *out++ = letter;
    return out;
  }
  for (const char next : {'u', '0', '0', kHex[byte >> 4], kHex[byte & 15]}) *out++ = next;
  return out;
}

void AppendQuoted(Text& text, const char* at, const char* end) {
  const auto left = [&] { return static_cast<size_t>(end - at); };
  char* out = text.Room(left() + 2);
  *out++ = '"';
  while (at != end) {
    if (left() >= kBlock) {
      const size_t plain = PlainBytes(at);
      memcpy(out, at, kBlock);
      out += plain;
      at += plain;
      if (plain == kBlock) continue;
    } else if (!MustEscape(*at)) {
      *out++ = *at++;
      continue;
    }
    text.WrittenTo(out);
    out = Escape(text.Room(left() + kLongestEscape + 1), *at++);
  }
  *out++ = '"';
  text.WrittenTo(out);
}

template <typename Number>
void AppendWhole(Text& text, Number number) {
  constexpr size_t kLongest = std::numeric_limits<Number>::digits10 + 2;  // what digits10 leaves out, and a sign
  char* const out = text.Room(kLongest);
  text.WrittenTo(std::to_chars(out, out + kLongest, number).ptr);
}

void AppendValue(Text& text, const Json::Value& value);

void AppendArray(Text& text, const Json::Value& array) {
  text.Append('[');
  Json::ArrayIndex next = 0;
  const auto end = array.end();
  for (auto element = array.begin(); element != end; ++element, ++next) {
    for (; next < element.index(); ++next) text.Append(next == 0 ? "null" : ",null");  // never assigned, so not there
    if (next != 0) text.Append(',');
    AppendValue(text, *element);
  }
  text.Append(']');
}

void AppendObject(Text& text, const Json::Value& object) {
  char before = '{';
  const auto end = object.end();
  for (auto member = object.begin(); member != end; ++member) {
    text.Append(before);
    before = ',';
    const char* name_end = nullptr;
    const char* const name = member.memberName(&name_end);
    AppendQuoted(text, name, name_end);
    text.Append(':');
    AppendValue(text, *member);
  }
  text.Append(before == '{' ? "{}" : "}");
}

// As deep as the value, like the copying and the destruction of one.
void AppendValue(Text& text, const Json::Value& value) {
  const char* begin = nullptr;
  const char* end = nullptr;
  switch (value.type()) {
    case Json::nullValue:
      text.Append("null");
      break;
    case Json::intValue:
      AppendWhole(text, value.asLargestInt());
      break;
    case Json::uintValue:
      AppendWhole(text, value.asLargestUInt());
      break;
    case Json::realValue:
      text.Append(Json::valueToString(value.asDouble()));
      break;
    case Json::stringValue:
      if (value.getString(&begin, &end)) AppendQuoted(text, begin, end);
      break;
    case Json::booleanValue:
      text.Append(value.asBool() ? "true" : "false");
      break;
    case Json::arrayValue:
      AppendArray(text, value);
      break;
    case Json::objectValue:
      AppendObject(text, value);
      break;
  }
}

}  // namespace

std::string toString(const Json::Value& value) {
  Text text;
  AppendValue(text, value);
  return text.Take();
}

}  // namespace quarrox
