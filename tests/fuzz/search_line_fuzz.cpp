// Any line: a tree of which each leaf stands where it says, or a refusal; and what looks into texts for its words.
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "analysis.h"
#include "common/error.h"
#include "error_code.h"
#include "line_values.h"
#include "name_rating.h"
#include "phrase.h"
#include "search_line.h"
#include "snippet.h"

namespace {

using namespace quarrox::elasticd;

void Visit(const LineNode& node, std::string_view line) {
  for (const LineNode& part : node.parts) Visit(part, line);
  if (node.kind != LineNode::kText && node.kind != LineNode::kField) return;
  if (node.begin >= node.end || node.end > line.size() || node.text.size() > node.end - node.begin) abort();
  for (const size_t star : node.stars) {
    if (star >= node.text.size() || node.text[star] != '*') abort();
  }
  ParseSizes(node.text);
  ParseDates(node.text, 1714564800);
  NamePattern(node.text, node.stars).Fits(line);
  const auto pieces = PiecesOf(node.text);
  if (pieces.empty()) return;
  const std::vector<std::string> words = WordsOf(pieces);
  if (!Phrase(words).StandsIn(node.text)) abort();
  SnippetWords snippet_words;
  for (const TextPiece& piece : pieces) snippet_words.Add(piece, node.quoted);
  const Snippet snippet = snippet_words.Find(line);
  for (const auto& [offset, length] : snippet.marks) {
    if (length == 0 || offset + length > snippet.text.size()) abort();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string line(reinterpret_cast<const char*>(data), size);
  try {
    Visit(ReadLine(line), line);
  } catch (const quarrox::Error& error) {
    if (error.code != kBadQuery || error.reason.rfind("column ", 0) != 0) abort();
  }
  return 0;
}
