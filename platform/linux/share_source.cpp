#include "linux/share_source.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <ctime>
#include <limits>
#include <set>
#include <thread>
#include <utility>

#include "common/strings.h"
#include "common/unique_fd.h"
#include "linux/ini_file.h"

namespace platform {
namespace {

using quarrox::UniqueFd;

constexpr char kSharesFile[] = "/etc/vexo/shares.conf";
constexpr char kSambaFile[] = "/etc/samba/smb.conf";
constexpr char kTestparm[] = "/usr/bin/testparm";

constexpr int64_t kMillisecond = 1'000'000;  // all times here are nanoseconds
constexpr int64_t kSecond = 1000 * kMillisecond;
constexpr int64_t kForever = std::numeric_limits<int64_t>::max();

// A file that changed this short a time ago may change again without a new time: the kernel's clock for files ticks
// every 1 to 10 ms.
constexpr int64_t kFresh = 50 * kMillisecond;

// How long a changing file is waited for, and how often it is looked at meanwhile. A file that has rested for kRest is
// taken for whole, also where somebody has it open for writing: a busy machine makes a writer pause for much shorter.
constexpr int64_t kPatience = 500 * kMillisecond;
constexpr int64_t kRest = 400 * kMillisecond;
constexpr std::chrono::microseconds kPause{200};

constexpr int64_t kTestparmLimit = 10 * kSecond;

// How long a list holds whose files cannot all be watched, or that testparm refused to print.
constexpr int64_t kUnwatched = 10 * kSecond;

constexpr int kDeepestInclude = 8;

int64_t Nanoseconds(const timespec& time) {
  return time.tv_sec * kSecond + time.tv_nsec;
}

int64_t Now(clockid_t clock) {
  timespec now;
  clock_gettime(clock, &now);
  return Nanoseconds(now);
}

FileStamp StampOf(const char* path, const struct stat& info) {
  return {path, true, info.st_dev, info.st_ino, info.st_size, Nanoseconds(info.st_mtim), Nanoseconds(info.st_ctim)};
}

// `exists` is false where the path cannot be looked at for whatever reason, which errno then tells.
FileStamp Stamp(const char* path) {
  struct stat info;
  if (stat(path, &info) == 0) return StampOf(path, info);
  FileStamp stamp;
  stamp.path = path;
  return stamp;
}

bool IsFresh(const std::vector<FileStamp>& stamps, int64_t age = kFresh) {
  const int64_t now = Now(CLOCK_REALTIME);
  return std::any_of(stamps.begin(), stamps.end(), [now, age](const FileStamp& stamp) {
    return stamp.exists && stamp.changed > now - age && stamp.changed < now + age;
  });
}

bool ReadAll(int fd, std::string* text) {
  text->clear();
  char buffer[65536];
  ssize_t count;
  while ((count = read(fd, buffer, sizeof buffer)) != 0) {
    if (count > 0) text->append(buffer, static_cast<size_t>(count));
    if (count < 0 && errno != EINTR) return false;
  }
  return true;
}

// Opens a regular file; where it is another thing, errno says why it is of no use.
UniqueFd OpenFile(const char* path) {
  UniqueFd fd(open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK));  // a pipe must not block
  struct stat info;
  if (!fd || fstat(fd.get(), &info) != 0 || S_ISREG(info.st_mode)) return fd;
  errno = S_ISDIR(info.st_mode) ? EISDIR : EINVAL;
  return UniqueFd();
}

// Takes a lease on a file: while it is held nobody has the file open for writing, and who wants to waits. It ends with
// the descriptor. False where somebody writes, or where this user or file system has no leases. The kernel signals a
// lease that somebody waits for; that signal is made one which nobody minds.
bool Lease(int fd) {
  return fcntl(fd, F_SETSIG, SIGURG) == 0 && fcntl(fd, F_SETLEASE, F_RDLCK) == 0;
}

void Fail(ShareSource* source, int error, const std::string& what) {
  source->error = error;
  source->failure = source->file + ": " + what;
  source->text.clear();
}

// One attempt at the text and the stamp that belongs to it. A file that is being rewritten in its place is empty or
// half for a moment; what was read counts where a lease kept writers away or where the file has rested.
void TrySharesFile(ShareSource* source) {
  source->settled = false;
  const UniqueFd fd = OpenFile(kSharesFile);
  const bool leased = fd && Lease(fd.get());
  struct stat before;
  struct stat after;
  if (!fd || fstat(fd.get(), &before) != 0 || !ReadAll(fd.get(), &source->text) || fstat(fd.get(), &after) != 0) {
    const int error = errno;
    Fail(source, error, std::string("it cannot be read (") + strerror(error) + "); make it a file that can");
    return;
  }
  source->error = 0;
  source->stamps = {StampOf(kSharesFile, before)};
  source->settled = source->stamps[0] == StampOf(kSharesFile, after) && source->stamps[0] == Stamp(kSharesFile) &&
                    (leased || !IsFresh(source->stamps, kRest));
}

ShareSource ReadSharesFile() {
  ShareSource source;
  source.file = kSharesFile;
  const int64_t deadline = Now(CLOCK_MONOTONIC) + kPatience;
  for (;;) {
    TrySharesFile(&source);
    // A file that vanishes is put in its place anew in a moment, or gone.
    const bool again = source.error == 0 ? !source.settled : source.error == ENOENT;
    if (!again || Now(CLOCK_MONOTONIC) >= deadline) break;
    std::this_thread::sleep_for(kPause);
  }
  const bool certain = source.error == 0 && source.settled && !IsFresh(source.stamps);
  source.valid_until = certain ? kForever : 0;
  return source;
}

// The files that Samba's configuration consists of. False where one of them cannot be told from here: its name is made
// for each client, or its place is not in a file.
bool CollectSambaFiles(std::vector<FileStamp>* stamps) {
  bool complete = true;
  std::set<std::string> seen = {kSambaFile};
  std::vector<std::pair<std::string, int>> files = {{kSambaFile, 0}};  // with how deep each one is included
  for (size_t i = 0; i < files.size(); ++i) {
    const auto [path, depth] = files[i];
    stamps->push_back(Stamp(path.c_str()));
    std::string text;
    const UniqueFd fd = OpenFile(path.c_str());
    if (!fd || !ReadAll(fd.get(), &text)) continue;
    for (const IniEntry& entry : ParseIni(text, path).entries) {
      if (entry.key == "registry shares" || entry.key == "config backend") complete = false;
      if (entry.key != "include" && entry.key != "config file") continue;
      const std::string& name = entry.value;
      if (!name.starts_with('/') || name.find('%') != std::string::npos || depth == kDeepestInclude) {
        complete = false;
      } else if (seen.insert(name).second) {
        files.emplace_back(name, depth + 1);
      }
    }
  }
  return complete;
}

// Starts testparm with its standard output on `out`. 0, or what errno would be.
int StartTestparm(int out, pid_t* child) {
  const char* const arguments[] = {kTestparm, "-s", "--suppress-prompt", nullptr};
  posix_spawn_file_actions_t actions;
  posix_spawnattr_t attributes;
  sigset_t none;
  sigset_t all;
  sigemptyset(&none);
  sigfillset(&all);
  posix_spawn_file_actions_init(&actions);
  posix_spawnattr_init(&attributes);
  posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  posix_spawn_file_actions_adddup2(&actions, out, STDOUT_FILENO);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setsigdefault(&attributes, &all);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
  const int error = posix_spawn(child, kTestparm, &actions, &attributes, const_cast<char* const*>(arguments), environ);
  posix_spawnattr_destroy(&attributes);
  posix_spawn_file_actions_destroy(&actions);
  return error;
}

// Waits until a descriptor can be read or its other end is gone; false with errno ETIMEDOUT after the deadline.
bool WaitFor(int fd, int64_t deadline) {
  for (;;) {
    const int64_t left = std::max<int64_t>(0, deadline - Now(CLOCK_MONOTONIC));
    pollfd item = {fd, POLLIN, 0};
    const int count = poll(&item, 1, static_cast<int>((left + kMillisecond - 1) / kMillisecond));
    if (count > 0) return true;
    if (count == 0) errno = ETIMEDOUT;
    if (count == 0 || errno != EINTR) return false;
  }
}

// Takes what a child prints until it has ended. False with errno where it does not come to an end.
bool Drain(int in, pid_t child, int64_t deadline, std::string* text) {
  char buffer[65536];
  for (;;) {
    if (!WaitFor(in, deadline)) return false;
    const ssize_t count = read(in, buffer, sizeof buffer);
    if (count == 0) break;
    if (count < 0 && errno != EINTR) return false;
    if (count > 0) text->append(buffer, static_cast<size_t>(count));
  }
  // glibc 2.36 declares pidfd_open() for C only.
  const UniqueFd end(static_cast<int>(syscall(SYS_pidfd_open, child, 0)));
  if (!end) return errno == ESRCH;  // already gone, where this process does not wait for its children
  return WaitFor(end.get(), deadline);
}

// Samba's shares as its own reader prints them.
void RunTestparm(ShareSource* source) {
  source->text.clear();
  source->error = 0;
  const std::string remedy = "; run \"testparm -s\" and mend what it says";
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) return Fail(source, errno, std::string("no pipe: ") + strerror(errno));
  const UniqueFd in(ends[0]);
  UniqueFd out(ends[1]);
  pid_t child = 0;
  const int error = StartTestparm(out.get(), &child);
  out.Close();
  if (error != 0) return Fail(source, error, std::string("testparm does not start: ") + strerror(error));
  const bool ended = Drain(in.get(), child, Now(CLOCK_MONOTONIC) + kTestparmLimit, &source->text);
  const int reason = errno;
  if (!ended) kill(child, SIGKILL);
  int status = 0;
  while (waitpid(child, &status, 0) < 0 && errno == EINTR) {
  }
  if (!ended)
    return Fail(source, reason, std::string("testparm does not come to an end: ") + strerror(reason) + remedy);
  if (!WIFEXITED(status)) return Fail(source, EIO, "testparm was ended by a signal" + remedy);
  // It also ends so, with all of the shares printed, where a directory is missing that a running server would need.
  if (WEXITSTATUS(status) != 0 && source->text.empty()) Fail(source, EINVAL, "testparm cannot read it" + remedy);
}

