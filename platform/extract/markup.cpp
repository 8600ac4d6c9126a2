#include "extract/markup.h"

#include <memory>
#include <new>
#include <optional>
#include <stdexcept>
#include <string>

#include <libxml/HTMLparser.h>
#include <libxml/parser.h>

#include "extract/decoder.h"

namespace platform::extract {
namespace {

// What nobody writes; each further level costs the parser of HTML more with each end that has no start.
constexpr int kDeepest = 1000;

// How much of a page is read: the parser of HTML tells some of what it read only at the end, and takes half a second
// for a megabyte of mistakes. In bytes.
constexpr size_t kLongestPage = size_t{16} << 20;

struct Parse {
  MarkupHandler& handler;
  int depth = 0;
};

struct Free {
  void operator()(xmlParserCtxt* context) const {
    xmlFreeDoc(context->myDoc);  // entities are declared in one even where nobody asked for it
    xmlFreeParserCtxt(context);
  }
};
using Context = std::unique_ptr<xmlParserCtxt, Free>;

Parse& Of(void* user) {
  return *static_cast<Parse*>(user);
}

std::string_view View(const xmlChar* text) {
  return text == nullptr ? std::string_view() : std::string_view(reinterpret_cast<const char*>(text));
}

void OnStart(void* user, std::string_view name, const Attributes& attributes) {
  Parse& parse = Of(user);
  if (++parse.depth <= kDeepest) parse.handler.Start(name, attributes);
}

void OnEnd(void* user, std::string_view name) {
  Parse& parse = Of(user);
  if (parse.depth-- <= kDeepest) parse.handler.End(name);
}

void OnText(void* user, const xmlChar* text, int size) {
  Of(user).handler.Text({reinterpret_cast<const char*>(text), static_cast<size_t>(size)});
}

void OnXmlStart(void* user, const xmlChar* name, const xmlChar* /*prefix*/, const xmlChar* /*uri*/, int /*namespaces*/,
                const xmlChar** /*list*/, int count, int /*defaulted*/, const xmlChar** attributes) {
  OnStart(user, View(name), Attributes(attributes, count, 5));
}

void OnXmlEnd(void* user, const xmlChar* name, const xmlChar* /*prefix*/, const xmlChar* /*uri*/) {
  OnEnd(user, View(name));
}

void OnHtmlStart(void* user, const xmlChar* name, const xmlChar** attributes) {
  int count = 0;
  while (attributes != nullptr && attributes[2 * count] != nullptr) ++count;
  OnStart(user, View(name), Attributes(attributes, count, 2));
}

void OnHtmlEnd(void* user, const xmlChar* name) {
  OnEnd(user, View(name));
}

void OnXmlError(void* /*user*/, xmlErrorPtr /*error*/) {}

// Only what is told to a handler: as no declaration is heard, no entity has a value.
xmlSAXHandler Callbacks(Markup kind) {
  xmlSAXHandler sax = {};
  sax.initialized = XML_SAX2_MAGIC;
  sax.serror = OnXmlError;
  sax.characters = OnText;
  sax.ignorableWhitespace = OnText;
  if (kind == Markup::kHtml) {
    sax.startElement = OnHtmlStart;
    sax.endElement = OnHtmlEnd;
    sax.cdataBlock = [](void*, const xmlChar*, int) {};  // scripts and styles
  } else {
    sax.startElementNs = OnXmlStart;
    sax.endElementNs = OnXmlEnd;
    sax.cdataBlock = OnText;
  }
  return sax;
}

Context MakeContext(Markup kind, Parse* parse) {
  xmlSAXHandler sax = Callbacks(kind);
  Context context;
  if (kind == Markup::kHtml) {
    context.reset(htmlCreatePushParserCtxt(&sax, parse, nullptr, 0, nullptr, XML_CHAR_ENCODING_UTF8));
    if (context) htmlCtxtUseOptions(context.get(), HTML_PARSE_NONET | HTML_PARSE_IGNORE_ENC);
  } else {
    context.reset(xmlCreatePushParserCtxt(&sax, parse, nullptr, 0, nullptr));
    if (context) xmlCtxtUseOptions(context.get(), XML_PARSE_NONET | XML_PARSE_RECOVER);
  }
  if (!context) throw std::bad_alloc();
  return context;
}

}  // namespace

std::string_view Attributes::operator[](std::string_view name) const {
  for (int i = 0; i < count_; ++i) {
    const unsigned char* const* const attribute = list_ + static_cast<ptrdiff_t>(i) * stride_;
    if (View(attribute[0]) != name) continue;
    if (stride_ == 2) return View(attribute[1]);
    return {reinterpret_cast<const char*>(attribute[3]), static_cast<size_t>(attribute[4] - attribute[3])};
  }
  return {};
}

void ReadMarkup(Markup kind, const Pieces& pieces, MarkupHandler& handler, const std::function<bool()>& goes_on,
                const std::string& encoding) {
  Parse parse{handler};
  const Context context = MakeContext(kind, &parse);
  std::optional<Decoder> decoder;
  std::string page;
  size_t size = 0;
  bool ended = false;
  while (!ended && context->instate != XML_PARSER_EOF) {
    std::string_view piece = size < kLongestPage || kind == Markup::kXml ? pieces() : std::string_view();
    size += piece.size();
    ended = piece.empty();
    if (kind == Markup::kHtml) {
      if (!decoder) decoder.emplace(encoding.empty() ? GuessEncoding(piece) : encoding);
      piece = page = decoder->Decode(piece);
    }
    const auto parse_chunk = kind == Markup::kHtml ? htmlParseChunk : xmlParseChunk;
    parse_chunk(context.get(), piece.data(), static_cast<int>(piece.size()), ended ? 1 : 0);
    if (parse.depth > kDeepest) throw std::runtime_error("elements are nested too deeply");
    if (goes_on && !goes_on()) return;
  }
  if (kind == Markup::kXml && context->wellFormed == 0) throw std::runtime_error("not well-formed XML");
}

}  // namespace platform::extract
