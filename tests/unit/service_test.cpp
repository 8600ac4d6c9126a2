#include "vexo/service.h"

#include <gtest/gtest.h>

#include "vexo/error.h"

// Replaced at link time: no test asks the machine's own service manager.
extern "C" int sd_booted() {
  return 0;
}

TEST(Service, WithoutAServiceManagerOnlyWhatNeedsNoneSucceeds) {
  EXPECT_TRUE(VLIBServiceRestart("samba") == 0 && VLIBServiceStart("vexocontentextractd", TRUE) == 0);
  EXPECT_TRUE(VLIBServiceStart("nginx", FALSE) == -1 && VLIBCErrGet() == VEXO_ERR_BAD_PARAMETER);
  EXPECT_TRUE(VLIBServicectlStop("pkg-Quarrox-fileindexd", 1) == -1 && VLIBCErrGet() == VEXO_ERR_SERVICE);
}
