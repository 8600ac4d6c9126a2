// Texts of any encoding as UTF-8.
#pragma once

#include <string>
#include <string_view>

#include "extract/findings.h"
#include "extract/pieces.h"

struct UConverter;

namespace platform::extract {

// What a text is encoded in, by its first bytes: its byte order mark, what HTML or XML declares, how it looks.
std::string GuessEncoding(std::string_view head);

// What an encoding has no character for becomes U+FFFD. Not thread-safe.
class Decoder {
 public:
  // Encodings that are often declared for a larger one are taken for that; one that is not known is windows-1252.
  explicit Decoder(const std::string& encoding);
  ~Decoder();
  Decoder(const Decoder&) = delete;
  Decoder& operator=(const Decoder&) = delete;

  // Goes on with a text, which may be cut anywhere; an empty piece ends it.
  std::string Decode(std::string_view piece);

 private:
  bool IsInside() const;

  UConverter* converter_;
  bool is_like_ascii_;  // what is ASCII is the same in it
  bool begun_ = false;
};

// Adds a plain text; where no encoding is named it is guessed.
void AddPlainText(const Pieces& pieces, const std::string& encoding, Findings& findings);

}  // namespace platform::extract
