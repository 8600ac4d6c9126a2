#include "extract/sandbox.h"

#include <fcntl.h>
#include <grp.h>
#include <linux/capability.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "common/unique_fd.h"

namespace platform::extract {
namespace {

// How much address space a file may take: the longest mapping, and as much as the costliest formats take to be read.
// The program's own, which a sanitizer makes huge, comes on top. In bytes.
constexpr size_t kMostSpace = size_t{768} << 20;

// What a program that must seek gets is a copy in memory; nothing else can be written. In bytes.
constexpr rlim_t kMostWritten = rlim_t{128} << 20;

// Descriptors, the filters' pipes among them.
constexpr rlim_t kMostFiles = 24;

// The user and group with the fewest rights, the same numbers on every machine.
constexpr unsigned int kNobody = 65534;

bool Limit(__rlimit_resource_t resource, rlim_t value) {
  const rlimit limit = {value, value};
  return setrlimit(resource, &limit) == 0;
}

// What is open stays so, and all else is opened with the rights of nobody. In a user namespace that has no nobody, root
// is somebody ordinary; the capabilities go all the same.
bool GiveUpRights() {
  const bool is_root = geteuid() == 0;
  const bool has_groups = is_root && setgroups(0, nullptr) != 0;
  const bool is_nobody =
      is_root && setresgid(kNobody, kNobody, kNobody) == 0 && setresuid(kNobody, kNobody, kNobody) == 0;
  const bool has_nobody = is_nobody || errno != EINVAL;
  __user_cap_header_struct header = {_LINUX_CAPABILITY_VERSION_3, 0};
  const __user_cap_data_struct none[_LINUX_CAPABILITY_U32S_3] = {};
  const bool is_ordinary = !is_root || !has_nobody || (is_nobody && !has_groups);
  return syscall(SYS_capset, &header, none) == 0 && is_ordinary;
}

// Sizes, in pages, stand in the file's first two numbers. It is opened while that is allowed.
int MemoryFile() {
  static const int fd = open("/proc/self/statm", O_RDONLY | O_CLOEXEC);
  return fd;
}

}  // namespace

Memory MemoryNow() {
  char text[128] = "";
  Memory memory;
  if (pread(MemoryFile(), text, sizeof(text) - 1, 0) <= 0) return memory;
  if (sscanf(text, "%zu %zu", &memory.space, &memory.resident) != 2) return {};
  const auto page = static_cast<size_t>(sysconf(_SC_PAGESIZE));
  return {memory.space * page, memory.resident * page};
}

void LimitTime(unsigned int seconds) {
  rusage used = {};
  getrusage(RUSAGE_SELF, &used);
  rlimit limit = {};
  getrlimit(RLIMIT_CPU, &limit);
  limit.rlim_cur = static_cast<rlim_t>(used.ru_utime.tv_sec + used.ru_stime.tv_sec + 1) + seconds;
  setrlimit(RLIMIT_CPU, &limit);
}

Json::Value EnterSandbox() {
  const bool limits = Limit(RLIMIT_AS, MemoryNow().space + kMostSpace) && Limit(RLIMIT_CORE, 0) &&
                      Limit(RLIMIT_NOFILE, kMostFiles) && Limit(RLIMIT_FSIZE, kMostWritten);
  prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);  // the other layers take it for granted
  Json::Value layers(Json::objectValue);
  layers["limits"] = limits;
  layers["landlock"] = EnterLandlock();
  layers["user"] = GiveUpRights();
  layers["seccomp"] = EnterSeccomp();
  return layers;
}

}  // namespace platform::extract
