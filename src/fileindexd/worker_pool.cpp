#include "worker_pool.h"

#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/log.h"
#include "worker.h"

namespace quarrox::fileindexd {
namespace {

// The rest of the child's life, without anything that allocates.
[[noreturn]] void Become(pid_t parent, char* const* arguments) {
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  if (getppid() == parent) execv("/proc/self/exe", arguments);
  _exit(127);  // as a shell says that it cannot be run
}

std::string Describe(int status) {
  if (WIFSIGNALED(status)) return "by signal " + std::to_string(WTERMSIG(status));
  return "with status " + std::to_string(WEXITSTATUS(status));
}

}  // namespace

void WorkerPool::Start(const std::string& share) {
  Worker& worker = workers_[share];
  worker.wanted = true;
  if (worker.pid == 0) worker.start_at = Clock::now();
}

void WorkerPool::End(const std::string& share) {
  const auto found = workers_.find(share);
  if (found == workers_.end()) return;
  Worker& worker = found->second;
  worker.wanted = false;
  if (worker.pid == 0) {
    workers_.erase(found);
  } else if (worker.kill_at == kNever) {
    kill(worker.pid, SIGTERM);
    worker.kill_at = Clock::now() + kTimeToEnd;
  }
}

void WorkerPool::EndAll() {
  for (const std::string& share : Shares()) End(share);
}

void WorkerPool::Tell(const std::string& share) const {
  const auto found = workers_.find(share);
  if (found != workers_.end() && found->second.pid != 0) kill(found->second.pid, SIGUSR1);
}

void WorkerPool::TellAll() const {
  for (const auto& [share, worker] : workers_) {
    if (worker.pid != 0) kill(worker.pid, SIGUSR1);
  }
}

std::vector<std::string> WorkerPool::Shares() const {
  std::vector<std::string> shares;
  for (const auto& [share, worker] : workers_) {
    if (worker.wanted) shares.push_back(share);
  }
  return shares;
}

bool WorkerPool::Has(const std::string& share) const {
  const auto found = workers_.find(share);
  return found != workers_.end() && found->second.wanted;
}

void WorkerPool::Spawn(const std::string& share, Worker& worker) const {
  const pid_t parent = getpid();
  std::vector<std::string> words = {"fileindexd", "--worker", share};
  words.insert(words.end(), options_.begin(), options_.end());
  std::vector<char*> arguments;
  for (std::string& word : words) arguments.push_back(word.data());
  arguments.push_back(nullptr);
  const pid_t pid = fork();
  if (pid == 0) Become(parent, arguments.data());
  worker.start_at = kNever;
  if (pid < 0) return StartLater(share, worker, std::string("cannot be started, reason=") + strerror(errno));
  worker.pid = pid;
  worker.started = Clock::now();
}

void WorkerPool::StartLater(const std::string& share, Worker& worker, const std::string& why) const {
  const std::chrono::seconds pause = worker.backoff.Next();
  worker.start_at = Clock::now() + pause;
  errno = 0;
  QUARROX_LOG_FAILURE("The worker of share %s %s; it is started again in %d s", share.c_str(), why.c_str(),
                      static_cast<int>(pause.count()));
}

void WorkerPool::HandleEnd(const std::string& share, Worker& worker, int status) const {
  const bool was_told = worker.kill_at != kNever;
  worker.pid = 0;
  worker.kill_at = kNever;
  if (Clock::now() - worker.started >= kLongLife) {
    worker.backoff.Reset();
    worker.missing_told = false;
  }
  if (!worker.wanted) return;
  if (was_told) {
    worker.start_at = Clock::now();
  } else if (!WIFEXITED(status) || WEXITSTATUS(status) != kExitNoShare) {
    StartLater(share, worker, "ended " + Describe(status));
  } else {
    WaitForShare(share, worker);
  }
}

// Its configuration may be out of reach for a moment, and a share that is gone may come back.
void WorkerPool::WaitForShare(const std::string& share, Worker& worker) const {
  worker.start_at = Clock::now() + worker.backoff.Next();
  if (worker.missing_told) return;
  worker.missing_told = true;
  errno = 0;
  QUARROX_LOG_FAILURE(
      "The share %s is not to be found, so its folders are left out until it is; where it is gone for good: "
      "fileindexctl share clear-paused %s PATH",
      share.c_str(), share.c_str());
}

void WorkerPool::Reap() {
  int status;
  for (pid_t pid; (pid = waitpid(-1, &status, WNOHANG)) > 0;) {
    const auto is_it = [pid](const auto& entry) { return entry.second.pid == pid; };
    const auto found = std::find_if(workers_.begin(), workers_.end(), is_it);
    if (found == workers_.end()) continue;
    HandleEnd(found->first, found->second, status);
    if (!found->second.wanted) workers_.erase(found);
  }
}

void WorkerPool::KeepUp() {
  const Clock::time_point now = Clock::now();
  int left = kSpawnsAtOnce;
  for (auto& [share, worker] : workers_) {
    if (worker.kill_at <= now) {
      kill(worker.pid, SIGKILL);
      worker.kill_at = now + kLongLife;  // not in a loop while the kernel holds on to it
    }
    if (worker.start_at <= now && left-- > 0) Spawn(share, worker);
  }
}

Clock::time_point WorkerPool::Deadline() const {
  Clock::time_point first = kNever;
  for (const auto& [share, worker] : workers_) first = std::min({first, worker.start_at, worker.kill_at});
  return first;
}

}  // namespace quarrox::fileindexd
