#include "vexo/exec.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <vector>

#include "common/unique_fd.h"
#include "vexo/error.h"

using quarrox::UniqueFd;

namespace {

// From fork to exec only async-signal-safe calls are made: another thread may have held any lock when the child was
// made.

// The first descriptor above standard input, output and error, which a caller may have closed.
constexpr int kFirstOther = 3;

// Handlers do not outlive the exec, but none of them may run in the child before it; ignored signals stay ignored
// unless they are to be reset.
void ResetHandlers(bool ignored_too) {
  for (int number = 1; number <= SIGRTMAX; ++number) {
    struct sigaction action;
    if (sigaction(number, nullptr, &action) != 0) continue;
    if (action.sa_handler == SIG_DFL || (action.sa_handler == SIG_IGN && !ignored_too)) continue;
    action = {};
    action.sa_handler = SIG_DFL;
    sigaction(number, &action, nullptr);
  }
}

bool SetSignals(int flags, const sigset_t& callers_mask) {
  const bool reset = (flags & VLIBC_EXEC_RESET_SIGNALS) != 0;
  ResetHandlers(reset);
  sigset_t none;
  sigemptyset(&none);
  return sigprocmask(SIG_SETMASK, reset ? &none : &callers_mask, nullptr) == 0;
}

bool SetFiles(int flags) {
  constexpr int kStandardFlags[] = {VLIBC_EXEC_NO_STDIN, VLIBC_EXEC_NO_STDOUT, VLIBC_EXEC_NO_STDERR};
  const int opened = open("/dev/null", O_RDWR | O_CLOEXEC);
  // Not one of the three itself: dup2 onto itself would leave it to be closed.
  const int null = opened < 0 ? -1 : fcntl(opened, F_DUPFD_CLOEXEC, kFirstOther);
  if (null < 0) return false;
  for (int fd = 0; fd < kFirstOther; ++fd) {
    if ((flags & kStandardFlags[fd]) != 0 && dup2(null, fd) < 0) return false;
  }
  return (flags & VLIBC_EXEC_CLOSE_FDS) == 0 || close_range(kFirstOther, ~0U, CLOSE_RANGE_CLOEXEC) == 0;
}

bool SetIdentity(int flags) {
  if ((flags & VLIBC_EXEC_NEW_SESSION) != 0 && setsid() < 0) return false;
  if ((flags & VLIBC_EXEC_AS_EFFECTIVE) == 0) return true;
  const gid_t group = getegid();
  const uid_t user = geteuid();
  return setresgid(group, group, group) == 0 && setresuid(user, user, user) == 0;
}

// Sends errno to the parent; where all goes well the end of the pipe tells it so.
[[noreturn]] void Fail(int report) {
  const int error = errno;
  while (write(report, &error, sizeof(error)) < 0 && errno == EINTR) {
  }
  _exit(127);
}

[[noreturn]] void RunChild(char* const* arguments, int flags, const sigset_t& mask, int pipe_end) {
  const int report = fcntl(pipe_end, F_DUPFD_CLOEXEC, kFirstOther);
  if (report < 0) Fail(pipe_end);
  if ((flags & VLIBC_EXEC_DETACH) != 0) {
    // The program becomes an orphan at once, and init is who reaps it.
    const pid_t orphan = _Fork();
    if (orphan < 0) Fail(report);
    if (orphan > 0) _exit(0);
  }
  if (SetIdentity(flags) && SetFiles(flags) && SetSignals(flags, mask)) execv(arguments[0], arguments);
  Fail(report);
}

// No signal reaches the child before its handlers are reset.
pid_t ForkChild(char* const* arguments, int flags, int report) {
  sigset_t all;
  sigset_t mask;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, &mask);
  const pid_t child = fork();
  if (child == 0) RunChild(arguments, flags, mask, report);
  const int error = errno;
  pthread_sigmask(SIG_SETMASK, &mask, nullptr);
  errno = error;
  return child;
}

// The errno with which the start failed; 0 where it did not.
int ReadReport(int fd) {
  int error = 0;
  ssize_t n;
  while ((n = read(fd, &error, sizeof(error))) < 0 && errno == EINTR) {
  }
  if (n < 0) return errno;
  return n == sizeof(error) ? error : 0;
}

int Wait(pid_t child) {
  int status;
  while (waitpid(child, &status, 0) < 0) {
    if (errno != EINTR) return -1;
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

int Run(char* const* arguments, int flags) {
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) return -1;
  const UniqueFd reader(ends[0]);
  UniqueFd writer(ends[1]);
  const pid_t child = ForkChild(arguments, flags, writer.get());
  if (child < 0) return -1;
  writer.Close();
  const int error = ReadReport(reader.get());
  const int result = Wait(child);
  if (error == 0) return result;
  errno = error;
  return -1;
}

int RunList(const char* path, int flags, va_list list) {
  std::vector<char*> arguments = {const_cast<char*>(path)};  // exec takes them so, and changes none
  do {
    arguments.push_back(va_arg(list, char*));
  } while (arguments.back() != nullptr);
  const int result = Run(arguments.data(), flags);
  if (result < 0) VLIBCErrSet(VEXO_ERR_SYSTEM);
  return result;
}

}  // namespace

int VLIBCExec(const char* path, ...) {
  va_list list;
  va_start(list, path);
  const int result = RunList(path, VLIBC_EXEC_CLOSE_FDS | VLIBC_EXEC_RESET_SIGNALS, list);
  va_end(list);
  return result;
}

int VLIBCExecl(const char* path, int flags, ...) {
  va_list list;
  va_start(list, flags);
  const int result = RunList(path, flags, list);
  va_end(list);
  return result;
}
