// Any bytes as sound, video or picture: found or refused. The first byte chooses the format.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <exception>

#include "common/unique_fd.h"
#include "extract/formats.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace platform::extract;
  static const quarrox::UniqueFd fd(memfd_create("fuzz", MFD_CLOEXEC));
  if (size == 0) return 0;
  const Format& format = MediaFormats()[data[0] % MediaFormats().size()];
  const size_t length = size - 1;
  if (ftruncate(fd.get(), 0) != 0 || pwrite(fd.get(), data + 1, length, 0) != static_cast<ssize_t>(length)) abort();
  Findings findings;
  try {
    format.extract({fd.get(), length, format.type, "mp3"}, findings);
  } catch (const std::exception&) {
  }
  findings.Take();
  return 0;
}
