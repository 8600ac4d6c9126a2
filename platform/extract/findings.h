// What was found in a file, as fields of its document.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include <json/json.h>

#include "linux/content_extract_text.h"

namespace platform::extract {

// How long any other text may be. In bytes.
inline constexpr size_t kLongestField = size_t{64} << 10;

// Texts may be any bytes: what is no UTF-8 becomes U+FFFD, control characters blanks. A field that is set keeps its
// first value. Not thread-safe.
class Findings {
 public:
  // Goes on with VEXOMDTextContent, up to kLongestText. False where no more is kept, and looking further is of no use.
  bool AddText(std::string_view text);
  bool IsFull() const { return text_.size() + 4 > kLongestText; }  // the longest character

  // Blanks around a text are left out, and a field without any other is not set.
  void Set(const char* field, std::string_view text);
  void Set(const char* field, const std::string& text) { Set(field, std::string_view(text)); }
  void Set(const char* field, const char* text) { Set(field, std::string_view(text)); }
  void Set(const char* field, int64_t number);
  void Set(const char* field, int number) { Set(field, int64_t{number}); }
  void Set(const char* field, bool yes);
  void Set(const char* field, double number);  // nothing where it is not finite

  // One more value of a field with several, such as the authors: "one ; other". One that is there is left out.
  void Add(const char* field, std::string_view text);

  bool Has(const char* field) const { return fields_.isMember(field); }

  // All of it, as an object. What was found is gone then.
  Json::Value Take();

 private:
  Json::Value fields_ = Json::Value(Json::objectValue);
  std::string text_;
};

}  // namespace platform::extract
