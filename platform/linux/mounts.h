// What is mounted on this machine.
//
// A path finds its mount by the number that the kernel gives each mount. The table of mounts is read from the kernel as
// a whole, tens of microseconds and more, so it is kept until the kernel says that something was mounted or unmounted;
// asking the kernel for that costs one call.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <unordered_map>

namespace platform {

struct Mount {
  int fs_type = 0;          // VEXO_FS_*
  std::string type;         // as the kernel names it: "ext4", "fuse.sshfs"
  std::string source;       // the device, the server's directory, or a word of no meaning
  bool user_quota = false;  // users' and groups' quotas are enforced
  bool group_quota = false;
};

// An immutable table: whoever holds it may use it from any thread.
class MountTable {
 public:
  // Reads a file of /proc/self/mountinfo's form; a line that is of another form is left out. Null with errno where the
  // file cannot be read.
  static std::shared_ptr<const MountTable> Read(const char* file);

  // The mount of a number; null where there is none.
  const Mount* Find(uint64_t mount_id) const;

 private:
  std::unordered_map<uint64_t, Mount> mounts_;
};

// The mount that a path lies on. 0, with *mount null where the kernel shows this process no such mount (it lies outside
// the process's root, or there is no /proc); -1 with errno where the path cannot be looked at. Symbolic links are
// followed. Thread-safe.
int FindMount(const char* path, std::shared_ptr<const Mount>* mount);

}  // namespace platform
