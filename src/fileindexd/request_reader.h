// Collects one request from the pieces in which it arrives: a 4-byte length in host byte order, then that many bytes,
// of which the last is zero. Keeps only what has arrived, whatever the length promises.
#pragma once

#include <cstddef>
#include <string>

namespace quarrox::fileindexd {

class RequestReader {
 public:
  // Takes the next piece. True once the request is whole; what follows it is ignored. Throws Error 120, which is not
  // logged, as soon as it can be no request any more.
  bool Add(const char* data, size_t size);

  // The text of a whole request, without the zero.
  std::string Text() const;

 private:
  std::string received_;  // with the length
};

}  // namespace quarrox::fileindexd