// What decides where the shares come from.
std::vector<FileStamp> Switches() {
  return {Stamp(kSharesFile), Stamp(kTestparm)};
}

ShareSource ReadSamba() {
  ShareSource source;
  source.file = kSambaFile;
  source.samba = true;
  const int64_t deadline = Now(CLOCK_MONOTONIC) + kPatience;
  bool complete = false;
  for (bool last = false;; last = Now(CLOCK_MONOTONIC) >= deadline) {
    source.stamps = Switches();
    complete = CollectSambaFiles(&source.stamps);
    source.settled = false;
    if (last || !IsFresh(source.stamps)) {
      RunTestparm(&source);
      std::vector<FileStamp> after = Switches();
      CollectSambaFiles(&after);
      source.settled = after == source.stamps;
    }
    if (last || source.settled) break;
    std::this_thread::sleep_for(kPause);
  }
  if (!source.settled || IsFresh(source.stamps)) return source;
  const bool watched = complete && source.error == 0;
  source.valid_until = watched ? kForever : Now(CLOCK_MONOTONIC) + kUnwatched;
  return source;
}

}  // namespace

ShareSource ReadShareSource() {
  if (Stamp(kSharesFile).exists || (errno != ENOENT && errno != ENOTDIR)) {
    ShareSource source = ReadSharesFile();
    if (source.error != ENOENT) return source;  // else it was removed meanwhile
  }
  if (access(kTestparm, X_OK) == 0 && Stamp(kSambaFile).exists) return ReadSamba();
  ShareSource none;
  none.file = kSharesFile;
  none.stamps = Switches();
  none.stamps.push_back(Stamp(kSambaFile));
  none.valid_until = kForever;
  return none;
}

bool IsCurrent(const ShareSource& source) {
  if (source.valid_until == 0 || (source.valid_until != kForever && Now(CLOCK_MONOTONIC) >= source.valid_until)) {
    return false;
  }
  for (const FileStamp& stamp : source.stamps) {
    if (Stamp(stamp.path.c_str()) != stamp) return false;
  }
  return true;
}

}  // namespace platform
