// The socket in the file system on which a daemon is reached.
#pragma once

#include <sys/types.h>

#include <string>

#include "common/export.h"
#include "common/unique_fd.h"

namespace quarrox {

// Listens at a path, where one process at a time can. Which one it is tells the lock of the file PATH.lock, so that the
// socket that a dead daemon left is replaced and a living one's never. Not thread-safe.
class QUARROX_API DaemonListener {
 public:
  // Who may connect: the owner and a group, mode 0660, or everybody, mode 0666.
  enum class Audience { kGroup, kEverybody };

  // Listens at `path`, given to `group` (-1: the caller's own). `daemon` is the name that another one is called in
  // messages. Throws Error 502 where another one listens or the socket cannot be made; not logged.
  DaemonListener(const std::string& path, gid_t group, const std::string& daemon, Audience audience = Audience::kGroup);

  // Stops as Close() does, and lets go of the lock.
  ~DaemonListener();
  DaemonListener(const DaemonListener&) = delete;
  DaemonListener& operator=(const DaemonListener&) = delete;

  // Non-blocking; -1 once it is closed.
  int fd() const { return socket_.get(); }

  // The next client's socket, non-blocking; none, with errno, where nobody waits or it cannot be had.
  UniqueFd Accept() const;

  // Takes the socket away from the file system, so that who comes now waits for the next daemon. Those who connected
  // before and were not accepted can still be accepted.
  void Withdraw();

  // Withdraws, and turns away those who were not accepted.
  void Close();

 private:
  void Listen(gid_t group, mode_t mode);

  const std::string path_;
  UniqueFd lock_;
  UniqueFd socket_;
  bool withdrawn_ = false;
};

}  // namespace quarrox
