#include "linux/content_worker.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <time.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <system_error>
#include <utility>

#include "common/json.h"

using quarrox::UniqueFd;

namespace platform {
namespace {

// How many times the time for a file a reader may take that others keep from running.
constexpr int kMostPatience = 4;

// What a reader says goes into logs; in bytes. A type is said once, so that an answer ends.
constexpr size_t kLongestType = 255;
constexpr size_t kLongestReason = 1024;

// With its own end of the socket as standard input, and nothing else of this process's: no signal mask, environment,
// descriptor. In a session of its own, so that it is killed with all that it has started. 0, or what errno would be.
int Spawn(const std::string& program, int socket, pid_t* child) {
  const char* const arguments[] = {program.c_str(), "--worker", nullptr};
  const char* const environment[] = {"PATH=/usr/bin", "LC_ALL=C.UTF-8", nullptr};
  sigset_t none;
  sigset_t all;
  sigemptyset(&none);
  sigfillset(&all);
  posix_spawn_file_actions_t actions;
  posix_spawnattr_t attributes;
  posix_spawn_file_actions_init(&actions);
  posix_spawnattr_init(&attributes);
  posix_spawn_file_actions_adddup2(&actions, socket, STDIN_FILENO);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setsigdefault(&attributes, &all);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSID);
  const int error = posix_spawn(child, program.c_str(), &actions, &attributes, const_cast<char* const*>(arguments),
                                const_cast<char* const*>(environment));
  posix_spawnattr_destroy(&attributes);
  posix_spawn_file_actions_destroy(&actions);
  return error;
}

// The errno of an end that says nothing about the file, 0 where it does: whoever is short of memory kills the largest,
// and a disk that fails, or a file that gets shorter, shows in a mapping of it.
int PassingError(int signal) {
  return signal == SIGKILL ? ENOMEM : signal == SIGBUS ? EIO : 0;
}

std::string Describe(int status) {
  if (WIFSIGNALED(status)) return "was ended by signal " + std::to_string(WTERMSIG(status));
  return "ended with status " + std::to_string(WEXITSTATUS(status));
}

}  // namespace

ContentWorker::ContentWorker(const std::string& program, std::chrono::milliseconds time_for_file)
    : time_for_file_(time_for_file), name_("the reader of files " + program) {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
    throw std::system_error(errno, std::generic_category(), name_ + " cannot be started");
  }
  socket_ = UniqueFd(ends[0]);
  UniqueFd other(ends[1]);
  const int error = Spawn(program, other.get(), &pid_);
  if (error != 0) throw std::system_error(error, std::generic_category(), name_ + " cannot be started");
  other.Close();
  try {
    Greet();
  } catch (...) {
    End();
    throw;
  }
}

ContentWorker::~ContentWorker() {
  End();
}

// The status is as of waitpid, -1 where it cannot be told.
int ContentWorker::End() {
  is_ready_ = false;
  socket_.Close();
  const pid_t pid = std::exchange(pid_, 0);
  if (pid == 0) return -1;
  kill(-pid, SIGKILL);  // what has ended by itself keeps its status
  int status = -1;
  while (waitpid(pid, &status, 0) < 0) {
    if (errno != EINTR) return -1;  // somebody else has waited for it
  }
  return status;
}

// A reader that does not come up says nothing about any file.
void ContentWorker::Greet() {
  StartClock(kTimeForFile);
  wire::Answer ready;
  std::string words;
  Outcome outcome = ReceiveAll(&ready, sizeof(ready));
  if (outcome == kDone && ready.words_size <= wire::kMostWords) {
    words.resize(ready.words_size);
    outcome = ReceiveAll(words.data(), words.size());
  }
  const bool is_ours = ready.kind == wire::kReady && ready.error == wire::kVersion &&
                       quarrox::fromString(features_, words) && features_.isObject();
  if (outcome == kDone && is_ours) return;
  const std::string how = outcome == kLate    ? "does not answer"
                          : outcome == kEnded ? Describe(End())
                                              : "is of another version";
  throw std::system_error(EAGAIN, std::generic_category(), name_ + " cannot be used, it " + how);
}

bool ContentWorker::Ask(const ContentFile& file) {
  wire::Request request;
  request.size = file.size;
  if (file.extension.size() < sizeof(request.extension)) file.extension.copy(request.extension, file.extension.size());
  iovec part = {&request, sizeof(request)};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
  msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof(control);
  cmsghdr* const header = CMSG_FIRSTHDR(&message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof(int));
  memcpy(CMSG_DATA(header), &file.fd, sizeof(int));
  is_ready_ = false;
  type_.clear();
  StartClock(time_for_file_);
  ssize_t sent = -1;
  do {
    sent = sendmsg(socket_.get(), &message, MSG_NOSIGNAL);
  } while (sent < 0 && errno == EINTR);
  return sent == static_cast<ssize_t>(sizeof(request));
}

