#include "delivery.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/unique_fd.h"

namespace quarrox::kosnotify {
namespace {

using Clock = std::chrono::steady_clock;

// A file in memory, read from its beginning: unlike a pipe it takes any text at once, whoever reads it.
UniqueFd InputFile(const std::string& text) {
  UniqueFd fd(memfd_create("notice", MFD_CLOEXEC));
  const bool whole = fd && write(fd.get(), text.data(), text.size()) == static_cast<ssize_t>(text.size());
  return whole && lseek(fd.get(), 0, SEEK_SET) == 0 ? std::move(fd) : UniqueFd();
}

std::vector<char*> Pointers(const std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  for (const std::string& text : texts) pointers.push_back(const_cast<char*>(text.c_str()));  // exec changes none
  pointers.push_back(nullptr);
  return pointers;
}

// In a session of its own, so that it can be killed with all that it has started. 0, or what errno would be.
int Start(const Delivery& delivery, int input, pid_t* child) {
  const std::vector<char*> arguments = Pointers(delivery.arguments);
  const std::vector<char*> environment = Pointers(delivery.environment);
  posix_spawn_file_actions_t actions;
  posix_spawnattr_t attributes;
  posix_spawn_file_actions_init(&actions);
  posix_spawnattr_init(&attributes);
  posix_spawn_file_actions_adddup2(&actions, input, STDIN_FILENO);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSID);
  const int error = posix_spawn(child, arguments[0], &actions, &attributes, arguments.data(), environment.data());
  posix_spawnattr_destroy(&attributes);
  posix_spawn_file_actions_destroy(&actions);
  return error;
}

// Whether a child has ended before the deadline.
bool AwaitEnd(pid_t child, Clock::time_point deadline) {
  // glibc 2.36 declares pidfd_open() for C only.
  const UniqueFd end(static_cast<int>(syscall(SYS_pidfd_open, child, 0)));
  for (;;) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now()).count();
    pollfd item = {end.get(), POLLIN, 0};
    const int count = end ? poll(&item, 1, static_cast<int>(std::max<int64_t>(0, left))) : 0;
    if (count >= 0 || errno != EINTR) return count > 0;
  }
}

bool Finish(const std::string& program, pid_t child, Clock::time_point deadline) {
  const bool ended = AwaitEnd(child, deadline);
  if (!ended) kill(-child, SIGKILL);
  int status = 0;
  while (waitpid(child, &status, 0) < 0 && errno == EINTR) {
  }
  if (!ended) {
    syslog(LOG_WARNING, "%s did not end in time and was killed; see \"notice time limit\" in /etc/vexo/platform.conf",
           program.c_str());
  } else if (WIFSIGNALED(status)) {
    syslog(LOG_WARNING, "%s was ended by signal %d", program.c_str(), WTERMSIG(status));
  } else if (WEXITSTATUS(status) != 0) {
    syslog(LOG_WARNING, "%s failed with status %d", program.c_str(), WEXITSTATUS(status));
  }
  return ended && status == 0;
}

}  // namespace

bool Deliver(const std::vector<Delivery>& deliveries, std::chrono::seconds time) {
  const Clock::time_point deadline = Clock::now() + time;
  std::vector<pid_t> children;
  for (const Delivery& delivery : deliveries) {
    const UniqueFd input = InputFile(delivery.input);
    pid_t child = 0;
    const int error = input ? Start(delivery, input.get(), &child) : errno;
    if (error != 0) syslog(LOG_WARNING, "%s cannot be run: %s", delivery.arguments[0].c_str(), strerror(error));
    children.push_back(error == 0 ? child : 0);
  }
  bool all = true;
  for (size_t i = 0; i < children.size(); ++i) {
    all = children[i] != 0 && Finish(deliveries[i].arguments[0], children[i], deadline) && all;
  }
  return all;
}

}  // namespace quarrox::kosnotify
