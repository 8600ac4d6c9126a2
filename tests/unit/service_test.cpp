#include "vexo/service.h"

#include <sys/mount.h>

#include <filesystem>

#include <gtest/gtest.h>

#include "support/private_machine.h"
#include "support/temp_dir.h"
#include "vexo/error.h"

namespace fs = std::filesystem;
using quarrox::support::PrivateMachine;

TEST(Service, WithoutAServiceManagerOnlyWhatNeedsNoneSucceeds) {
  if (!PrivateMachine().Enter()) GTEST_SKIP() << "no private machine";
  fs::remove_all("/run/systemd");
  EXPECT_TRUE(VLIBServiceRestart("samba") == 0 && VLIBServiceStart("vexocontentextractd", TRUE) == 0);
  EXPECT_TRUE(VLIBServiceStart("nginx", FALSE) == -1 && VLIBCErrGet() == VEXO_ERR_BAD_PARAMETER);
  EXPECT_TRUE(VLIBServicectlStop("pkg-Quarrox-fileindexd", 1) == -1 && VLIBCErrGet() == VEXO_ERR_SERVICE);
}

TEST(Service, TheManagerIsWaitedForOnlyWhereThatIsAskedAndItsRefusalIsAnError) {
  if (!PrivateMachine().Enter()) GTEST_SKIP() << "no private machine";
  fs::create_directories("/run/systemd/system");
  quarrox::support::WriteText("/run/systemctl", "#!/bin/sh\necho $* >>/run/asked\n[ $2 != stop ]\n");
  fs::permissions("/run/systemctl", fs::perms::owner_all);
  if (mount("/run/systemctl", "/usr/bin/systemctl", nullptr, MS_BIND, nullptr) != 0) GTEST_SKIP() << "no systemctl";
  EXPECT_EQ(VLIBServiceStart("pkg-Quarrox-fileindexd", TRUE), 0);
  EXPECT_EQ(VLIBServicectlStart("pkg-Quarrox-fileindexd", 1), 0);
  EXPECT_TRUE(VLIBServicectlStop("pkg-Quarrox-fileindexd", 1) == -1 && VLIBCErrGet() == VEXO_ERR_SERVICE);
  EXPECT_EQ(quarrox::support::ReadText("/run/asked"),
            "--no-ask-password start fileindexd.service\n--no-ask-password start fileindexd.service --no-block\n"
            "--no-ask-password stop fileindexd.service --no-block\n");
}
