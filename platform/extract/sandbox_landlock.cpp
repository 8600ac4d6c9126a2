// Which files may be opened, and what may be reached outside of files.
#include <fcntl.h>
#include <linux/landlock.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>

#include "common/unique_fd.h"
#include "extract/sandbox.h"

using quarrox::UniqueFd;

namespace platform::extract {
namespace {

// The kernel's structure as of version 6; the system's header may be older. Where the kernel is older, its parts that
// came later are zero.
struct Ruleset {
  uint64_t files = 0;
  uint64_t network = 0;
  uint64_t scoped = 0;
};

// What each version of the kernel's interface can deny: all rights on files, binding and connecting of TCP sockets,
// abstract sockets and signals of others.
constexpr Ruleset kKnown[] = {{0x1fff, 0, 0}, {0x3fff, 0, 0}, {0x7fff, 0, 0},
                              {0x7fff, 3, 0}, {0xffff, 3, 0}, {0xffff, 3, 3}};

constexpr uint64_t kRead = LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_READ_DIR;

struct Place {
  const char* path;
  uint64_t rights;
};

// Where programs, libraries, and their tables of characters, fonts and times lie.
constexpr Place kPlaces[] = {
    {"/usr", kRead | LANDLOCK_ACCESS_FS_EXECUTE},
    {"/lib", kRead},
    {"/lib32", kRead},
    {"/lib64", kRead},
    {"/etc", kRead},
    {"/var/cache/fontconfig", kRead},
    {"/dev/null", LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_WRITE_FILE},
};

}  // namespace

int EnterLandlock() {
  const auto version =
      static_cast<int>(syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION));
  if (version < 1) return 0;
  const auto last = static_cast<int>(std::size(kKnown));
  const Ruleset rules = kKnown[std::min(version, last) - 1];
  const UniqueFd set(static_cast<int>(syscall(SYS_landlock_create_ruleset, &rules, sizeof(rules), 0)));
  if (!set) return 0;
  for (const Place& place : kPlaces) {
    const UniqueFd at(open(place.path, O_PATH | O_CLOEXEC));
    if (!at) continue;
    const landlock_path_beneath_attr beneath = {place.rights & rules.files, at.get()};
    if (syscall(SYS_landlock_add_rule, set.get(), LANDLOCK_RULE_PATH_BENEATH, &beneath, 0) != 0) return 0;
  }
  return syscall(SYS_landlock_restrict_self, set.get(), 0) == 0 ? version : 0;
}

}  // namespace platform::extract
