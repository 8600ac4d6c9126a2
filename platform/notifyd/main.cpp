#include <cstdio>
#include <exception>

#include "common/error.h"
#include "common/log.h"
#include "daemon.h"
#include "options.h"

int main(int argc, char** argv) {
  using namespace quarrox::notifyd;
  openlog("vexonotifyd", LOG_PID, LOG_DAEMON);
  try {
    const Options options = ParseOptions(argc, argv);
    if (options.help) {
      fputs(kUsage, stdout);
    } else {
      RunDaemon(options);
    }
    return 0;
  } catch (const UsageError& error) {
    fprintf(stderr, "vexonotifyd: %s\n\n%s", error.what(), kUsage);
    return 2;
  } catch (const std::exception& error) {
    errno = 0;
    QUARROX_LOG_FAILURE("%s", quarrox::log::Text(error.what()).c_str());
    fprintf(stderr, "vexonotifyd: %s\n", error.what());
    return 1;
  }
}
