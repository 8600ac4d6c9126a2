// One client of the engine's socket.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "common/unique_fd.h"
#include "server_request_reader.h"
#include "server_sender.h"

namespace quarrox::elasticd {

using Clock = std::chrono::steady_clock;

// What a connection waits for.
enum class Stage : uint8_t {
  kIdle,       // the first byte of a request
  kReceiving,  // the rest of one
  kNoMemory,   // memory for the rest of one; it is not read until then
  kSending,    // its client to read
  kDraining,   // its client to go, having been refused
  kStages
};

// An answer that the socket did not take at once. `unread` counts the memory of all of them.
struct Outgoing {
  Outgoing(std::unique_ptr<Answer> made, const AnswerSender& begun, std::atomic<size_t>& unread)
      : answer(std::move(made)), sender(begun), seen(begun.sent()), all_(unread), counted_(begun.memory()) {
    all_ += counted_;
  }
  ~Outgoing() { all_ -= counted_; }
  Outgoing(const Outgoing&) = delete;
  Outgoing& operator=(const Outgoing&) = delete;

  const std::unique_ptr<Answer> answer;
  AnswerSender sender;
  uint64_t seen;  // what had been sent when the time for more began

 private:
  std::atomic<size_t>& all_;
  const size_t counted_;
};

// A thread owns it from ConnectionTable::Admit or Take until Park or Release. Small, because thousands may say nothing.
struct Connection {
  UniqueFd fd;
  RequestReader reader;
  std::string leftover;  // bytes of the next requests, received while an answer waits to be read
  std::unique_ptr<Outgoing> outgoing;
  uint32_t answers = 0;

  size_t Memory() const { return reader.memory() + leftover.capacity(); }

  // The table's own; the owner may look at them.
  Stage stage = Stage::kIdle;
  bool listed = false;      // waits in the list of its stage, or did when it was taken
  bool owned = false;       // by a thread
  bool registered = false;  // with epoll
  Clock::time_point deadline = {};
  size_t reserved = 0;  // bytes of the memory for requests
  uint32_t index = 0;
  std::optional<uid_t> user;  // whose it is, where that is counted
  uint32_t generation = 0;    // tells it from others that had its place before
  Connection* previous = nullptr;
  Connection* next = nullptr;
};

}  // namespace quarrox::elasticd
