#include <grp.h>
#include <linux/capability.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <future>
#include <set>

#include <gtest/gtest.h>

#include "vexo/user.h"

namespace {

// The effective ids and the groups are the user's; the real ids stay root's.
void ExpectIdentity(const passwd& user) {
  gid_t expected[1000], actual[1000];
  int count = 1000;
  getgrouplist(user.pw_name, user.pw_gid, expected, &count);
  EXPECT_EQ(std::set(actual, actual + getgroups(1000, actual)), std::set(expected, expected + count)) << user.pw_name;
  EXPECT_TRUE(getuid() + getgid() == 0 && geteuid() == user.pw_uid && getegid() == user.pw_gid) << user.pw_name;
}

void SwitchThroughAllUsersAndFail() {
  while (const passwd* user = getpwent()) {
    EXPECT_TRUE(std::async(std::launch::async, ResetCredentialsByName, user->pw_name, true).get());
    ExpectIdentity(*user);
    struct stat info = {};
    EXPECT_TRUE(fstat(fileno(tmpfile()), &info) == 0 && info.st_uid == user->pw_uid && info.st_gid == user->pw_gid);
  }
  EXPECT_TRUE(ResetCredentialsByName("root", true));
  // Without the right to change the user the last step fails. Only the thread that drops it and its children lack it.
  const unsigned int header[] = {_LINUX_CAPABILITY_VERSION_3, 0}, rights[6] = {1U << CAP_SETGID, 1U << CAP_SETGID};
  EXPECT_EQ(syscall(SYS_capset, header, rights), 0);
  int status = 0;
  if (fork() != 0) _exit(wait(&status) > 0 && status == 0 ? 0 : 1);
  EXPECT_FALSE(ResetCredentialsByName("nobody", true));
  ExpectIdentity(*getpwuid(0));
}

TEST(CredentialsTest, ASwitchTakesEveryThreadAlongAndAFailedOneChangesNothing) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root";
  EXPECT_EXIT((SwitchThroughAllUsersAndFail(), _exit(HasFailure() ? 1 : 0)), testing::ExitedWithCode(0), "");
}

}  // namespace
