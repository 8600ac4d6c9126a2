#include "request_reader.h"

#include <cstdint>
#include <cstring>

#include "command.h"
#include "common/error.h"

namespace quarrox::fileindexd {

bool RequestReader::Add(const char* data, size_t size) {
  received_.append(data, size);
  uint32_t length;
  if (received_.size() < sizeof(length)) return false;
  memcpy(&length, received_.data(), sizeof(length));
  if (length == 0) throw Error(kErrBadParameter, "The request is empty");
  if (length > kMaxRequest) {
    throw Error(kErrBadParameter, "The request is longer than " + std::to_string(kMaxRequest) + " bytes");
  }
  const size_t whole = sizeof(length) + length;
  if (received_.size() < whole) return false;
  received_.resize(whole);
  if (received_.back() != '\0') throw Error(kErrBadParameter, "The request does not end with a zero byte");
  return true;
}

std::string RequestReader::Text() const {
  return received_.substr(sizeof(uint32_t), received_.size() - sizeof(uint32_t) - 1);
}

}  // namespace quarrox::fileindexd
