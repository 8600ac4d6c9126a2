// What a client would receive of an engine's answer.
#pragma once

#include <sys/socket.h>
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "elasticd/answer.h"
#include "elasticd/server_sender.h"

namespace quarrox::elasticd {

inline std::string Read(Answer& answer) {
  int ends[2];
  EXPECT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, ends));
  EXPECT_EQ(AnswerSender::Progress::kDone, AnswerSender(answer).Send(ends[0]));
  std::string text(answer.size(), '\0');
  EXPECT_EQ(4, recv(ends[1], text.data(), 4, 0));
  EXPECT_EQ(static_cast<ssize_t>(text.size()), recv(ends[1], text.data(), text.size(), MSG_WAITALL));
  close(ends[0]);
  close(ends[1]);
  return text;
}

}  // namespace quarrox::elasticd
