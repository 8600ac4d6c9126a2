#include "vexo/exec.h"

#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include <gtest/gtest.h>

TEST(Exec, PassesOnOnlyWhatTheFlagsLeaveAndAnswersHowTheProgramEnded) {
  const auto shell = [](int flags, const char* script) { return VLIBCExecl("/bin/sh", flags, "-c", script, nullptr); };
  EXPECT_TRUE(shell(0, "exit 200") == 200 && VLIBCExec("/bin/sh", "-c", "kill -9 $$", nullptr) == 137);
  EXPECT_TRUE(VLIBCExecl("/no/such", VLIBC_EXEC_DETACH, nullptr) == -1 && errno == ENOENT);
  const sigset_t usr2 = {{1UL << (SIGUSR2 - 1)}};
  int ends[2];
  ASSERT_TRUE(socketpair(AF_UNIX, SOCK_STREAM, 0, ends) == 0 && dup2(ends[1], 9) == 9);
  ASSERT_TRUE(signal(SIGUSR1, SIG_IGN) == SIG_DFL && sigprocmask(SIG_BLOCK, &usr2, nullptr) == 0);
  ASSERT_EQ(seteuid(getuid() == 0 ? 65534 : getuid()), 0);
  const char clean[] = "test ! -e /proc/$$/fd/9 -a $(id -ru) != 0 -a 3 = $(readlink /proc/$$/fd/[012] | grep -c null)";
  EXPECT_EQ(shell(0xBB, clean), 0);
  EXPECT_EQ(VLIBCExecl("/bin/grep", 0xBB, "-E", "Sig(Blk|Ign):.*[1-9a-f]", "/proc/self/status", nullptr), 1);
  EXPECT_EQ(shell(0, "test -e /proc/$$/fd/9 && grep -q 'SigIgn:.*2..$' /proc/self/status"), 0);
  EXPECT_TRUE(signal(SIGUSR1, SIG_DFL) == SIG_IGN && !sigprocmask(SIG_UNBLOCK, &usr2, nullptr) && !seteuid(getuid()));
  const char lead[] = "read x <&9; test $(cut -d' ' -f6 /proc/$$/stat) = $$; echo $? >&9";
  EXPECT_TRUE(shell(VLIBC_EXEC_DETACH | VLIBC_EXEC_NEW_SESSION, lead) == 0 && waitpid(-1, nullptr, WNOHANG) <= 0);
  char answer = '\n';
  EXPECT_TRUE(write(ends[0], &answer, 1) == 1 && read(ends[0], &answer, 1) == 1 && answer == '0');
}
