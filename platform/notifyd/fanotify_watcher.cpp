#include <fcntl.h>
#include <sys/fanotify.h>

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <vector>

#include "common/error.h"
#include "resolver.h"
#include "watcher.h"

namespace quarrox::notifyd {
namespace {

constexpr uint64_t kMask = FAN_CREATE | FAN_DELETE | FAN_ATTRIB | FAN_CLOSE_WRITE | FAN_RENAME | FAN_ONDIR;
constexpr unsigned kFlags = FAN_CLASS_NOTIF | FAN_REPORT_DFID_NAME | FAN_NONBLOCK | FAN_CLOEXEC;
constexpr size_t kReadSize = size_t{256} << 10;
constexpr size_t kMaxBatch = size_t{64} << 20;
constexpr int kIdleMs = 100;    // directories that are kept open hold their mount busy
constexpr int kMaxRounds = 16;  // before the caller may look at its other concerns

// A directory's handle and a name in it, both in the buffer that was read.
struct Entry {
  std::string_view handle;
  std::string_view name;
};

// What one event carries: `at` for all but renames, which have the other two.
struct Entries {
  Entry at;
  Entry from;
  Entry to;
};

// An info record is a header with the file system's id, a file_handle and a zero-terminated name. The handle is taken
// from its type to its end, which is the form that DirHandles reads.
Entry ParseEntry(const char* record) {
  const char* handle = record + offsetof(fanotify_event_info_fid, handle);
  unsigned size = 0;
  memcpy(&size, handle + offsetof(file_handle, handle_bytes), sizeof(size));
  const char* type = handle + offsetof(file_handle, handle_type);
  const char* name = handle + offsetof(file_handle, f_handle) + size;
  return {{type, static_cast<size_t>(name - type)}, name};
}

Entries ParseRecords(const char* record, const char* end) {
  Entries entries;
  while (record < end) {
    fanotify_event_info_header header;
    memcpy(&header, record, sizeof(header));
    if (header.info_type == FAN_EVENT_INFO_TYPE_DFID_NAME) entries.at = ParseEntry(record);
    if (header.info_type == FAN_EVENT_INFO_TYPE_OLD_DFID_NAME) entries.from = ParseEntry(record);
    if (header.info_type == FAN_EVENT_INFO_TYPE_NEW_DFID_NAME) entries.to = ParseEntry(record);
    record += header.len;
  }
  return entries;
}

uint8_t BitsOf(uint64_t mask) {
  uint32_t bits = 0;
  if ((mask & FAN_CREATE) != 0) bits |= kCreated;
  if ((mask & FAN_DELETE) != 0) bits |= kDeleted;
  if ((mask & FAN_CLOSE_WRITE) != 0) bits |= kWritten;
  if ((mask & FAN_ATTRIB) != 0) bits |= kAttributes;
  return static_cast<uint8_t>(bits);
}

uint32_t TouchEntry(EventBatch& batch, const Entry& entry) {
  return entry.handle.empty() ? kNone : batch.Touch(entry.handle, entry.name);
}

void AddEvent(EventBatch& batch, const char* event, const fanotify_event_metadata& head) {
  if ((head.mask & FAN_Q_OVERFLOW) != 0) {
    batch.overflowed = true;
    return;
  }
  const Entries entries = ParseRecords(event + head.metadata_len, event + head.event_len);
  const bool is_dir = (head.mask & FAN_ONDIR) != 0;
  if ((head.mask & FAN_RENAME) != 0) {
    const uint32_t from = TouchEntry(batch, entries.from);
    batch.AddRename(from, TouchEntry(batch, entries.to), is_dir);
  }
  const uint32_t at = TouchEntry(batch, entries.at);
  if (at != kNone) batch.AddBits(at, BitsOf(head.mask), is_dir);
}

void AddEvents(EventBatch& batch, const char* event, const char* end) {
  while (end - event >= static_cast<ptrdiff_t>(FAN_EVENT_METADATA_LEN)) {
    fanotify_event_metadata head;
    memcpy(&head, event, sizeof(head));
    if (head.vers != FANOTIFY_METADATA_VERSION) throw Error(kErrSystem, "The kernel speaks another fanotify version");
    AddEvent(batch, event, head);
    event += head.event_len;
  }
}

int Mark(int fd, const std::string& dir) {
  return fanotify_mark(fd, FAN_MARK_ADD | FAN_MARK_FILESYSTEM, kMask, AT_FDCWD, dir.c_str());
}

class FanotifyWatcher final : public Watcher {
 public:
  FanotifyWatcher(const Scope& scope, EventSink& sink, UniqueFd fd)
      : scope_(scope),
        fd_(std::move(fd)),
        handles_(scope.dir()),
        resolver_(scope, handles_, sink),
        buffer_(kReadSize) {}

