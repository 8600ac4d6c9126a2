// A test over the machine in memory whose search engine has its socket file and answers as the test wants.
#pragma once

#include "common/comm.h"
#include "common/json.h"
#include "support/call_capture.h"
#include "support/errors.h"
#include "support/fake_platform/fake_platform.h"
#include "support/private_machine.h"
#include "support/syslog_capture.h"

namespace quarrox::support {

class EngineTest : public ::testing::Test {
 protected:
  void SetUp() override {
    world_.Reset();
    ResetCalls();
    if (!PrivateMachine().Enter()) GTEST_SKIP() << "no machine of one's own";
    const std::ofstream socket_file(kElasticdSocketPath);
    errno = 0;
  }
  FakePlatform& world_ = FakePlatform::Get();
  SyslogCapture log_;
};

}  // namespace quarrox::support
