// The growing pause between tries of what failed: 1, 2, 4 ... 60 seconds.
#pragma once

#include <algorithm>
#include <chrono>

namespace quarrox::fileindexd {

class Backoff {
 public:
  static constexpr std::chrono::seconds kLongest{60};

  // How long to wait now; the next pause is longer.
  std::chrono::seconds Next() {
    const std::chrono::seconds pause = next_;
    next_ = std::min(2 * next_, kLongest);
    return pause;
  }

  void Reset() { next_ = std::chrono::seconds(1); }

 private:
  std::chrono::seconds next_{1};
};

}  // namespace quarrox::fileindexd
