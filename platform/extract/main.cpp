// Reads what is in one file.
#include <fcntl.h>
#include <magic.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <exception>
#include <stdexcept>
#include <string>
#include <system_error>

#include "common/json.h"
#include "common/strings.h"
#include "common/unique_fd.h"
#include "extract/formats.h"

namespace {

using namespace platform::extract;

std::string TypeOf(int fd) {
  const magic_t cookie = magic_open(MAGIC_MIME_TYPE);
  if (cookie == nullptr || magic_load(cookie, nullptr) != 0) throw std::runtime_error("no table of file types");
  const char* const type = magic_descriptor(cookie, fd);
  const std::string result = type == nullptr ? "application/octet-stream" : type;
  magic_close(cookie);
  return result;
}

int Print(const std::string& path) {
  const quarrox::UniqueFd fd(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  struct stat info;
  if (!fd || fstat(fd.get(), &info) != 0) throw std::system_error(errno, std::generic_category(), path);
  const Source source{fd.get(), static_cast<uint64_t>(info.st_size), TypeOf(fd.get()),
                      quarrox::GetFileExtension(path, true)};
  Findings findings;
  const Extractor extract = FindExtractor(source.type);
  printf("type: %s%s\n", source.type.c_str(), extract == nullptr ? " (not read)" : "");
  int status = 0;
  try {
    if (extract != nullptr) extract(source, findings);
  } catch (const std::exception& error) {
    printf("damaged: %s\n", error.what());
    status = 1;
  }
  printf("%s\n", findings.Take().toStyledString().c_str());
  return status;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    fputs("usage: vexocontentextract FILE\n", stderr);
    return 2;
  }
  try {
    return Print(argv[1]);
  } catch (const std::exception& error) {
    fprintf(stderr, "vexocontentextract: %s\n", error.what());
    return 1;
  }
}
