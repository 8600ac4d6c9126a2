#include "recovery.h"

#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "common/log.h"

namespace quarrox::elasticd {
namespace {

// How a check ends that could not be made.
constexpr int kNoCheck = 127;

int Wait(pid_t child) {
  int status = 0;
  while (waitpid(child, &status, 0) < 0) {
    if (errno != EINTR) return kNoCheck;
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

}  // namespace

void Recovery::Start(std::vector<Job> jobs) {
  if (!jobs.empty()) thread_ = std::thread([this, jobs = std::move(jobs)] { Work(jobs); });
}

void Recovery::Stop() {
  {
    const std::lock_guard lock(mutex_);
    stopping_ = true;
    if (child_ != 0) kill(child_, SIGKILL);
  }
  if (thread_.joinable()) thread_.join();
}

void Recovery::Work(const std::vector<Job>& jobs) {
  for (const Job& job : jobs) {
    const int status = Check(job.directory);
    {
      const std::lock_guard lock(mutex_);
      if (stopping_) return;
    }
    // One that cannot be looked at is used as it is: what is wrong with it shows then.
    job.done(status == 0 || status == kNoCheck);
  }
}

int Recovery::Check(const std::string& directory) {
  std::string words[] = {"vexoelasticd", "--check", directory};
  char* arguments[] = {words[0].data(), words[1].data(), words[2].data(), nullptr};
  posix_spawnattr_t attributes;
  posix_spawnattr_init(&attributes);
  sigset_t none;
  sigemptyset(&none);
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK);
  pid_t child = 0;
  {
    const std::lock_guard lock(mutex_);
    const int error =
        stopping_ ? ECANCELED : posix_spawn(&child, "/proc/self/exe", nullptr, &attributes, arguments, environ);
    posix_spawnattr_destroy(&attributes);
    if (error != 0) {
      errno = error;
      QUARROX_LOG_FAILURE("The check of %s could not be made", directory.c_str());
      return kNoCheck;
    }
    child_ = child;
  }
  siginfo_t ended;
  while (waitid(P_PID, static_cast<id_t>(child), &ended, WEXITED | WNOWAIT) != 0 && errno == EINTR) {
  }
  const std::lock_guard lock(mutex_);  // so that nobody else's process is killed
  child_ = 0;
  return Wait(child);
}

}  // namespace quarrox::elasticd
