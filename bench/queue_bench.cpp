// What a question to a queue costs, each figure beside the same run's yardstick: jsoncpp merely parsing the same lines.
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <string>

#include "fileindex/queue_mgr.h"
#include "measure.h"
#include "queue_generator.h"

namespace {

using quarrox::bench::Cost;
using quarrox::bench::Measure;
using quarrox::bench::ParseLines;
using quarrox::bench::Queue;
using quarrox::bench::QueueWriter;
using quarrox::fileindex::QueueMgr;

class Bench {
 public:
  explicit Bench(bool small) : lines_(small ? 50000 : 1000000) {
    char directory[] = "/tmp/queue-bench.XXXXXX";
    if (mkdtemp(directory) == nullptr) abort();
    queue_ = std::string(directory) + "/queue";
  }
  ~Bench() {
    unlink(queue_.c_str());
    rmdir(queue_.substr(0, queue_.rfind('/')).c_str());
  }
  Bench(const Bench&) = delete;
  Bench& operator=(const Bench&) = delete;

  void Run() {
    Questions("a usual queue", Queue::kUsual);
    Questions("the same, keys in another order", Queue::kOtherKeyOrder);
    printf("a queue of %zu lines with escapes, each a full parse\n", lines_ / 10);
    Measure(
        [this] {
          QueueWriter out(queue_);
          for (size_t i = 0; i < lines_ / 10; ++i) out.Event(0x08, "/volume1/share/\\\"" + std::to_string(i) + "\\\"");
        },
        1);
    Yardstick();
    Question("whether a reindex is pending", [this] { return Mgr().IsFullPathHasReindex("/volume1/share/Photos"); });
  }

 private:
  QueueMgr Mgr() const { return QueueMgr(queue_); }

  void Yardstick() {
    parse_ = Measure([this] { ParseLines(queue_); });
    printf("  %-52s %8.3f s CPU\n", "jsoncpp parses the lines", parse_.cpu_seconds);
  }

  void Question(const char* name, const std::function<bool()>& asked) const {
    const Cost cost = Measure([&] {
      if (asked()) abort();  // found what is not there
    });
    printf("  %-52s %8.3f s CPU   %.3f of jsoncpp   %.1f MiB\n", name, cost.cpu_seconds,
           cost.cpu_seconds / parse_.cpu_seconds, cost.peak_bytes / 1048576);
  }

  void Questions(const char* name, Queue kind) {
    Measure([&] { quarrox::bench::WriteRealisticQueue(queue_, lines_, kind); }, 1);
    printf("%s: %zu lines, nothing found\n", name, lines_);
    Yardstick();
    Question("whether a reindex is pending", [this] { return Mgr().IsFullPathHasReindex("/volume1/share/Photos"); });
    Question("whether a folder is processed",
             [this] { return Mgr().IsFullPathProcessing("/volume1/share/No such folder"); });
  }

  const size_t lines_;
  std::string queue_;
  Cost parse_;
};

}  // namespace

int main(int argc, char** argv) {
  Bench(argc > 1 && strcmp(argv[1], "--small") == 0).Run();
  return 0;
}
