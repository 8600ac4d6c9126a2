// An indexing daemon that takes every command and notes it among the calls of the machine in memory. Where that call
// fails, it goes away before it has read all.
#pragma once

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <string>
#include <thread>

#include "fileindex/communication.h"
#include "support/fake_platform/fake_platform.h"

namespace quarrox::support {

// Listens while it lives; needs a PrivateMachine. A command is noted as "Daemon(TEXT)" before it is answered, so that
// whoever sent it finds it behind its own earlier calls.
class FakeDaemon {
 public:
  FakeDaemon() {
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    memcpy(address.sun_path, fileindex::kDaemonSocketPath, sizeof(fileindex::kDaemonSocketPath));
    unlink(address.sun_path);
    if (bind(listener_, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) abort();
    listen(listener_, 1);
    thread_ = std::thread([this] { Serve(); });
  }
  ~FakeDaemon() {
    shutdown(listener_, SHUT_RDWR);
    thread_.join();
    close(listener_);
    unlink(fileindex::kDaemonSocketPath);
  }
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

 private:
  void Serve() const {
    for (int fd; (fd = accept(listener_, nullptr, nullptr)) >= 0; close(fd)) {
      uint32_t length = 0;
      recv(fd, &length, sizeof(length), MSG_WAITALL);
      std::string text(length, '\0');
      recv(fd, text.data(), length - 1, MSG_WAITALL);  // without the zero
      try {
        FakePlatform::Get().Begin("Daemon", {text.substr(0, length - 1)});
      } catch (int) {
        continue;
      }
      recv(fd, text.data(), 1, MSG_WAITALL);
      send(fd, &length, sizeof(length), MSG_NOSIGNAL);
      send(fd, text.data(), length, MSG_NOSIGNAL);
    }
  }

  const int listener_ = socket(PF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  std::thread thread_;
};

}  // namespace quarrox::support
