#include <signal.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <exception>
#include <memory>
#include <thread>

#include <systemd/sd-daemon.h>

#include "common/log.h"
#include "common/search_socket.h"
#include "database.h"
#include "engine.h"
#include "error_code.h"
#include "options.h"
#include "server.h"
#include "user_searches.h"

namespace {

using namespace quarrox;
using namespace quarrox::elasticd;

constexpr char kSocketPath[] = "/var/run/vexoelasticd.sock";

void MakeDirectory(const std::string& path) {
  if (mkdir(path.c_str(), 0700) == 0 || errno == EEXIST) return;
  const int error = errno;
  throw Error(kErrSystem, "mkdir " + path + " failed, reason=" + strerror(error));
}

// Blocked in all threads, so that this one gets them.
sigset_t BlockSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  return signals;
}

// Stops the server when a signal says so. The thread ends with this object, also where the server failed.
class Stopper {
 public:
  Stopper(const sigset_t& signals, Server& server, Server& searches)
      : thread_([&signals, &server, &searches] {
          int signal = 0;
          sigwait(&signals, &signal);
          sd_notify(0, "STOPPING=1");
          searches.Stop();
          server.Stop();
        }) {}
  ~Stopper() {
    pthread_kill(thread_.native_handle(), SIGINT);
    thread_.join();
  }
  Stopper(const Stopper&) = delete;
  Stopper& operator=(const Stopper&) = delete;

 private:
  std::thread thread_;
};

// The socket comes first: who has it is the one engine on this machine. Clients are served once the engine is there.
void Run(const Options& options) {
  const sigset_t signals = BlockSignals();
  MakeDirectory(options.data);
  const auto refuse = [](const std::string& reason) { return Engine::Refusal(kMalformedRequest, reason); };
  std::unique_ptr<Engine> engine;
  Server server(
      {kSocketPath, options.data + "/spool"},
      [&](int, const std::string& request, Answer& answer, const Server::MakeWay& make_way) {
        return engine->Handle(request, answer, make_way);
      },
      refuse);
  engine = std::make_unique<Engine>(options.data);
  UserSearches user_searches(*engine);
  Server searches(
      {kSearchSocketPath, options.data + "/spool", true},
      [&](int client, const std::string& request, Answer& answer, const Server::MakeWay& make_way) {
        make_way();
        user_searches.Handle(client, request, answer);
        return Server::Rest();
      },
      refuse);
  {
    const std::jthread serving([&searches] { searches.Run(); });
    const Stopper stopper(signals, server, searches);
    sd_notify(0, "READY=1");
    server.Run();
  }
  engine->Close();
}

int Serve(const Options& options) {
  // Whoever goes away while we write to them ends that, not us.
  signal(SIGPIPE, SIG_IGN);
  openlog("vexoelasticd", LOG_PID | (options.foreground ? LOG_PERROR : 0), LOG_DAEMON);
  try {
    if (!options.check.empty()) return CheckDatabase(options.check);
    Run(options);
    return 0;
  } catch (const std::exception& error) {
    errno = 0;
    QUARROX_LOG_FAILURE("%s", error.what());
    if (!options.foreground) fprintf(stderr, "vexoelasticd: %s\n", error.what());
    return 1;
  }
}

}  // namespace

int main(int argc, char** argv) {
  // When documents are committed is the engine's own business: by itself Xapian commits after so many of them.
  setenv("XAPIAN_FLUSH_THRESHOLD", "1000000000", 0);
  try {
    const Options options = ParseOptions(argc, argv);
    if (options.version) {
      printf("vexoelasticd " FILEINDEX_VERSION ", %s\n", LibraryVersion().c_str());
      return 0;
    }
    if (!options.help) return Serve(options);
    fputs(kUsage, stdout);
    return 0;
  } catch (const UsageError& error) {
    fprintf(stderr, "vexoelasticd: %s\n\n%s", error.what(), kUsage);
    return 2;
  }
}
