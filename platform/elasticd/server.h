// The engine's socket: many connections, each with requests in frames, each request with one answer.
//
// A few threads wait for whatever connection has something to say; the one that has read a whole request carries it out
// and writes the answer, and sees to it that another thread waits meanwhile, where there is another client or it takes
// long. So a request that takes long holds up nobody but its own client. A frame is a 4-byte length in host byte order
// and that many bytes, the last of which is zero.
//
// Bounded whatever clients do: the memory of all requests that are being received, the number of connections, the
// time that a connection may take to send a request, and the time that it may leave an answer unread. What is refused
// is answered before it is closed.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "answer.h"

namespace quarrox::elasticd {

class Server {
 public:
  // Sees to it that another thread waits for clients. Calling it more than once is as good as once.
  using MakeWay = std::function<void()>;

  // What is left to do for a request after its answer; may be empty.
  using Rest = std::function<void()>;

  // Carries out a request of the client behind a socket and makes the answer. Called from any thread, also at the same
  // time. Must not throw, nor must the rest that it returns. Both call `make_way`, which lives as long as they run,
  // before anything that takes longer than a moment: where a single client asks one thing after the other, its thread
  // need not hand over to another one each time.
  using Handler = std::function<Rest(int client, const std::string& request, Answer& answer, const MakeWay& make_way)>;

  // Makes the answer to a request that never reached the handler; `reason` is for people.
  using Refuse = std::function<std::string(const std::string& reason)>;

  struct Settings {
    std::string path;             // of the socket
    std::string spool_directory;  // for large answers

    // Whoever can connect may ask, then, and the handler decides what: fewer connections, small requests, and nothing
    // of what is refused is logged.
    bool for_everybody = false;
  };

  // Listens. Throws Error 502 where another living process has the socket or it cannot be made.
  Server(Settings settings, Handler handler, Refuse refuse);
  ~Server();
  Server(const Server&) = delete;
  Server& operator=(const Server&) = delete;

  // Serves until Stop(). Returns when no thread is in the handler any more.
  void Run();

  // Any thread, also from a signal handler's thread. Requests that have been received are still answered.
  void Stop();

 private:
  struct Impl;
  std::unique_ptr<Impl> impl_;
};

}  // namespace quarrox::elasticd
