#define QUARROX_LOG_UNIT "queue_mgr"

#include "fileindex/queue_mgr_search.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <optional>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/optree.h"

namespace quarrox::fileindex {
namespace {

// None where the line is no event.
std::optional<Event> ReadEvent(std::string_view line, bool overlong) {
  const std::string text(line);
  try {
    if (!overlong) return Event(text);
    throw Error(kErrMalformedEvent, "Line too long: more than " + std::to_string(QueueLines::kMaxLine) + " bytes");
  } catch (const Error& error) {
    QUARROX_LOG_FAILURE("InsertEvent failed, event_raw=%s, code=%d, reason=%s", log::Text(text).c_str(), error.code,
                        log::Text(error.what()).c_str());
    return std::nullopt;
  }
}

// The place of a slash up to which both texts are the same, or 0: found in words, because the events of a queue begin
// alike.
size_t SharedDirectory(std::string_view a, std::string_view b) {
  constexpr size_t kWord = 8;
  size_t same = 0;
  while (same + kWord <= std::min(a.size(), b.size()) && memcmp(a.data() + same, b.data() + same, kWord) == 0) {
    same += kWord;
  }
  const size_t slash = same == 0 ? std::string_view::npos : a.rfind('/', same - 1);
  return slash == std::string_view::npos ? 0 : slash;
}

}  // namespace

bool IsAtOrBelow(std::string_view path, std::string_view base) {
  const size_t start = SharedDirectory(path, base);
  size_t at = start;
  for (size_t i = start; i < base.size();) {
    if (base[i] != '/') {
      if (at == path.size() || path[at++] != base[i++]) return false;
      continue;
    }
    if (at != path.size() && path[at] != '/') return false;  // a longer component
    while (i < base.size() && base[i] == '/') ++i;
    while (at < path.size() && path[at] == '/') ++at;
  }
  return at == path.size() || path[at] == '/' || (!base.empty() && base.back() == '/');
}

QueueSearch::QueueSearch(const std::string& queue_path)
    : lines_(queue_path), missing_(lines_.error() == ENOENT || lines_.error() == ENOTDIR) {
  if (!missing_) CheckError();
}

void QueueSearch::CheckError() const {
  if (lines_.error() == 0) return;
  errno = lines_.error();
  QUARROX_THROW("!input_stream", kErrSystem, std::string("Failed to open queue, reason=") + strerror(lines_.error()));
}

bool QueueSearch::Find(const boost::function<bool(const EventView&)>& accepts) {
  std::string_view line;
  while (lines_.Next(line)) {
    EventView view;
    if (!lines_.overlong() && ReadPlainEvent(line, view)) {
      if (accepts(view)) return true;
    } else if (const auto event = ReadEvent(line, lines_.overlong())) {
      if (accepts({event->event, event->is_dir, event->path, event->path_old, {}})) return true;
    }
  }
  if (!missing_) CheckError();
  return false;
}

}  // namespace quarrox::fileindex
