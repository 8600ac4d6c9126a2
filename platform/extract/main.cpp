// Reads what is in files: one that a person names, or those that another process hands over.
#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <clocale>
#include <cstdio>
#include <cstring>
#include <exception>
#include <string>
#include <system_error>

#include "common/json.h"
#include "common/strings.h"
#include "common/unique_fd.h"
#include "extract/file_type.h"
#include "extract/sandbox.h"
#include "extract/server.h"

namespace {

using namespace platform::extract;

int Print(const std::string& path) {
  const quarrox::UniqueFd fd(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  struct stat info;
  if (!fd || fstat(fd.get(), &info) != 0) throw std::system_error(errno, std::generic_category(), path);
  const FileTypes types;
  EnterSandbox();
  Source source{fd.get(), static_cast<uint64_t>(info.st_size), {}, quarrox::GetFileExtension(path, true)};
  source.type = types.Of(source);
  printf("type: %s%s\n", source.type.c_str(),
         FindExtractor(source.type) == nullptr ? " (no format that is parsed)" : "");
  Findings findings;
  int status = 0;
  try {
    ReaderOf(source.type)(source, findings);
  } catch (const std::exception& error) {
    printf("damaged: %s\n", error.what());
    status = 1;
  }
  printf("%s\n", findings.Take().toStyledString().c_str());
  return status;
}

// Standard input is the socket.
int Work() {
  const FileTypes types;
  const int parent = OpenParent();
  const Json::Value features = EnterSandbox();
  EndWith(parent);
  Serve(STDIN_FILENO, features, {[&](const Source& source) { return types.Of(source); }, ReaderOf});
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    fputs("usage: vexocontentextract FILE\n       vexocontentextract --worker\n", stderr);
    return 2;
  }
  setlocale(LC_CTYPE, "C.UTF-8");  // names in archives may be any Unicode
  try {
    const int status = strcmp(argv[1], "--worker") == 0 ? Work() : Print(argv[1]);
    fflush(stdout);
    _exit(status);  // what threads of libraries do at the end is of no use
  } catch (const std::exception& error) {
    fprintf(stderr, "vexocontentextract: %s\n", error.what());
    return 1;
  }
}
