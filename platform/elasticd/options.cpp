#include "options.h"

#include <getopt.h>

namespace quarrox::elasticd {
namespace {

enum Option { kForeground = 1, kData, kCheck, kVersion, kHelp };

constexpr option kOptions[] = {
    {"foreground", no_argument, nullptr, kForeground},
    {"data", required_argument, nullptr, kData},
    {"check", required_argument, nullptr, kCheck},
    {"version", no_argument, nullptr, kVersion},
    {"help", no_argument, nullptr, kHelp},
    {nullptr, 0, nullptr, 0},
};

std::string Directory() {
  if (*optarg == '\0') throw UsageError("A directory's name is empty");
  return optarg;
}

void Apply(Options& options, int option) {
  switch (option) {
    case kForeground:
      options.foreground = true;
      break;
    case kData:
      options.data = Directory();
      break;
    case kCheck:
      options.check = Directory();
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
    "Usage: vexoelasticd [--foreground] [--data DIR]\n"
    "       vexoelasticd --check DIR\n"
    "\n"
    "Keeps full-text indexes and answers requests on /var/run/vexoelasticd.sock until SIGTERM. It never leaves the\n"
    "foreground.\n"
    "\n"
    "  --foreground   write the log to standard error, too\n"
    "  --data DIR     keep the list of indexes here (default /var/lib/vexoelasticd)\n"
    "  --check DIR    check the database in DIR: status 0 where it is sound, 1 where it is damaged\n"
    "  --version      print the program's version\n"
    "  --help         show this text\n";

Options ParseOptions(int argc, char** argv) {
  Options options;
  opterr = 0;
  optind = 1;
  for (int option; (option = getopt_long(argc, argv, "", kOptions, nullptr)) != -1;) Apply(options, option);
  if (optind < argc && !options.help && !options.version)
    throw UsageError(std::string("'") + argv[optind] + "' is not expected");
  return options;
}

}  // namespace quarrox::elasticd
