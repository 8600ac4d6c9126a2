#include "options.h"

#include <getopt.h>

namespace quarrox::fileindexd {
namespace {

enum Option { kForeground = 1, kEager, kWorker, kVersion, kHelp };

constexpr option kOptions[] = {
    {"foreground", no_argument, nullptr, kForeground},
    {"eager", no_argument, nullptr, kEager},
    {"worker", required_argument, nullptr, kWorker},
    {"version", no_argument, nullptr, kVersion},
    {"help", no_argument, nullptr, kHelp},
    {nullptr, 0, nullptr, 0},
};

void Apply(Options& options, int option) {
  switch (option) {
    case kForeground:
      options.foreground = true;
      break;
    case kEager:
      options.eager = true;
      break;
    case kWorker:
      options.worker = true;
      options.share = optarg;
      break;
    case kVersion:
      options.version = true;
      break;
    case kHelp:
      options.help = true;
      break;
    default:
      throw UsageError("An option is unknown or lacks its value");
  }
}

}  // namespace

const char* const kUsage =
    "Usage: fileindexd [--foreground] [--eager]\n"
    "\n"
    "Drains the event queues of all indexed shares, one process a share, until SIGTERM. It never leaves the "
    "foreground.\n"
    "\n"
    "  --foreground     write the log to standard error, too\n"
    "  --eager          work as fast as the machine can; else the others on it come first\n"
    "  --worker SHARE   serve this one share; so the daemon starts its workers\n"
    "  --version        print the program's version\n"
    "  --help           show this text\n";

Options ParseOptions(int argc, char** argv) {
  Options options;
  opterr = 0;
  optind = 1;
  for (int option; (option = getopt_long(argc, argv, "", kOptions, nullptr)) != -1;) Apply(options, option);
  if (optind < argc && !options.help && !options.version)
    throw UsageError(std::string("'") + argv[optind] + "' is not expected");
  return options;
}

}  // namespace quarrox::fileindexd
