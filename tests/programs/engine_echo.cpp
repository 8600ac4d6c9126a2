// engine_echo SOCKET SPOOL: serves on SOCKET until SIGTERM. A request "big N" is answered with N bytes, "wait SECONDS"
// after that time, any other with itself.
#include <signal.h>
#include <unistd.h>

#include <cstdlib>
#include <thread>

#include "server.h"

int main(int, char** argv) {
  using namespace quarrox::elasticd;
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  const auto echo = [](int, const std::string& request, Answer& answer, const Server::MakeWay& make_way) {
    make_way();
    const long number = request.size() > 4 ? atol(request.c_str() + 4) : 0;
    if (request.starts_with("wait")) sleep(static_cast<unsigned int>(number));
    if (!request.starts_with("big ")) answer.Append(request);
    for (long left = request.starts_with("big ") ? number : 0; left > 0; left -= 1000)
      answer.Append(std::string(1000, 'x'));
    return Server::Rest();
  };
  Server server({argv[1], argv[2]}, echo, [](const std::string& reason) { return reason; });
  int signal = 0;
  std::thread stopper([&] { sigwait(&signals, &signal), server.Stop(); });
  server.Run();
  stopper.join();
}