void ContentWorker::Receive(Json::Value& fields) {
  for (;;) {
    wire::Answer answer;
    ReceivePart(&answer, sizeof(answer));
    if (answer.words_size > wire::kMostWords || answer.text_size > wire::kMostText) FailWithNonsense();
    std::string words(answer.words_size, '\0');
    ReceivePart(words.data(), words.size());
    if (answer.kind == wire::kType) {
      if (!type_.empty() || words.empty() || words.size() > kLongestType) FailWithNonsense();
      type_ = std::move(words);
      continue;
    }
    std::string text(answer.text_size, '\0');
    ReceivePart(text.data(), text.size());
    if (answer.is_last != 0) End();
    is_ready_ = answer.is_last == 0;
    if (answer.kind == wire::kFound) return TakeFields(words, text, fields);
    if (answer.kind != wire::kFailed) FailWithNonsense();
    words.resize(std::min(words.size(), kLongestReason));
    if (answer.error != 0) throw std::system_error(answer.error, std::generic_category(), words);
    throw std::runtime_error(words);
  }
}

// What a reader says of the fields that the file system knows counts for nothing; neither does what is no plain value.
void ContentWorker::TakeFields(const std::string& words, const std::string& text, Json::Value& fields) {
  Json::Value found;
  if (!quarrox::fromString(found, words) || !found.isObject()) FailWithNonsense();
  for (auto field = found.begin(); field != found.end(); ++field) {
    const bool is_plain = field->isString() || field->isNumeric() || field->isBool();
    if (is_plain && !fields.isMember(field.name())) fields[field.name()].swap(*field);
  }
  if (!text.empty()) fields["VEXOMDTextContent"] = text;
}

void ContentWorker::StartClock(std::chrono::milliseconds time) {
  time_ = time;
  patience_ = kMostPatience;
  deadline_ = Clock::now() + time;
  used_at_start_ = used_ = ProcessorTime();
}

// None where it has ended.
std::chrono::nanoseconds ContentWorker::ProcessorTime() const {
  clockid_t clock = 0;
  timespec now = {};
  if (clock_getcpuclockid(pid_, &clock) != 0 || clock_gettime(clock, &now) != 0) return {};
  return std::chrono::seconds(now.tv_sec) + std::chrono::nanoseconds(now.tv_nsec);
}

// Whether a reader whose time is up has worked, and has not had its share: others keep it from running.
bool ContentWorker::IsKeptWaiting() {
  const std::chrono::nanoseconds used = ProcessorTime();
  const bool is_working = used - std::exchange(used_, used) > time_ / 100;
  return is_working && used - used_at_start_ < time_ / 2 && --patience_ > 0;
}

bool ContentWorker::AwaitInput() {
  for (;;) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline_ - Clock::now()).count();
    pollfd item = {socket_.get(), POLLIN, 0};
    const int count = poll(&item, 1, static_cast<int>(std::max<int64_t>(0, left)));
    if (count > 0) return true;
    if (count < 0 && errno == EINTR) continue;
    if (!IsKeptWaiting()) return false;
    deadline_ += time_;
  }
}

ContentWorker::Outcome ContentWorker::ReceiveAll(void* buffer, size_t size) {
  auto* to = static_cast<char*>(buffer);
  while (size > 0) {
    const ssize_t n = recv(socket_.get(), to, size, MSG_DONTWAIT);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && errno == EAGAIN) {
      if (!AwaitInput()) return kLate;
      continue;
    }
    if (n <= 0) return kEnded;
    to += n;
    size -= static_cast<size_t>(n);
  }
  return kDone;
}

// Where a reader fails at a file, that is the file's fault, but for what happens to any.
void ContentWorker::ReceivePart(void* buffer, size_t size) {
  const Outcome outcome = ReceiveAll(buffer, size);
  if (outcome == kDone) return;
  const bool has_worked = ProcessorTime() - used_at_start_ >= time_ / 10;
  const int status = End();
  const std::string of_type = type_.empty() ? "" : " (" + type_ + ")";
  if (outcome == kLate) {
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(time_).count();
    const std::string what = "reading the file took longer than " + std::to_string(seconds) + " s" + of_type;
    if (has_worked) throw std::runtime_error(what);
    throw std::system_error(ETIMEDOUT, std::generic_category(), what);  // it waited, for a disk perhaps
  }
  const std::string what = "the file's reader " + Describe(status) + of_type;
  const int passing = WIFSIGNALED(status) ? PassingError(WTERMSIG(status)) : 0;
  if (passing != 0) throw std::system_error(passing, std::generic_category(), what);
  throw std::runtime_error(what);
}

void ContentWorker::FailWithNonsense() {
  End();
  throw std::runtime_error("the file's reader answered nonsense" + (type_.empty() ? "" : " (" + type_ + ")"));
}

}  // namespace platform
