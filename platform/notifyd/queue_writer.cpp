#include "queue_writer.h"

#include <algorithm>
#include <cerrno>

#include "common/error.h"
#include "common/log.h"
#include "common/queue_file.h"

namespace quarrox::notifyd {

void QueueWriter::Add(const Event& event) {
  if (dropped_) return;  // the line about the loss will cover it
  AppendLine(pending_, event);
  if (pending_.size() >= kBatch) Flush();
  if (pending_.size() > kMaxPending) Drop();
}

void QueueWriter::Drop() {
  errno = 0;
  QUARROX_LOG_FAILURE("%zu bytes of events are dropped because the queue cannot be written, queue=%s", pending_.size(),
                      log::Text(queue_).c_str());
  std::string().swap(pending_);
  dropped_ = true;
}

bool QueueWriter::Append(const std::string& lines) {
  try {
    AppendToQueue(queue_, lines);
  } catch (const Error& error) {
    if (!failing_) {
      errno = 0;
      QUARROX_LOG_FAILURE("%s; events wait in memory until it works", log::Text(error.reason).c_str());
    }
    failing_ = true;
    retry_ = Clock::now() + std::chrono::seconds(1);
    return false;
  }
  if (failing_) QUARROX_LOG_PROGRESS("The queue can be written again, queue=%s", log::Text(queue_).c_str());
  failing_ = false;
  return true;
}

bool QueueWriter::WriteLost() {
  std::string line;
  AppendLine(line, {kLost, false, root_, {}});
  dropped_ = !Append(line);
  return !dropped_;
}

bool QueueWriter::WriteBatches() {
  size_t done = 0;
  while (done < pending_.size()) {
    const size_t end = pending_.find('\n', std::min(done + kBatch, pending_.size()) - 1) + 1;
    if (!Append(pending_.substr(done, end - done))) break;
    done = end;
  }
  pending_.erase(0, done);
  return pending_.empty();
}

bool QueueWriter::Flush() {
  if (failing_ && Clock::now() < retry_) return false;
  return FlushNow();
}

bool QueueWriter::FlushNow() {
  if (dropped_ && !WriteLost()) return false;
  return WriteBatches();
}

int QueueWriter::Timeout() const {
  if (pending_.empty() && !dropped_) return -1;
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(retry_ - Clock::now());
  return failing_ ? static_cast<int>(std::max<int64_t>(left.count(), 0)) : 0;
}

}  // namespace quarrox::notifyd
