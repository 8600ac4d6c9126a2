// What folding a queue costs, each figure beside the same run's yardstick: jsoncpp merely parsing the same lines.
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <functional>
#include <string>

#include "fileindex/optree.h"
#include "measure.h"
#include "queue_generator.h"

namespace {

using quarrox::bench::Cost;
using quarrox::bench::Measure;
using quarrox::bench::ParseLines;
using quarrox::bench::Queue;
using quarrox::bench::QueueWriter;
using quarrox::fileindex::OPTree;

void Fold(const std::string& queue) {
  OPTree tree(queue);
  tree.BuildTree();
  if (tree.counts().bad_lines != 0) abort();
}

struct Figures {
  Cost fold;
  Cost parse;
  double ratio() const { return fold.cpu_seconds / parse.cpu_seconds; }
};

class Bench {
 public:
  explicit Bench(bool small) : scale_(small ? 20 : 1) {
    char directory[] = "/tmp/fold-bench.XXXXXX";
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
    Realistic();
    Growth();
    Shapes();
    Storms();
    Renames();
    Saves();
    Wrapping();
  }

 private:
  Figures Both(int runs = 3) {
    const Cost parse = Measure([this] { ParseLines(queue_); }, runs);
    return {Measure([this] { Fold(queue_); }, runs), parse};
  }

  // A queue written by a process of its own, so that nothing of it stays in this one.
  void Write(const std::function<void(QueueWriter&)>& fill) {
    Measure(
        [&] {
          QueueWriter out(queue_);
          fill(out);
        },
        1);
  }

  size_t WriteRealistic(size_t lines, Queue kind = Queue::kUsual) {
    const std::string count_file = queue_ + ".count";
    Measure([&] { std::ofstream(count_file) << quarrox::bench::WriteRealisticQueue(queue_, lines, kind); }, 1);
    size_t paths = 0;
    std::ifstream(count_file) >> paths;
    unlink(count_file.c_str());
    return paths;
  }

  void Realistic() {
    const size_t lines = 1000000 / scale_;
    const size_t paths = WriteRealistic(lines);
    const Figures usual = Both();
    WriteRealistic(lines, Queue::kOtherKeyOrder);
    const Figures other = Both();
    printf("realistic queue: %zu lines, %zu distinct paths\n", lines, paths);
    printf("  jsoncpp parses the lines           %8.3f s CPU\n", usual.parse.cpu_seconds);
    printf("  fold (read, parse, merge)          %8.3f s CPU   %.3f of jsoncpp\n", usual.fold.cpu_seconds,
           usual.ratio());
    printf("  the same, keys in another order    %8.3f s CPU   %.3f of jsoncpp, %.2f of the usual order\n",
           other.fold.cpu_seconds, other.ratio(), other.fold.cpu_seconds / usual.fold.cpu_seconds);
    printf("  peak memory of the fold            %8.1f MiB     %.0f bytes a distinct path\n",
           usual.fold.peak_bytes / 1048576, usual.fold.peak_bytes / static_cast<double>(paths));
    realistic_ratio_ = usual.ratio();
    const size_t scattered = WriteRealistic(lines, Queue::kNoLocality);
    const Figures anywhere = Both();
    printf("the same without locality: any of %zu paths at any time: %.3f of jsoncpp, %.0f bytes a distinct path\n",
           scattered, anywhere.ratio(), anywhere.fold.peak_bytes / static_cast<double>(scattered));
  }

  void Growth() {
    printf("growth\n");
    double before = 0;
    for (const size_t full : {size_t{10000}, size_t{100000}, size_t{1000000}, size_t{3000000}}) {
      const size_t lines = full / scale_;
      WriteRealistic(lines);
      const Figures figures = Both();
      const double line = figures.fold.cpu_seconds / static_cast<double>(lines) * 1e9;
      printf("  %8zu lines   %6.0f ns a line   %.3f of jsoncpp", lines, line, figures.ratio());
      if (before > 0) printf("   %.2f of the smaller queue's cost a line", line / before);
      printf("\n");
      before = line;
    }
  }

  void Shape(const char* name, const std::function<void(QueueWriter&)>& fill, size_t lines) {
    Write(fill);
    const Figures figures = Both();
    printf("  %-46s %6.0f ns a line   %.3f of jsoncpp (realistic %.3f)\n", name,
           figures.fold.cpu_seconds / static_cast<double>(lines) * 1e9, figures.ratio(), realistic_ratio_);
  }

  void Shapes() {
    const size_t children = 500000 / scale_;
    const size_t deep_lines = 100000 / scale_;
    printf("shapes\n");
    Shape(
        "one directory with 500,000 children",
        [=](QueueWriter& out) {
          for (size_t i = 0; i < children; ++i) out.Event(0x40, "/volume1/share/all/file" + std::to_string(i));
        },
        children);
    Shape(
        "one path 2,000 components deep",
        [=](QueueWriter& out) {
          std::string path = "/volume1/share";
          for (int i = 0; i < 2000; ++i) path += "/d" + std::to_string(i % 10);
          for (size_t i = 0; i < deep_lines; ++i) out.Event(0x40, path + "/file" + std::to_string(i));
        },
        deep_lines);
  }

