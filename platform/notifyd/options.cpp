#include "options.h"

#include <getopt.h>

namespace quarrox::notifyd {
namespace {

enum Option { kWatch = 1, kQueue, kMethod, kLimited, kHelp };

constexpr option kOptions[] = {
    {"watch", required_argument, nullptr, kWatch},   {"queue", required_argument, nullptr, kQueue},
    {"method", required_argument, nullptr, kMethod}, {"limited-queue", no_argument, nullptr, kLimited},
    {"help", no_argument, nullptr, kHelp},           {nullptr, 0, nullptr, 0},
};

Method ParseMethod(const std::string& name) {
  if (name == "auto") return Method::kAuto;
  if (name == "fanotify") return Method::kFanotify;
  if (name == "inotify") return Method::kInotify;
  throw UsageError("'" + name + "' is no method: give fanotify, inotify or auto");
}

void Apply(Options& options, int option) {
  switch (option) {
    case kWatch:
      options.dir = optarg;
      break;
    case kQueue:
      options.queue = optarg;
      break;
    case kMethod:
      options.method = ParseMethod(optarg);
      break;
    case kLimited:
      options.limited_queue = true;
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
    "Usage: vexonotifyd --watch DIR --queue FILE [--method METHOD] [--limited-queue]\n"
    "\n"
    "Writes what happens in DIR and everything below it to the event queue FILE, one line an event, until SIGTERM.\n"
    "\n"
    "  --watch DIR       the directory to watch; what is mounted below it is watched with inotify only\n"
    "  --queue FILE      the queue to append to; it may lie inside DIR\n"
    "  --method METHOD   fanotify (needs root), inotify (one watch a directory), or auto: the first that is\n"
    "                    permitted here (default)\n"
    "  --limited-queue   let the kernel drop events past its limit, which is then reported as a loss\n"
    "  --help            show this text\n";

Options ParseOptions(int argc, char** argv) {
  Options options;
  opterr = 0;
  optind = 1;
  for (int option; (option = getopt_long(argc, argv, "", kOptions, nullptr)) != -1;) Apply(options, option);
  if (options.help) return options;
  if (optind < argc) throw UsageError(std::string("'") + argv[optind] + "' is not expected");
  if (options.dir.empty()) throw UsageError("--watch DIR is missing");
  if (options.queue.empty()) throw UsageError("--queue FILE is missing");
  return options;
}

}  // namespace quarrox::notifyd
