// XML and HTML, read in order.
#pragma once

#include <string>
#include <string_view>

#include "extract/pieces.h"

namespace platform::extract {

class Attributes {
 public:
  // `stride` texts for each attribute: its name, ..., its value and, where there are five, the value's end.
  Attributes(const unsigned char* const* list, int count, int stride) : list_(list), count_(count), stride_(stride) {}

  // Empty where there is none of that name, which has no prefix.
  std::string_view operator[](std::string_view name) const;

 private:
  const unsigned char* const* list_;
  int count_;
  int stride_;
};

// Is told what stands in a document. Names are without prefix; of HTML they are lower case.
class MarkupHandler {
 public:
  virtual ~MarkupHandler() = default;
  virtual void Start(std::string_view name, const Attributes& attributes) = 0;
  virtual void End(std::string_view name) = 0;
  virtual void Text(std::string_view text) = 0;  // a part of it
};

enum class Markup { kXml, kHtml };

// Tells a handler what stands in a document, as far as it says that it wants more: `goes_on` is asked after each piece,
// and may be empty. HTML may be said to be in an encoding, whatever it declares. No entity is expanded but the ones
// that are built in, and nothing is fetched. Throws std::runtime_error at the end where XML is not well-formed, and
// where elements are nested too deeply.
void ReadMarkup(Markup kind, const Pieces& pieces, MarkupHandler& handler, const std::function<bool()>& goes_on = {},
                const std::string& encoding = {});

}  // namespace platform::extract