  const char* method() const override { return "fanotify"; }
  int fd() const override { return fd_.get(); }
  int Timeout() const override { return handles_.empty() ? -1 : kIdleMs; }

  bool CanResolve() {
    const bool works = handles_.Works();
    handles_.Clear();
    return works;
  }

  // The kernel takes a mark that is there already once more.
  void Renew() override {
    if (Mark(fd_.get(), scope_.dir()) == 0) return;
    const std::string why = strerror(errno);
    throw Error(kErrSystem, "fanotify cannot watch " + scope_.dir() + " any more, reason=" + why);
  }

  void Drain() override {
    if (!ResolveOne()) return handles_.Clear();
    for (int round = 1; round < kMaxRounds && ResolveOne(); ++round) {
    }
  }

 private:
  // False when there was nothing to resolve.
  bool ResolveOne() {
    auto batch = std::make_unique<EventBatch>();
    batch->complete = false;
    while (!batch->complete && batch->Memory() < kMaxBatch) batch->complete = !Read(*batch);
    if (batch->empty()) {
      resolver_.Settle();
      return false;
    }
    resolver_.Resolve(std::move(batch));
    return true;
  }

  // False when the kernel's queue is empty.
  bool Read(EventBatch& batch) {
    const ssize_t size = read(fd_.get(), buffer_.data(), buffer_.size());
    if (size > 0) AddEvents(batch, buffer_.data(), buffer_.data() + size);
    if (size > 0 || errno == EINTR) return true;
    if (size == 0 || errno == EAGAIN) return false;
    throw Error(kErrSystem, std::string("Reading fanotify events failed, reason=") + strerror(errno));
  }

  const Scope& scope_;
  UniqueFd fd_;
  DirHandles handles_;
  Resolver resolver_;
  std::vector<char> buffer_;
};

bool IsUnavailable(int error) {
  switch (error) {
    case EPERM:
    case EACCES:
    case EINVAL:
    case ENOSYS:
    case EOPNOTSUPP:
    case EXDEV:
    case ENODEV:
      return true;
    default:
      return false;
  }
}

// What to do when a step of the set-up failed with the present errno.
std::unique_ptr<Watcher> Unavailable(const char* step, std::string& why) {
  const int error = errno;
  why = std::string(step) + " failed, reason=" + strerror(error);
  if (!IsUnavailable(error)) throw Error(kErrSystem, why);
  return nullptr;
}

UniqueFd OpenFanotify(bool limited) {
  int fd = -1;
  if (!limited) fd = fanotify_init(kFlags | FAN_UNLIMITED_QUEUE, O_RDONLY);
  if (limited || (fd < 0 && errno == EPERM)) fd = fanotify_init(kFlags, O_RDONLY);
  return UniqueFd(fd);
}

}  // namespace

std::unique_ptr<Watcher> MakeFanotifyWatcher(const Scope& scope, EventSink& sink, bool limited, std::string& why) {
  UniqueFd fd = OpenFanotify(limited);
  if (!fd) return Unavailable("fanotify_init", why);
  if (Mark(fd.get(), scope.dir()) != 0) return Unavailable("fanotify_mark", why);
  auto watcher = std::make_unique<FanotifyWatcher>(scope, sink, std::move(fd));
  if (!watcher->CanResolve()) return Unavailable("open_by_handle_at", why);
  return watcher;
}

}  // namespace quarrox::notifyd
