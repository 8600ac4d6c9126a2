#define QUARROX_LOG_UNIT "optree"

#include "fileindex/optree_event.h"

#include <cstring>

#include "common/log.h"
#include "fileindex/optree.h"

namespace quarrox::fileindex {
namespace {

// Reads a line from left to right. Each step returns false where the line goes on otherwise than it wants, and the line
// is refused.
class PlainLine {
 public:
  explicit PlainLine(std::string_view line) : p_(line.data()), end_(line.data() + line.size()) {}

  bool ReadObject(EventView& event) {
    if (!Take('{')) return false;
    do {
      if (!ReadMember(event)) return false;
    } while (Take(','));
    return Take('}') && AtEnd() && has_event_ && has_path_;
  }

 private:
  bool ReadMember(EventView& event) {
    if (TakeWord("\"event\"")) return (has_event_ = true) && Take(':') && ReadNumber(event.event);
    if (TakeWord("\"path\"")) return (has_path_ = true) && Take(':') && ReadString(event.path);
    if (TakeWord("\"is_dir\"")) return Take(':') && ((event.is_dir = TakeWord("true")) || TakeWord("false"));
    if (TakeWord("\"path_old\"")) return Take(':') && ReadString(event.path_old);
    return TakeWord("\"data\"") && Take(':') && TakeWord("null");
  }

  void SkipSpace() {
    while (p_ != end_ && (*p_ == ' ' || *p_ == '\t' || *p_ == '\r' || *p_ == '\n')) ++p_;
  }
  bool AtEnd() {
    SkipSpace();
    return p_ == end_;
  }
  bool Take(char c) {
    SkipSpace();
    if (p_ == end_ || *p_ != c) return false;
    ++p_;
    return true;
  }
  // A word that goes on (nullx) is refused by the step behind it.
  template <size_t N>
  bool TakeWord(const char (&word)[N]) {
    SkipSpace();
    if (static_cast<size_t>(end_ - p_) < N - 1 || memcmp(p_, word, N - 1) != 0) return false;
    p_ += N - 1;
    return true;
  }
  bool ReadString(std::string_view& text) {
    if (!Take('"')) return false;
    const auto* quote = static_cast<const char*>(memchr(p_, '"', static_cast<size_t>(end_ - p_)));
    if (quote == nullptr) return false;
    text = std::string_view(p_, static_cast<size_t>(quote - p_));
    p_ = quote + 1;
    return true;
  }
  // At most nine digits without a leading zero: enough for any bit, and it cannot overflow.
  bool ReadNumber(uint32_t& number) {
    SkipSpace();
    const char* const begin = p_;
    number = 0;
    for (; p_ != end_ && *p_ >= '0' && *p_ <= '9'; ++p_) {
      if (p_ - begin == 9) return false;
      number = number * 10 + static_cast<uint32_t>(*p_ - '0');
    }
    return p_ != begin && (*begin != '0' || p_ - begin == 1);
  }

  const char* p_;
  const char* const end_;
  bool has_event_ = false;
  bool has_path_ = false;
};

}  // namespace

bool ReadPlainEvent(std::string_view line, EventView& event) {
  event = EventView();
  if (line.find('\\') != std::string_view::npos || line.find('\0') != std::string_view::npos) return false;
  return PlainLine(line).ReadObject(event);
}

Event::Event(const std::string& event_raw) {
  Json::Value line;
  if (!fromString(line, event_raw)) {
    QUARROX_THROW("!data.fromString(event_raw)", kErrMalformedEvent, "Malformed event_raw: " + event_raw);
  }
  GetJsonValue(event, line, "event", true);
  GetJsonValue(is_dir, line, "is_dir", false);
  GetJsonValue(path, line, "path", true);
  GetJsonValue(path_old, line, "path_old", false);
  GetJsonValue(data, line, "data", false);
}

}  // namespace quarrox::fileindex
