#include "common/log.h"

namespace quarrox {

int log_level = 0;

namespace log {
namespace {
constexpr size_t kMaxText = 8192;
}  // namespace

std::string Text(const std::string& text) {
  if (text.size() <= kMaxText) return text;
  return text.substr(0, kMaxText) + "... (" + std::to_string(text.size()) + " bytes)";
}

}  // namespace log
}  // namespace quarrox