  void Storm(const char* name, const std::function<void(QueueWriter&)>& storm) {
    Write([&](QueueWriter& out) {
      for (size_t i = 0; i < 50000 / scale_; ++i) {
        out.Event(0x40, "/volume1/share/top/dir" + std::to_string(i / 100) + "/file" + std::to_string(i));
      }
      storm(out);
    });
    const Figures figures = Both();
    printf("  %-46s %8.3f s CPU   %.3f of jsoncpp\n", name, figures.fold.cpu_seconds, figures.ratio());
  }

  void Storms() {
    const std::string top = "/volume1/share/top";
    const std::string other = "/volume1/share/other";
    const auto to_and_fro = [=](QueueWriter& out, int i) {
      i % 2 == 0 ? out.Event(0x100, other, true, top) : out.Event(0x100, top, true, other);
    };
    printf("storms over 50,000 pending files\n");
    Storm("2,000 reindex requests of their top", [=](QueueWriter& out) {
      for (int i = 0; i < 2000; ++i) out.Event(0x10000, top, true);
    });
    Storm("2,000, each after one more creation", [=](QueueWriter& out) {
      for (int i = 0; i < 2000; ++i) {
        out.Event(0x40, top + "/dir0/late" + std::to_string(i));
        out.Event(0x10000, top, true);
      }
    });
    Storm("200 renames of their top to and fro", [=](QueueWriter& out) {
      for (int i = 0; i < 200; ++i) to_and_fro(out, i);
    });
    Storm("200, with creations at both ends", [=](QueueWriter& out) {
      for (int i = 0; i < 200; ++i) {
        out.Event(0x40, top + "/dir0/late" + std::to_string(i));
        out.Event(0x40, other + "/dir0/late" + std::to_string(i + 1000));
        to_and_fro(out, i);
      }
    });
    Storm("200, after half of the files were deleted", [=, this](QueueWriter& out) {
      for (size_t i = 0; i < 50000 / scale_; i += 2) {
        out.Event(0x80, top + "/dir" + std::to_string(i / 100) + "/file" + std::to_string(i));
      }
      for (int i = 0; i < 200; ++i) to_and_fro(out, i);
    });
  }

  void Renames() {
    printf("one rename of a directory\n");
    for (const size_t below : {size_t{1000}, size_t{10000}, size_t{100000}}) {
      const auto fill = [=](QueueWriter& out, bool in_the_way) {
        for (size_t i = 0; i < below; ++i) {
          const std::string name = "/d" + std::to_string(i / 100) + "/f" + std::to_string(i);
          out.Event(0x40, "/volume1/share/from" + name);
          if (in_the_way) out.Event(0x20000, "/volume1/share/to" + name);
        }
      };
      Write([&](QueueWriter& out) { fill(out, true); });
      const Figures before = Both();
      Write([&](QueueWriter& out) {
        fill(out, true);
        out.Event(0x100, "/volume1/share/to", true, "/volume1/share/from");
      });
      const Figures after = Both();
      printf("  %6zu pending below, all in the way   %8.3f ms CPU for the rename   %.0f ns a descendant\n", below,
             (after.fold.cpu_seconds - before.fold.cpu_seconds) * 1e3,
             (after.fold.cpu_seconds - before.fold.cpu_seconds) * 1e9 / static_cast<double>(below));
    }
  }

  void Saves() {
    printf("saves of one file by way of a temporary name\n");
    for (const size_t saves : {size_t{1000}, size_t{10000}, size_t{100000}}) {
      Write([=](QueueWriter& out) {
        for (size_t i = 0; i < saves; ++i) {
          out.Event(0x40, "/volume1/share/doc.tmp");
          out.Event(0x08, "/volume1/share/doc.tmp");
          out.Event(0x100, "/volume1/share/doc", false, "/volume1/share/doc.tmp");
        }
      });
      const Figures figures = Both();
      printf("  %6zu saves   %6.0f ns a line   %.3f of jsoncpp\n", saves,
             figures.fold.cpu_seconds / static_cast<double>(3 * saves) * 1e9, figures.ratio());
    }
  }

  void Wrapping() {
    Write([](QueueWriter& out) {
      for (int i = 0; i < 1000; ++i) out.Event(0x40, "/volume1/share/dir/sub/file" + std::to_string(i));
      for (int i = 0; i < 40; ++i) {
        out.Event(0x40, "/volume1/share/wrap", true);
        out.Event(0x100, "/volume1/share/wrap/dir", true, "/volume1/share/dir");
        out.Event(0x100, "/volume1/share/dir", true, "/volume1/share/wrap");
      }
    });
    const Figures figures = Both();
    printf("a directory of 1,000 files wrapped forty times in another: %.2f MiB, %.3f of jsoncpp\n",
           figures.fold.peak_bytes / 1048576, figures.ratio());
  }

  const size_t scale_;
  std::string queue_;
  double realistic_ratio_ = 0;
};

}  // namespace

int main(int argc, char** argv) {
  Bench(argc > 1 && strcmp(argv[1], "--small") == 0).Run();
  return 0;
}
