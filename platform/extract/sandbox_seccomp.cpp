// Which system calls are allowed.
#include <fcntl.h>
#include <sched.h>
#include <seccomp.h>
#include <sys/ioctl.h>

#include <cerrno>
#include <memory>

#include "extract/sandbox.h"

namespace platform::extract {
namespace {

// What reading files, threads and filters take. Names that a processor does not have are left out.
constexpr const char* kAllowed[] = {
    // open files, and what the file system says of others
    "read", "readv", "pread64", "preadv", "write", "writev", "lseek", "_llseek", "close", "close_range", "fstat",
    "fstat64", "stat", "stat64", "lstat", "lstat64", "newfstatat", "fstatat64", "statx", "fstatfs", "fstatfs64",
    "statfs", "statfs64", "access", "faccessat", "faccessat2", "readlink", "readlinkat", "getcwd", "getdents",
    "getdents64", "memfd_create", "sendfile", "sendfile64", "fgetxattr", "flistxattr", "fadvise64", "readahead", "dup",
    "dup2", "dup3", "pipe", "pipe2", "fcntl", "fcntl64", "umask",
    // waiting and answers
    "poll", "ppoll", "ppoll_time64", "select", "_newselect", "pselect6", "epoll_create1", "epoll_ctl", "epoll_wait",
    "epoll_pwait", "eventfd2", "recvmsg", "sendmsg", "recvfrom", "sendto", "recv", "send",
    // memory
    "mmap", "mmap2", "munmap", "mprotect", "mremap", "madvise", "brk", "mincore", "membarrier",
    // threads, and programs that are started
    "futex", "futex_time64", "set_robust_list", "get_robust_list", "rseq", "set_tid_address", "arch_prctl",
    "set_thread_area", "fork", "vfork", "execve", "exit", "exit_group", "wait4", "waitid", "waitpid", "getpid",
    "gettid", "getppid", "getpgrp", "getpgid", "getsid", "getuid", "geteuid", "getgid", "getegid", "getgroups",
    "getresuid", "getresgid", "getuid32", "geteuid32", "getgid32", "getegid32", "prctl", "kill", "tgkill",
    "sched_yield", "sched_getaffinity", "sched_getparam", "sched_getscheduler", "getpriority", "getrlimit",
    "ugetrlimit", "setrlimit", "getrusage", "sysinfo", "uname", "getcpu",
    // signals
    "rt_sigaction", "rt_sigprocmask", "rt_sigreturn", "sigreturn", "rt_sigsuspend", "rt_sigtimedwait", "rt_sigpending",
    "sigaltstack", "restart_syscall", "pause", "alarm", "setitimer",
    // time and chance
    "clock_gettime", "clock_gettime64", "clock_getres", "clock_nanosleep", "clock_nanosleep_time64", "nanosleep",
    "gettimeofday", "time", "times", "getrandom"};

// The C library does without these where the kernel does not have them, and asks in a way that can be looked into.
constexpr const char* kUnknown[] = {"clone3", "openat2"};

// Nothing that reads a file comes near these: whoever calls them has taken over the process.
constexpr const char* kDeadly[] = {
    "ptrace",      "process_vm_readv", "process_vm_writev", "mount",          "umount2",       "move_mount",
    "fsopen",      "open_tree",        "pivot_root",        "chroot",         "unshare",       "setns",
    "bpf",         "perf_event_open",  "userfaultfd",       "io_uring_setup", "keyctl",        "add_key",
    "request_key", "init_module",      "finit_module",      "delete_module",  "kexec_load",    "kexec_file_load",
    "reboot",      "swapon",           "swapoff",           "settimeofday",   "clock_settime", "open_by_handle_at",
    "pidfd_getfd"};

// What is asked of descriptors.
constexpr scmp_datum_t kQuestions[] = {TCGETS, FIONREAD, FIONBIO, FIOCLEX};

constexpr scmp_datum_t kMakesOrCuts = O_CREAT | O_TRUNC | (O_TMPFILE & ~O_DIRECTORY);
constexpr scmp_datum_t kNamespaces =
    CLONE_NEWNS | CLONE_NEWCGROUP | CLONE_NEWUTS | CLONE_NEWIPC | CLONE_NEWUSER | CLONE_NEWPID | CLONE_NEWNET;

class Filter {
 public:
  Filter() : context_(seccomp_init(SCMP_ACT_ERRNO(EPERM)), seccomp_release) {}

  template <typename... Conditions>
  void Add(uint32_t action, const char* call, Conditions... conditions) {
    const int number = seccomp_syscall_resolve_name(call);
    if (number == __NR_SCMP_ERROR) return;
    const scmp_arg_cmp all[] = {conditions..., {}};
    is_whole_ = is_whole_ && context_ &&
                seccomp_rule_add_array(context_.get(), action, number, sizeof...(conditions), all) == 0;
  }

  bool Load() { return is_whole_ && context_ && seccomp_load(context_.get()) == 0; }

 private:
  std::unique_ptr<void, void (*)(scmp_filter_ctx)> context_;
  bool is_whole_ = true;
};

}  // namespace

bool EnterSeccomp() {
  Filter filter;
  for (const char* call : kAllowed) filter.Add(SCMP_ACT_ALLOW, call);
  for (const char* call : kUnknown) filter.Add(SCMP_ACT_ERRNO(ENOSYS), call);
  for (const char* call : kDeadly) filter.Add(SCMP_ACT_KILL_PROCESS, call);
  filter.Add(SCMP_ACT_ALLOW, "open", scmp_arg_cmp{1, SCMP_CMP_MASKED_EQ, kMakesOrCuts, 0});
  filter.Add(SCMP_ACT_ALLOW, "openat", scmp_arg_cmp{2, SCMP_CMP_MASKED_EQ, kMakesOrCuts, 0});
  filter.Add(SCMP_ACT_ALLOW, "clone", scmp_arg_cmp{0, SCMP_CMP_MASKED_EQ, kNamespaces, 0});
  filter.Add(SCMP_ACT_ALLOW, "prlimit64", scmp_arg_cmp{0, SCMP_CMP_EQ, 0, 0});  // of this process only
  for (const scmp_datum_t request : kQuestions) {
    filter.Add(SCMP_ACT_ALLOW, "ioctl", scmp_arg_cmp{1, SCMP_CMP_EQ, request, 0});
  }
  return filter.Load();
}

}  // namespace platform::extract
