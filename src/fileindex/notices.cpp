#include "fileindex/notices.h"

#include "vexo/exec.h"

namespace quarrox::fileindex {
namespace {

constexpr char kNotifyTool[] = "/usr/vexo/bin/vexokosnotify";
constexpr char kApplication[] = "VEXO.Quarrox.Application";

// Nothing of ours but the effective user is passed on to the tool.
constexpr int kExecFlags = VLIBC_EXEC_NO_STDIN | VLIBC_EXEC_NO_STDOUT | VLIBC_EXEC_NO_STDERR | VLIBC_EXEC_CLOSE_FDS |
                           VLIBC_EXEC_RESET_SIGNALS | VLIBC_EXEC_AS_EFFECTIVE;
static_assert(kExecFlags == 0xBB);

constexpr const char* kEnd = nullptr;

}  // namespace

// The last two arguments wrap the message's link to the application's preferences.
int SendKOSNotify() {
  return VLIBCExecl(kNotifyTool, kExecFlags, "-c", kApplication, "-b", "true", "-e", "false", "@administrators",
                    "app:displayname", "error:index_no_space",
                    R"(<a data-vexo-app="VEXO.Quarrox.Application" data-vexo-fn="preference">)", "</a>", kEnd);
}

int NotifyLackOfMemory() {
  return VLIBCExecl(kNotifyTool, kExecFlags, "-c", kApplication, "@administrators", "app:displayname",
                    "error:lack_of_memory", kEnd);
}

}  // namespace quarrox::fileindex
