// The way of an answer through a socket that takes it piece by piece.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "answer.h"

namespace quarrox::elasticd {

// Sends one answer as a frame. The answer lives longer and gets no more text. Not thread-safe.
class AnswerSender {
 public:
  enum class Progress { kDone, kBlocked, kGone };

  explicit AnswerSender(Answer& answer);

  // Sends what the socket takes without waiting: all, not all, or the peer takes nothing any more.
  Progress Send(int socket);

  // Bytes of the frame that were sent.
  uint64_t sent() const { return sent_; }

  // Bytes of memory that the answer takes.
  size_t memory() const { return answer_.memory_.capacity() + answer_.tail_.capacity(); }

  // Moves the answer to its file. Throws Error 618 where that cannot be written.
  void Spool();

 private:
  std::string_view Next(char* buffer, size_t size) const;

  Answer& answer_;
  const uint64_t total_;
  const uint64_t head_;  // the frame's first bytes, in memory or in the file behind the body
  uint64_t body_;        // the bytes that follow, at the beginning of the file; then comes the tail
  bool head_in_file_ = false;
  uint64_t sent_ = 0;
};

}  // namespace quarrox::elasticd
