// Connections to the platform's daemons.
#pragma once

#include <string>

namespace vexodaemon {

// A connection that carries texts, each in a frame: a 4-byte unsigned length in host byte order, then that many bytes,
// the last of which is a zero that is no part of the text. Memory grows with what has arrived, never with what a length
// promises. A peer that goes away is a failure, never a signal. One object, one thread.
class SockConnection {
 public:
  SockConnection() = default;
  virtual ~SockConnection();  // closes the connection
  SockConnection(const SockConnection&) = delete;
  SockConnection& operator=(const SockConnection&) = delete;

  // Connects, waiting up to `timeout` seconds where the daemon has no room for another connection now. A connection
  // that stood before is closed. False with errno on failure: ETIMEDOUT where the daemon stayed busy, EINVAL for a
  // timeout below 1.
  virtual bool Connect(long timeout) = 0;

  // Sends one text; false with errno where it did not go out whole (EMSGSIZE: it has 4 GiB or more). Blocks for as long
  // as the peer does not read.
  bool Send(const std::string& text);

  // Receives one text. False where there is none: the peer closed (errno 0), sent a frame without its zero byte
  // (EPROTO), or the connection failed (errno). Blocks for as long as the peer does not write.
  bool Recv(std::string& text);

 protected:
  int fd_ = -1;  // -1 while closed
};

// A connection to a Unix-domain stream socket.
class DomainSockConnection : public SockConnection {
 public:
  explicit DomainSockConnection(const std::string& path);
  bool Connect(long timeout) override;

 private:
  std::string path_;
};

}  // namespace vexodaemon
