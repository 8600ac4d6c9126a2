#include <arpa/inet.h>
#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <thread>

#include <gtest/gtest.h>

#include "extract/sandbox.h"
#include "support/temp_dir.h"

namespace platform::extract {

static bool Opens(const std::string& path, int flags) {
  return open(path.c_str(), flags, 0600) >= 0;
}

static bool Runs(std::string program) {
  pid_t child = 0;
  char* const arguments[] = {program.data(), nullptr};
  int status = -1;
  return posix_spawn(&child, program.c_str(), nullptr, nullptr, arguments, nullptr) == 0 &&
         waitpid(child, &status, 0) == child && status == 0;
}

static bool Traces() {
  return ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) == 0;
}

// In a process of its own: 0 where the deed was done, 1 where it was refused, else the signal that ended it.
static int Outcome(const std::function<void()>& enter, const std::function<bool()>& deed) {
  const pid_t child = fork();
  if (child == 0) {
    enter();
    _exit(deed() ? 0 : 1);
  }
  int status = -1;
  waitpid(child, &status, 0);
  return WIFSIGNALED(status) ? WTERMSIG(status) : WEXITSTATUS(status);
}

TEST(Sandbox, RefusesWhatReadingDoesNotTake) {
  const quarrox::support::TempDir dir;
  const std::string file = dir / "file", program = dir / "program", made = dir / "made";
  quarrox::support::WriteText(file, "text");
  quarrox::support::WriteText(program, quarrox::support::ReadText("/usr/bin/true"));
  chmod(program.c_str(), 0755), chmod(dir.path().c_str(), 0777), chmod(file.c_str(), 0666);
  const int listener = socket(AF_INET, SOCK_STREAM, 0), client = socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in place = {.sin_family = AF_INET, .sin_port = 0, .sin_addr = {htonl(INADDR_LOOPBACK)}, .sin_zero = {}};
  socklen_t size = sizeof(place);
  ASSERT_EQ(bind(listener, reinterpret_cast<sockaddr*>(&place), size), 0);
  ASSERT_TRUE(listen(listener, 8) == 0 && getsockname(listener, reinterpret_cast<sockaddr*>(&place), &size) == 0);
  struct Deed {
    const char* name;
    std::function<bool()> deed;
    bool landlock, seccomp;  // whether this layer alone refuses it, too
  };
  const pid_t parent = getpid();
  const Deed deeds[] = {
      {"read a file", [&] { return Opens(file, O_RDONLY); }, true, false},
      {"write a file", [&] { return Opens(file, O_WRONLY); }, true, false},
      {"cut a file", [&] { return Opens(file, O_WRONLY | O_TRUNC); }, true, true},
      {"make a file", [&] { return Opens(made, O_WRONLY | O_CREAT); }, true, true},
      {"make a file without a name", [&] { return Opens(dir.path(), O_WRONLY | O_TMPFILE); }, true, true},
      {"make a directory", [&] { return mkdir((made + "d").c_str(), 0700) == 0; }, true, true},
      {"remove a file",
       [&] { return unlink((dir / "file").c_str()) == 0 && (quarrox::support::WriteText(file, "t"), true); }, true,
       true},
      {"open a socket", [] { return socket(AF_INET, SOCK_DGRAM, 0) >= 0; }, false, true},
      {"connect", [&] { return connect(client, reinterpret_cast<sockaddr*>(&place), size) == 0; }, true, true},
      {"run a program that was brought along", [&] { return Runs(program); }, true, false},
      {"signal others", [&] { return kill(parent, 0) == 0; }, true, false},
      {"look into others", Traces, false, true},
      {"mount", [] { return mount("none", "/nowhere", "tmpfs", 0, nullptr) == 0 || errno == ENOENT; }, false, true}};
  for (const Deed& deed : deeds) {
    EXPECT_EQ(Outcome([] {}, deed.deed), 0) << deed.name << ": the test shows nothing";
    EXPECT_NE(Outcome([] { EnterSandbox(); }, deed.deed), 0) << deed.name;
    const auto landlock = [] { prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0), EnterLandlock(); };
    const auto seccomp = [] { prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0), EnterSeccomp(); };
    EXPECT_TRUE(!deed.landlock || Outcome(landlock, deed.deed) != 0) << deed.name;
    EXPECT_TRUE(!deed.seccomp || Outcome(seccomp, deed.deed) != 0) << deed.name;
  }
  EXPECT_EQ(Outcome([] { EnterSandbox(); }, Traces), SIGSYS);
  close(listener), close(client);
}

TEST(Sandbox, AllowsWhatReadingTakes) {
  const quarrox::support::TempDir dir;
  quarrox::support::WriteText(dir / "file", "text");
  const int file = open((dir / "file").c_str(), O_RDONLY | O_CLOEXEC);
  const std::function<bool()> deeds[] = {
      [] { return Runs("/usr/bin/true"); },
      [] { return Opens("/usr/share/misc/magic.mgc", O_RDONLY) && Opens("/dev/null", O_WRONLY); },
      [&] {
        char byte = 0;
        return pread(file, &byte, 1, 0) == 1 && byte == 't';
      },
      [] {
        bool ran = false;
        std::thread([&] { ran = true; }).join();
        return ran;
      },
      [] {
        FILE* const words = popen("/usr/bin/tr a b </dev/null", "re");
        return words != nullptr && pclose(words) == 0;
      }};
  for (const auto& deed : deeds) EXPECT_EQ(Outcome([] { EnterSandbox(); }, deed), 0);
  const auto maps = [](size_t mebibytes) {
    return mmap(nullptr, mebibytes << 20, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0) != MAP_FAILED;
  };
  EXPECT_EQ(Outcome([] { EnterSandbox(); }, [&] { return maps(512) && !maps(512); }), 0);
  const auto is_nobody = [] { return getuid() == 65534 && getgroups(0, nullptr) == 0; };
  EXPECT_TRUE(geteuid() != 0 || Outcome([] { EnterSandbox(); }, is_nobody) == 0);
  close(file);
}

}  // namespace platform::extract
