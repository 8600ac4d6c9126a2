// Whatever a document holds, its extractor ends, in order or with an exception. The first byte selects the format.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <exception>

#include "common/unique_fd.h"
#include "extract/formats.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace platform::extract;
  if (size == 0) return 0;
  const Format& format = DocumentFormats()[data[0] % DocumentFormats().size()];
  const quarrox::UniqueFd fd(memfd_create("document", MFD_CLOEXEC));
  if (write(fd.get(), data + 1, size - 1) != static_cast<ssize_t>(size - 1)) abort();
  Findings findings;
  try {
    format.extract(Source{fd.get(), size - 1, format.type, ""}, findings);
  } catch (const std::exception&) {
    // Most inputs are damaged.
  }
  findings.Take();
  return 0;
}
