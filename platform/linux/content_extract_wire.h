// What this process and one that reads files for it say to each other, over a stream socket between the two. Both are
// on one machine and of one build; a reader says first which.
#pragma once

#include <cstddef>
#include <cstdint>

namespace platform::wire {

// Changes with what is below.
inline constexpr int32_t kVersion = 1;

// One file. Its descriptor comes along with the message.
struct Request {
  uint64_t size = 0;        // in bytes
  char extension[24] = "";  // of the name, lower case, ended by a zero; empty also where it is longer
};

enum Kind : uint32_t {
  kReady,   // once, at the start; `error` is kVersion, the words are what keeps the reader in, as JSON
  kType,    // what the file is, before it is looked into; the words are its type, another answer follows
  kFound,   // the words are the fields but for the text, as JSON; the text follows them
  kFailed,  // nothing was found, because of what the words say
};

// So many bytes of words and of text follow.
struct Answer {
  Kind kind = kReady;
  int32_t error = 0;     // of kFailed: the errno of reading the file, 0 where it is the content's fault
  uint32_t is_last = 0;  // not 0: the reader ends after this one
  uint32_t words_size = 0;
  uint32_t text_size = 0;
};

// What passes this is no answer. Two dozen fields may be long; in bytes.
inline constexpr uint32_t kMostWords = uint32_t{8} << 20;
inline constexpr uint32_t kMostText = uint32_t{4} << 20;

}  // namespace platform::wire
