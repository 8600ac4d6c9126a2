// A whole queue, folded as the daemon does and line by line in the plainest way: both must come to the same.
#include <cstdint>
#include <cstdlib>
#include <string>

#include "support/reference_fold.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string queue(reinterpret_cast<const char*>(data), size);
  if (quarrox::support::Fold(queue) != quarrox::support::FoldPlainly(queue)) abort();
  return 0;
}
