#include "extract/filter.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/sendfile.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <stdexcept>
#include <system_error>
#include <vector>

namespace platform::extract {
namespace {

using quarrox::UniqueFd;

constexpr uint64_t kLongestCopy = uint64_t{128} << 20;

// What a damaged file may make a program do for ever. In seconds of the processor's time.
constexpr rlim_t kTimeLimit = 5;

// How the new process ends that could not become the program.
constexpr int kCannotRun = 127;

[[noreturn]] void Throw(const char* what) {
  throw std::system_error(errno, std::generic_category(), what);
}

UniqueFd Copy(const Source& source) {
  if (source.size > kLongestCopy) throw std::system_error(EFBIG, std::generic_category(), "copy");
  UniqueFd copy(memfd_create("content", MFD_CLOEXEC));
  if (!copy) Throw("memfd_create");
  off_t at = 0;
  while (at < static_cast<off_t>(source.size)) {
    const ssize_t n = sendfile(copy.get(), source.fd, &at, static_cast<size_t>(source.size) - static_cast<size_t>(at));
    if (n < 0 && errno != EINTR) Throw("sendfile");
    if (n == 0) break;
  }
  return copy;
}

// In the new process, where only calls are allowed that a signal handler may make.
[[noreturn]] void Execute(int input, int output, char* const* command) {
  static char locale[] = "LC_ALL=C.UTF-8";
  static char* const environment[] = {locale, nullptr};
  const rlimit limit = {kTimeLimit, RLIM_INFINITY};  // past it comes SIGXCPU, which is told from SIGKILL
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  setrlimit(RLIMIT_CPU, &limit);
  // Writing to what is open for reading fails, so errors go nowhere.
  if (dup2(input, STDIN_FILENO) >= 0 && dup2(output, STDOUT_FILENO) >= 0 && dup2(input, STDERR_FILENO) >= 0) {
    execve(command[0], command, environment);
  }
  _exit(kCannotRun);
}

}  // namespace

Filter::Filter(const Source& source, Input input, std::span<const char* const> command)
    : program_(command.front()), buffer_(kPiece, '\0') {
  const UniqueFd copy = input == Input::kCopy ? Copy(source) : UniqueFd();
  const int fd = copy ? copy.get() : source.fd;
  int ends[2];
  if (lseek(fd, 0, SEEK_SET) != 0 || pipe2(ends, O_CLOEXEC) != 0) Throw("pipe");
  output_ = UniqueFd(ends[0]);
  const UniqueFd write_end(ends[1]);
  std::vector<char*> arguments;
  for (const char* argument : command) arguments.push_back(const_cast<char*>(argument));
  arguments.push_back(nullptr);
  pid_ = fork();
  if (pid_ < 0) Throw("fork");
  if (pid_ == 0) Execute(fd, write_end.get(), arguments.data());
}

Filter::~Filter() {
  if (pid_ > 0) kill(pid_, SIGKILL);
  Wait();
}

// What says nothing about the file may pass: no such program, no memory.
void Filter::CheckEnd(int status) const {
  if (status == 0) return;
  if (WIFEXITED(status) && WEXITSTATUS(status) == kCannotRun) {
    throw std::system_error(ENOENT, std::generic_category(), program_ + " cannot be run");
  }
  if (WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL) {
    throw std::system_error(EAGAIN, std::generic_category(), program_ + " was killed");
  }
  throw std::runtime_error(program_ + " failed");
}

int Filter::Wait() {
  int status = -1;
  if (pid_ > 0) {
    while (waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
    }
  }
  pid_ = -1;
  return status;
}

std::string_view Filter::Piece() {
  ssize_t n = 0;
  do {
    n = read(output_.get(), buffer_.data(), buffer_.size());
  } while (n < 0 && errno == EINTR);
  if (n < 0) Throw("read");
  if (n == 0 && pid_ > 0) CheckEnd(Wait());
  return {buffer_.data(), static_cast<size_t>(n)};
}

}  // namespace platform::extract
