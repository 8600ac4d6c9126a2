#include "options.h"

#include <getopt.h>

namespace quarrox::notifyd {
namespace {

enum Option { kWatch = 1, kQueue, kMethod, kLimited, kForeground, kVersion, kHelp };

constexpr option kOptions[] = {
    {"watch", required_argument, nullptr, kWatch},
    {"queue", required_argument, nullptr, kQueue},
    {"method", required_argument, nullptr, kMethod},
    {"limited-queue", no_argument, nullptr, kLimited},
    {"foreground", no_argument, nullptr, kForeground},
    {"version", no_argument, nullptr, kVersion},
    {"help", no_argument, nullptr, kHelp},
    {nullptr, 0, nullptr, 0},
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
    case kForeground:
      options.foreground = true;
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
    "Usage: vexonotifyd [--foreground] [--method METHOD] [--limited-queue]\n"
    "       vexonotifyd --watch DIR --queue FILE [--foreground] [--method METHOD] [--limited-queue]\n"
    "\n"
    "Writes what happens in folders and everything below them to event queues, one line an event, until SIGTERM: by "
    "the\n"
    "configurations /var/lib/vexonotifyd/*.json, which are followed as they come, change and go, or for one folder.\n"
    "It never leaves the foreground.\n"
    "\n"
    "  --watch DIR       watch this directory; what is mounted below it is watched with inotify only\n"
    "  --queue FILE      its queue, to append to; it may lie inside DIR\n"
    "  --method METHOD   fanotify (needs root), inotify (one watch a directory), or auto: the first that is\n"
    "                    permitted here (default)\n"
    "  --foreground      write the log to standard error, too\n"
    "  --limited-queue   let the kernel drop events past its limit, which is then reported as a loss\n"
    "  --version         print the program's version\n"
    "  --help            show this text\n";

Options ParseOptions(int argc, char** argv) {
  Options options;
  opterr = 0;
  optind = 1;
  for (int option; (option = getopt_long(argc, argv, "", kOptions, nullptr)) != -1;) Apply(options, option);
  if (options.help || options.version) return options;
  if (optind < argc) throw UsageError(std::string("'") + argv[optind] + "' is not expected");
  if (options.dir.empty() && !options.queue.empty()) throw UsageError("--watch DIR is missing");
  if (!options.dir.empty() && options.queue.empty()) throw UsageError("--queue FILE is missing");
  return options;
}

}  // namespace quarrox::notifyd
