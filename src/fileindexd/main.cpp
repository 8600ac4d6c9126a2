#include <signal.h>
#include <sys/prctl.h>
#include <syslog.h>

#include <cstdio>
#include <exception>
#include <string>
#include <vector>

#include "common/log.h"
#include "daemon.h"
#include "fileindex/communication.h"
#include "index_handler.h"
#include "options.h"
#include "worker.h"

namespace {

using namespace quarrox::fileindexd;

int Run(const Options& options) {
  if (!options.worker) {
    std::vector<std::string> worker_options;
    if (options.foreground) worker_options.emplace_back("--foreground");
    if (options.eager) worker_options.emplace_back("--eager");
    Daemon(quarrox::fileindex::kDaemonSocketPath, worker_options).Run();
    return 0;
  }
  prctl(PR_SET_NAME, "fileindexd");  // a worker is started by the name of its file in /proc, which is "exe"
  IndexHandler handler(options.share);
  return Worker(options.share, handler, options.eager).Run();
}

int Serve(const Options& options) {
  // Whoever goes away while we write to them ends that, not us.
  signal(SIGPIPE, SIG_IGN);
  openlog("fileindexd", LOG_PID | (options.foreground ? LOG_PERROR : 0), LOG_DAEMON);
  try {
    return Run(options);
  } catch (const std::exception& error) {
    errno = 0;
    QUARROX_LOG_FAILURE("%s", error.what());
    if (!options.foreground) fprintf(stderr, "fileindexd: %s\n", error.what());
    return 1;
  }
}

}  // namespace

int main(int argc, char** argv) {
  try {
    const Options options = ParseOptions(argc, argv);
    if (options.version) {
      puts("fileindexd " FILEINDEX_VERSION);
      return 0;
    }
    if (!options.help) return Serve(options);
    fputs(kUsage, stdout);
    return 0;
  } catch (const UsageError& error) {
    fprintf(stderr, "fileindexd: %s\n\n%s", error.what(), kUsage);
    return 2;
  }
}
