// An /etc, a /var, a /run and a /tmp that may be written to without touching the machine's own: for tests of fixed
// paths.
#pragma once

#include <sched.h>
#include <sys/mount.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>

namespace quarrox::support {

class PrivateMachine {
 public:
  // Takes the calling thread, and the threads and processes that it starts from then on, into a mount namespace of
  // their own, as an ordinary user into one where it is root. Copies of what was there are written to; they and the
  // scratch directory are in memory and end with the last process. A process enters once, however often it asks. False
  // where that is not possible, or not wholly.
  bool Enter() {
    static const bool entered = TryEnter();
    return entered;
  }

  std::string scratch() const { return std::string(kMemory) + "/scratch"; }

 private:
  static constexpr char kMemory[] = "/mnt";  // there on every machine

  bool TryEnter() {
    const long uid = syscall(SYS_geteuid);  // geteuid() is replaced where the platform is
    const std::string ids[] = {std::to_string(uid), std::to_string(syscall(SYS_getegid))};
    const bool root = uid == 0;
    if (unshare(root ? CLONE_NEWNS : CLONE_NEWNS | CLONE_NEWUSER) != 0) return false;
    if (!root) {
      std::ofstream("/proc/self/setgroups") << "deny";
      std::ofstream("/proc/self/uid_map") << "0 " << ids[0] << " 1";
      std::ofstream("/proc/self/gid_map") << "0 " << ids[1] << " 1";
    }
    return mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
           mount("scratch", kMemory, "tmpfs", 0, "mode=0755") == 0 && std::filesystem::create_directory(scratch()) &&
           Overlay("/etc", "etc") && Overlay("/var", "var") && Empty("/run") && Empty("/tmp");
  }

  static bool Empty(const char* dir) { return mount("scratch", dir, "tmpfs", 0, "mode=1777") == 0; }

  static bool Overlay(const char* dir, const std::string& name) {
    const std::string upper = kMemory + ("/" + name), work = upper + ".work";
    std::filesystem::create_directories(upper);
    std::filesystem::create_directories(work);
    const std::string options = std::string("lowerdir=") + dir + ",upperdir=" + upper + ",workdir=" + work;
    return mount("overlay", dir, "overlay", 0, options.c_str()) == 0;
  }
};

}  // namespace quarrox::support
