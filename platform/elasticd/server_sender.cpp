#include "server_sender.h"

#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/log.h"

namespace quarrox::elasticd {
namespace {

// What a socket takes at once is no more than a few of these.
constexpr size_t kPieceOfFile = 65536;

}  // namespace

AnswerSender::AnswerSender(Answer& answer)
    : answer_(answer),
      total_(Answer::kFrameLength + answer.size_ + 1),
      head_(answer.memory_.size() + (answer.spooled_ + answer.tail_.size() == 0 ? 1 : 0)),
      body_(answer.spooled_) {
  const auto length = static_cast<uint32_t>(answer.size_ + 1);
  memcpy(answer_.memory_.data(), &length, sizeof(length));
  (head_ > answer_.memory_.size() ? answer_.memory_ : answer_.tail_).push_back('\0');
}

void AnswerSender::Spool() {
  answer_.FlushTail();
  body_ = answer_.spooled_;
  answer_.Write(answer_.memory_);
  head_in_file_ = true;
  std::string().swap(answer_.memory_);
  std::string().swap(answer_.tail_);
}

// What is to be sent now, in `buffer` where it comes from the file; empty where that cannot be read.
std::string_view AnswerSender::Next(char* buffer, size_t size) const {
  const bool is_head = sent_ < head_;
  if (is_head && !head_in_file_) return std::string_view(answer_.memory_).substr(sent_);
  if (sent_ >= head_ + body_) return std::string_view(answer_.tail_).substr(sent_ - head_ - body_);
  const uint64_t at = is_head ? body_ + sent_ : sent_ - head_;
  const uint64_t left = (is_head ? head_ : head_ + body_) - sent_;
  const ssize_t count =
      pread(answer_.file_.get(), buffer, static_cast<size_t>(std::min<uint64_t>(left, size)), static_cast<off_t>(at));
  if (count > 0) return {buffer, static_cast<size_t>(count)};
  QUARROX_LOG_FAILURE("%s", "An answer is lost: its file cannot be read");
  return {};
}

AnswerSender::Progress AnswerSender::Send(int socket) {
  char buffer[kPieceOfFile];
  while (sent_ < total_) {
    const std::string_view next = Next(buffer, sizeof(buffer));
    if (next.empty()) return Progress::kGone;
    const ssize_t count = send(socket, next.data(), next.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
    if (count >= 0) {
      sent_ += static_cast<uint64_t>(count);
    } else if (errno == EAGAIN) {
      return Progress::kBlocked;
    } else if (errno != EINTR) {
      return Progress::kGone;
    }
  }
  return Progress::kDone;
}

}  // namespace quarrox::elasticd
