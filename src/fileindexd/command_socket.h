// The socket on which the daemon takes commands.
//
// Every client gets one answer, on receipt of its request and before anything is done for it: callers wait for it while
// they hold locks. A client that may not give commands, sends no command, or takes too long is told so. None is waited
// for: all sockets are non-blocking, and each has kClientTime to send its request and to go.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "command.h"
#include "common/listener.h"
#include "common/peer.h"
#include "common/unique_fd.h"
#include "request_reader.h"
#include "wait.h"

namespace quarrox::fileindexd {

// Not thread-safe.
class CommandSocket {
 public:
  static constexpr std::chrono::seconds kClientTime{10};

  // Further clients wait in the kernel's own queue until one of these has gone.
  static constexpr size_t kMaxClients = 256;

  // Listens at `path`, in the place of the socket that a dead daemon left. Throws Error 502 where a living one has it,
  // which is told by the lock of the file `path`.lock, or where it cannot listen.
  explicit CommandSocket(const std::string& path);

  // Stops as Close() does.
  ~CommandSocket();
  CommandSocket(const CommandSocket&) = delete;
  CommandSocket& operator=(const CommandSocket&) = delete;

  // Readable while there is something to do for Process().
  int fd() const { return epoll_.get(); }

  // When Process() is to be called at the latest.
  Clock::time_point Deadline() const;

  // Does what can be done without waiting, and appends the commands that were accepted, in order.
  void Process(std::vector<Command>& commands);

  // Takes the socket away from the file system, so that who comes now waits for the next daemon, and refuses those who
  // are here.
  void Close();

 private:
  struct Client {
    UniqueFd fd;
    Clock::time_point deadline;
    RequestReader reader = {};
    bool answered = false;  // what it still sends is thrown away until it goes
  };
  using Clients = std::map<int, Client>;

  void Watch(int fd, int operation, unsigned int events);
  void SetAccepting(bool accepting);
  void Accept();
  void Admit(UniqueFd fd);
  void Serve(int fd, std::vector<Command>& commands);
  void Take(Client& client, const char* data, size_t size, std::vector<Command>& commands);
  void Expire();

  const PeerRights rights_;
  DaemonListener listener_;
  UniqueFd epoll_;
  bool accepting_ = false;
  Clock::time_point accept_again_ = kNever;
  Clients clients_;
};

}  // namespace quarrox::fileindexd
