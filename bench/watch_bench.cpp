// What setting up a watch costs, beside a recursive inotify watch of the same directories.
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>

#include "common/error.h"
#include "measure.h"
#include "watcher.h"

namespace {

using quarrox::bench::Cost;
using quarrox::bench::Measure;
using namespace quarrox::notifyd;

struct Deaf : EventSink {
  void Add(const Event&) override {}
};

class Tree {
 public:
  explicit Tree(size_t directories) {
    char name[] = "/tmp/watch-bench.XXXXXX";
    if (mkdtemp(name) == nullptr) abort();
    path_ = name;
    for (size_t i = 0; i < directories; ++i) {
      std::filesystem::create_directories(path_ + "/" + std::to_string(i / 250) + "/" + std::to_string(i));
    }
  }
  ~Tree() { std::filesystem::remove_all(path_); }
  Tree(const Tree&) = delete;
  Tree& operator=(const Tree&) = delete;
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

// Set up and kept: taking a watch down again is not measured.
void WatchWithFanotify(const std::string& path) {
  static Deaf sink;
  static const Scope scope(path, path + "/queue");
  std::string why;
  static const std::unique_ptr<Watcher> watcher = MakeFanotifyWatcher(scope, sink, false, why);
  if (!watcher) throw quarrox::Error(quarrox::kErrSystem, "no fanotify here: " + why);
}

void WatchWithInotify(const std::string& path) {
  static Deaf sink;
  static const Scope scope(path, path + "/queue");
  static const std::unique_ptr<Watcher> watcher = MakeInotifyWatcher(scope, sink);
}

// A child of the benchmark must not end with an exception of its own accord.
std::function<void()> Careful(void (*watch)(const std::string&), const std::string& path) {
  return [=] {
    try {
      watch(path);
    } catch (const std::exception& error) {
      fprintf(stderr, "%s\n", error.what());
      _exit(1);
    }
  };
}

void Print(const char* method, const Cost& cost) {
  printf("  %-20s %10.3f ms   %8.0f KiB\n", method, cost.wall_seconds * 1e3, cost.peak_bytes / 1024);
}

}  // namespace

int main(int argc, char** argv) {
  const bool small = argc > 1 && strcmp(argv[1], "--small") == 0;
  for (const size_t directories : {small ? 50U : 500U, small ? 500U : 50000U}) {
    const Tree tree(directories);
    printf("watching %zu directories: set-up, memory\n", directories);
    if (geteuid() == 0) {
      Print("fanotify", Measure(Careful(WatchWithFanotify, tree.path()), 5, &Cost::wall_seconds));
    } else {
      printf("  fanotify             needs root\n");
    }
    Print("recursive inotify", Measure(Careful(WatchWithInotify, tree.path()), 5, &Cost::wall_seconds));
    fflush(stdout);
  }
  return 0;
}
