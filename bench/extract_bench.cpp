// What reading the texts of files costs, with two threads, beside the same two threads that only read the same bytes
// and detect their encoding; what a huge file costs; how much memory a process takes that reads files for this one.
#include <fcntl.h>
#include <sys/resource.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include <uchardet/uchardet.h>

#include "common/unique_fd.h"
#include "measure.h"
#include "support/temp_dir.h"
#include "text_corpus.h"
#include "vexo/content_extract.h"

namespace {

using namespace quarrox::bench;
namespace fs = std::filesystem;

constexpr size_t kThreads = 2;
constexpr int kRuns = 3;

// What all this is asked to stay below.
constexpr double kMostRatio = 1.5;

using Read = std::function<void(const std::string& path)>;

void ForEach(const std::vector<std::string>& paths, const Read& read) {
  std::vector<std::thread> threads;
  for (size_t first = 0; first < kThreads; ++first) {
    threads.emplace_back([&, first] {
      for (size_t i = first; i < paths.size(); i += kThreads) read(paths[i]);
    });
  }
  for (std::thread& thread : threads) thread.join();
}

void DetectEncoding(const std::string& path) {
  const quarrox::UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  const uchardet_t detector = uchardet_new();
  char buffer[65536];
  for (ssize_t n = 0; (n = read(fd.get(), buffer, sizeof(buffer))) > 0;) {
    uchardet_handle_data(detector, buffer, static_cast<size_t>(n));
  }
  uchardet_data_end(detector);
  uchardet_delete(detector);
}

void Parse(const std::string& path) {
  Json::Value options;
  options["need_meta"] = true;
  Json::Value document;
  VEXO::CONTENT_EXTRACT::ParseFile(path, options, document);
}

// The processes that read files for this one, whichever thread has started them.
std::vector<pid_t> Readers() {
  std::vector<pid_t> readers;
  for (const auto& task : fs::directory_iterator("/proc/self/task")) {
    std::ifstream children(task.path() / "children");
    for (pid_t child = 0; children >> child;) readers.push_back(child);
  }
  return readers;
}

double PeakBytes() {
  double peak = 0;
  for (const pid_t reader : Readers()) {
    std::ifstream status("/proc/" + std::to_string(reader) + "/status");
    for (std::string word; status >> word;) {
      double kib = 0;
      if (word == "VmHWM:" && status >> kib) peak = std::max(peak, kib * 1024);
    }
  }
  return peak;
}

double SecondsOf(clockid_t clock) {
  timespec now = {};
  clock_gettime(clock, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

// Of this process and its readers, also of those that have ended.
double ProcessorSeconds() {
  rusage ended = {};
  getrusage(RUSAGE_CHILDREN, &ended);
  const auto seconds = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
  };
  double sum = SecondsOf(CLOCK_PROCESS_CPUTIME_ID) + seconds(ended.ru_utime) + seconds(ended.ru_stime);
  for (const pid_t reader : Readers()) {
    clockid_t clock = 0;
    if (clock_getcpuclockid(reader, &clock) == 0) sum += SecondsOf(clock);
  }
  return sum;
}

std::vector<std::string> WithoutMarkup(std::vector<std::string> paths) {
  std::erase_if(paths, [](const std::string& path) {
    const std::string extension = fs::path(path).extension();
    return extension == ".html" || extension == ".htm" || extension == ".xml" || extension == ".svg";
  });
  return paths;
}

// Each tenth file gets a line that makes it Latin-1.
void Recode(const std::vector<std::string>& paths) {
  for (size_t i = 0; i < paths.size(); i += 10) {
    std::ofstream(paths[i], std::ios::binary | std::ios::app)
        << "\nGr\xfc\xdf"
           "e aus K\xf6ln und M\xfcnchen, s\xfc\xdf und sch\xf6n.\n";
  }
}

struct Times {
  double wall;
  double processor;
};

Times Median(const std::vector<std::string>& paths, const Read& read) {
  std::vector<Times> all;
  for (int i = 0; i < kRuns; ++i) {
    const double before = ProcessorSeconds();
    const double wall = Seconds([&] { ForEach(paths, read); });
    all.push_back({wall, ProcessorSeconds() - before});
  }
  std::sort(all.begin(), all.end(), [](const Times& a, const Times& b) { return a.wall < b.wall; });
  return all[kRuns / 2];
}

// Prints both and returns their ratio.
double Compare(const std::vector<std::string>& paths, const char* what) {
  const auto files = static_cast<double>(paths.size());
  const Times yardstick = Median(paths, DetectEncoding);
  const Times ours = Median(paths, [](const std::string& path) { Parse(path); });
  printf("  %zu %s\n", paths.size(), what);
  printf("    reading, detecting the encoding    %8.0f files/s %8.2f s of processor time\n", files / yardstick.wall,
         yardstick.processor);
  printf("    the fields of their documents      %8.0f files/s %8.2f s\n", files / ours.wall, ours.processor);
  printf("    of the time, of processor time     %8.2f         %8.2f\n", ours.wall / yardstick.wall,
         ours.processor / yardstick.processor);
  return ours.wall / yardstick.wall;
}

// Text of so many bytes, and a hole behind it.
void PrintHuge(const std::string& path, const char* what, const std::string& word, size_t text) {
  std::string head;
  while (head.size() < text) head += word;
  quarrox::support::WriteText(path, head);
  fs::resize_file(path, uintmax_t{2} << 30);
  Parse(path);
  printf("  a file of 2 GiB, %-28s %8.1f ms\n", what, 1e3 * Seconds([&] { Parse(path); }));
}

}  // namespace

int main(int argc, char** argv) {
  const bool small = argc > 1 && strcmp(argv[1], "--small") == 0;
  const quarrox::support::TempDir dir;
  const TextCorpus corpus = MakeTextCorpus(dir / "texts", small ? 500 : 20000);
  for (const std::string& path : corpus.paths) Parse(path);  // the readers are started
  printf("%zu texts, %.0f MiB, %zu threads\n", corpus.paths.size(), static_cast<double>(corpus.bytes) / (1 << 20),
         kThreads);
  const std::vector<std::string> plain = WithoutMarkup(corpus.paths);
  const double ratio = Compare(plain, "plain texts");
  printf("    (asked: at most %.1f)\n", kMostRatio);
  Compare(corpus.paths, "with the HTML and XML among them, which is parsed");
  Recode(plain);
  Compare(plain, "plain texts, each tenth in Latin-1");
  PrintHuge(dir / "huge", "all of it zeros", "", 0);
  PrintHuge(dir / "huge", "text up to the cap, UTF-8",
            "gr\xc3\xb6\xc3\x9f"
            "er ",
            size_t{5} << 20);
  PrintHuge(dir / "huge", "text up to the cap, Latin-1",
            "gr\xf6\xdf"
            "er ",
            size_t{5} << 20);
  printf("  a reader's memory at its peak          %8.1f MiB\n", PeakBytes() / (1 << 20));
  return small || ratio <= kMostRatio ? 0 : 1;
}
