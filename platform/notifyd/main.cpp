#include <cstdio>
#include <exception>

#include "common/error.h"
#include "common/log.h"
#include "daemon.h"
#include "options.h"

namespace {

using namespace quarrox::notifyd;

int Serve(const Options& options) {
  openlog("vexonotifyd", LOG_PID | (options.foreground ? LOG_PERROR : 0), LOG_DAEMON);
  try {
    RunDaemon(options);
    return 0;
  } catch (const std::exception& error) {
    errno = 0;
    QUARROX_LOG_FAILURE("%s", quarrox::log::Text(error.what()).c_str());
    if (!options.foreground) fprintf(stderr, "vexonotifyd: %s\n", error.what());
    return 1;
  }
}

}  // namespace

int main(int argc, char** argv) {
  try {
    const Options options = ParseOptions(argc, argv);
    if (options.version) {
      puts("vexonotifyd " FILEINDEX_VERSION);
      return 0;
    }
    if (!options.help) return Serve(options);
    fputs(kUsage, stdout);
    return 0;
  } catch (const UsageError& error) {
    fprintf(stderr, "vexonotifyd: %s\n\n%s", error.what(), kUsage);
    return 2;
  }
}
