#include <sys/socket.h>

#include <random>
#include <string>

#include <gtest/gtest.h>

#include "elasticd/answer.h"
#include "elasticd/server_sender.h"
#include "support/errors.h"
#include "support/temp_dir.h"

namespace quarrox::elasticd {
namespace {

// The answer as a client gets it that reads it slowly; `spool` moves what is left to the file in between.
std::string Frame(Answer& answer, bool spool) {
  int ends[2];
  EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
  const UniqueFd from(ends[0]);
  const UniqueFd to(ends[1]);
  AnswerSender sender(answer);
  std::string frame;
  std::string piece(300000, '\0');
  for (auto progress = AnswerSender::Progress::kBlocked; progress == AnswerSender::Progress::kBlocked;) {
    progress = sender.Send(to.get());
    if (spool) sender.Spool();
    spool = false;
    for (ssize_t size; (size = recv(from.get(), piece.data(), piece.size(), MSG_DONTWAIT)) > 0;) {
      frame.append(piece, 0, static_cast<size_t>(size));
    }
  }
  return frame;
}

TEST(ElasticdAnswer, KeepsWhatWasAppendedAndNotCutHoweverLargeItIs) {
  const support::TempDir dir;
  std::mt19937 random(1);
  Answer answer(dir.path() + "/spool");
  for (const size_t largest : {size_t{100}, size_t{70000}, size_t{900000}, size_t{3000000}}) {
    for (int round = 0; round < 8; ++round) {
      std::string wanted;
      answer.Clear();
      for (int step = 0; step < 12; ++step) {
        const std::string text(random() % largest, static_cast<char>('a' + step));
        answer.Append(text);
        wanted += text;
        if (random() % 3 == 0) wanted.resize(random() % (wanted.size() + 1));
        if (wanted.size() < answer.size()) answer.Cut(wanted.size());
      }
      const auto length = static_cast<uint32_t>(wanted.size() + 1);
      wanted.insert(0, reinterpret_cast<const char*>(&length), sizeof(length));
      ASSERT_TRUE(Frame(answer, round % 2 == 0) == wanted + '\0') << largest << " " << round;
    }
  }
}

TEST(ElasticdAnswer, IsAsItWasWhenItsFileCannotBeWritten) {
  Answer answer("/proc/nowhere");
  const std::string half(Answer::kInMemory / 2, 'h');
  answer.Append(half);
  EXPECT_NE(support::ReasonOf(618, [&] { answer.Append(half + half); }).find("/proc/nowhere"), std::string::npos);
  EXPECT_EQ(answer.size(), half.size());
  EXPECT_EQ(Frame(answer, false).size(), half.size() + 5);
}

}  // namespace
}  // namespace quarrox::elasticd
