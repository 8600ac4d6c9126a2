#include "vexo/socket.h"

#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <thread>

#include <gtest/gtest.h>

#include "support/temp_dir.h"

TEST(Socket, CarriesAnyBytesInPiecesAndALyingOrVanishedPeerIsAFailureThatCostsNoMemory) {
  const quarrox::support::TempDir dir;
  sockaddr_un address = {AF_UNIX, {}};
  (dir / "s").copy(address.sun_path, sizeof(address.sun_path) - 1);
  const int listener = socket(AF_UNIX, SOCK_STREAM, 0);
  ASSERT_TRUE(bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0 && listen(listener, 5) == 0);
  vexodaemon::DomainSockConnection connection(dir / "s");
  std::string sent(300000, '\0'), text;
  // Each peer reads what is sent, answers in single bytes, by default the same, and goes away.
  const auto fails = [&](const std::string& answer, int error) {
    EXPECT_TRUE(connection.Connect(864000));
    const std::jthread peer([&, fd = accept(listener, nullptr, nullptr)] {
      std::string frame(sent.size() + 5, ' ');
      EXPECT_EQ(recv(fd, frame.data(), frame.size(), MSG_WAITALL), static_cast<ssize_t>(frame.size()));
      for (const char& byte : answer.empty() ? frame : answer) EXPECT_EQ(send(fd, &byte, 1, 0), 1);
      close(fd);
    });
    return connection.Send(sent) && !connection.Recv(text) && errno == error;
  };
  EXPECT_TRUE(!fails("", 0) && text == sent);
  rusage before, after;  // in KiB; the lie is 4 GiB
  EXPECT_EQ(getrusage(RUSAGE_SELF, &before), 0);
  EXPECT_TRUE(fails("\xff\xff\xff\xff some", 0) && getrusage(RUSAGE_SELF, &after) == 0);
  EXPECT_LT(after.ru_maxrss - before.ru_maxrss, 1 << 20);
  EXPECT_TRUE(fails(std::string(4, '\0'), EPROTO) && fails(std::string("\2\0\0\0ab", 6), EPROTO));
  EXPECT_TRUE(!connection.Send(sent) && errno == EPIPE);
}
