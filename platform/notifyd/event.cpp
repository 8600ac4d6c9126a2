#include "event.h"

namespace quarrox::notifyd {
namespace {

constexpr char kHex[] = "0123456789abcdef";

constexpr bool NeedsEscape(char c) {
  return static_cast<unsigned char>(c) < 0x20 || c == '"' || c == '\\';
}

void AppendEscape(std::string& out, char c) {
  if (c == '"' || c == '\\') {
    out += {'\\', c};
    return;
  }
  const auto byte = static_cast<unsigned char>(c);
  out += "\\u00";
  out += {kHex[byte >> 4], kHex[byte & 15]};
}

void AppendString(std::string& out, std::string_view text) {
  out += '"';
  size_t done = 0;
  for (size_t i = 0; i < text.size(); ++i) {
    if (!NeedsEscape(text[i])) continue;
    out.append(text, done, i - done);
    AppendEscape(out, text[i]);
    done = i + 1;
  }
  out.append(text, done);
  out += '"';
}

}  // namespace

void AppendLine(std::string& lines, const Event& event) {
  lines += "{\"event\":";
  lines += std::to_string(event.bit);
  if (event.is_dir) lines += ",\"is_dir\":true";
  lines += ",\"path\":";
  AppendString(lines, event.path);
  if (!event.path_old.empty()) {
    lines += ",\"path_old\":";
    AppendString(lines, event.path_old);
  }
  lines += "}\n";
}

}  // namespace quarrox::notifyd
