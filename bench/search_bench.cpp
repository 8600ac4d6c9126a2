// What indexing, renaming and searching real texts costs with the engine, beside Xapian in a bare loop over the same
// files in the same run.
//
// The engine's figures are of the whole way: the library reads a file and asks the engine over its socket, one request
// after the other, and the engine accepts, indexes and commits. CPU is that of both sides, memory the engine's, all of
// it. The yardstick reads the same files, has the same terms and commits after every 1,000 documents, as the engine
// does, which also commits after 8 MiB of text; its memory is what the loop adds to a process. It leaves out requests
// and their text, finding documents by their paths, and fields to show. What else it leaves out stands at each figure.
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <filesystem>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "common/comm.h"
#include "fileindex/elastic_control.h"
#include "search_bench_bare.h"
#include "search_bench_engine.h"
#include "search_bench_latency.h"
#include "search_bench_queries.h"
#include "support/temp_dir.h"
#include "text_corpus.h"

namespace {

using namespace quarrox::bench;
namespace elastic = quarrox::fileindex::elastic;
namespace fs = std::filesystem;

constexpr size_t kRareCommits = 10000;

// Shares of which the engine knows only the names.
constexpr char kTexts[] = "texts";
constexpr char kCopied[] = "copies";

struct Sizes {
  size_t texts;
  size_t copies;  // directories that have them all
  size_t searches;
  size_t beside;          // texts indexed beside searches
  int idle_milliseconds;  // how long searches are measured alone
};
constexpr Sizes kFull{20000, 5, 300, 5000, 4000};
constexpr Sizes kSmall{200, 2, 20, 100, 200};

double BytesIn(const std::string& directory) {
  uintmax_t bytes = 0;
  for (const auto& entry : fs::recursive_directory_iterator(directory)) {
    if (entry.is_regular_file()) bytes += entry.file_size();
  }
  return static_cast<double>(bytes);
}

struct Indexed {
  Cost cost;
  double disk_bytes = 0;
};

void Print(const char* what, size_t documents, const Indexed& run) {
  constexpr double kMiB = 1048576;
  printf("  %-40s %8.2f s CPU %8.2f s %7.0f documents/s %7.1f MiB peak %7.1f MiB on disk\n", what, run.cost.cpu_seconds,
         run.cost.wall_seconds, static_cast<double>(documents) / run.cost.wall_seconds, run.cost.peak_bytes / kMiB,
         run.disk_bytes / kMiB);
  fflush(stdout);
}

void Print(const char* what, const Latencies& latencies) {
  printf("  %-40s median %8.3f ms   99th %8.3f ms   worst %8.3f ms\n", what, latencies.At(0.5), latencies.At(0.99),
         latencies.At(1));
  fflush(stdout);
}

void PrintRatio(const Latencies& engine, const Latencies& bare) {
  printf("  %-40s %8.2f of the median, %.2f of the 99th\n", "the engine, of the bare search",
         engine.At(0.5) / bare.At(0.5), engine.At(0.99) / bare.At(0.99));
}

void PrintRatio(const Spent& spent, const Cost& bare) {
  printf("  %-40s %8.2f of its CPU (library %.2f, engine %.2f), %.2f of its time\n", "all of that, of the bare loop",
         spent.cpu_seconds() / bare.cpu_seconds, spent.client_cpu_seconds / bare.cpu_seconds,
         spent.engine_cpu_seconds / bare.cpu_seconds, spent.wall_seconds / bare.wall_seconds);
}

Cost Mean(const Cost& a, const Cost& b) {
  return {(a.cpu_seconds + b.cpu_seconds) / 2, (a.wall_seconds + b.wall_seconds) / 2,
          (a.peak_bytes + b.peak_bytes) / 2};
}

class Bench {
 public:
  explicit Bench(const Sizes& sizes) : sizes_(sizes), corpus_(MakeTextCorpus(directory_ / kTexts, sizes.texts)) {}

  void Run() {
    if (EnterPrivateRun()) {
      engine_ = std::make_unique<EngineProcess>(directory_ / "engine");
    } else {
      printf("the engine takes root, for a /run of its own: only the yardsticks of indexing\n");
    }
    Texts();
    if (!engine_) return;
    Copy();
    Copies();
    Renames();
    Searches();
    Beside();
  }

 private:
  Indexed Bare(const std::vector<std::string>& paths, const char* name, BareTerms terms = BareTerms::kOurs,
               size_t commit_every = kCommitEvery) const {
    const std::string database = directory_ / name;
    const Cost cost = IndexBare(paths, terms, commit_every, database);
    return {cost, BytesIn(database)};
  }

  // Into an index that it makes.
  Indexed Index(const std::vector<std::string>& paths, const char* share, Spent& spent) const {
    const std::string database = directory_ / share + ".index";
    CreateIndex(share, database);
    engine_->ResetPeak();
    spent = MeasureBothSides(*engine_, [&] { UpsertAll(paths, paths.size(), share); });
    return {{spent.cpu_seconds(), spent.wall_seconds, engine_->peak_bytes()}, BytesIn(database)};
  }

  static void UpsertAll(const std::vector<std::string>& paths, size_t count, const char* share) {
    for (size_t i = 0; i < count; ++i) elastic::IndexUpsert(share, paths[i], true);
    elastic::IndexCommit(share);
  }

  // The bare loop runs before and after the engine, since a machine's speed drifts.
  void Texts() {
    const std::vector<std::string>& paths = corpus_.paths;
    printf("indexing %zu texts, %.1f MiB\n", paths.size(), static_cast<double>(corpus_.bytes) / 1048576);
    const Indexed before = Bare(paths, "before");
    Print("bare Xapian", paths.size(), before);
    Cost bare = before.cost;
    if (engine_) {
      Spent spent;
      Print("library and engine", paths.size(), Index(paths, kTexts, spent));
      const Indexed after = Bare(paths, "after");
      Print("bare Xapian again", paths.size(), after);
      bare = Mean(before.cost, after.cost);
      PrintRatio(spent, bare);
    }
    const Indexed rare = Bare(paths, "rare", BareTerms::kOurs, kRareCommits);
    Print("bare, committed every 10,000", paths.size(), rare);
    printf("  %-40s %8.2f of the CPU, %.2f of the peak\n", "that, of every 1,000",
           rare.cost.cpu_seconds / bare.cpu_seconds, rare.cost.peak_bytes / bare.peak_bytes);
    Print("bare, Xapian's own terms", paths.size(), Bare(paths, "own", BareTerms::kXapian));
  }

  // The same texts under so many directories, as other names of the same files.
  void Copy() {
    const size_t top = (directory_ / kTexts).size();
    for (size_t copy = 0; copy < sizes_.copies; ++copy) {
      for (const std::string& path : corpus_.paths) {
        copies_.push_back(old_top_ + "/" + std::to_string(copy) + path.substr(top));
        fs::create_directories(fs::path(copies_.back()).parent_path());
        fs::create_hard_link(path, copies_.back());
      }
    }
  }

  void Copies() {
    printf("indexing them under %zu directories\n", sizes_.copies);
    const Indexed bare = Bare(copies_, "bare");
    Print("bare Xapian", copies_.size(), bare);
    Spent spent;
    Print("library and engine", copies_.size(), Index(copies_, kCopied, spent));
    PrintRatio(spent, bare.cost);
    elastic::IndexUpsert(kCopied, old_top_, true);
    elastic::IndexCommit(kCopied);
  }

  // The yardstick sends nobody what it moves, and its database keeps nothing but the path.
  void Renames() {
    const std::string beside = directory_ / "copies/new";
    printf("renaming a directory of %zu documents\n", copies_.size());
    const Cost bare = RenameBare(copies_, old_top_, beside, directory_ / "bare");
    printf("  %-40s %8.2f s CPU %8.2f s\n", "bare Xapian, every document replaced", bare.cpu_seconds,
           bare.wall_seconds);
    Rename("to another name", beside, old_top_, bare);
    Rename("to three directories deeper", directory_ / "copies/one/two/three/new", beside, bare);
  }

  void Rename(const char* what, const std::string& new_top, const std::string& old_top, const Cost& bare) {
    const Spent spent = MeasureBothSides(*engine_, [&] {
      elastic::IndexRename(kCopied, new_top, old_top);
      elastic::IndexCommit(kCopied);
    });
    printf("  %-40s %8.2f s CPU %8.2f s\n", what, spent.cpu_seconds(), spent.wall_seconds);
    PrintRatio(spent, bare);
    if (CountBelow(kCopied, new_top) != copies_.size() || CountBelow(kCopied, old_top) != 0) {
      throw std::runtime_error("the rename left documents behind");
    }
  }

  // A page of hits. The yardstick knows the one prefix under which each word stands, the engine asks for all that may
  // have it; names are compared in the engine's index, too, by their pieces of three letters.
  void Searches() {
    const BareSearch bare(directory_ / "bare");
    printf("searching %zu documents, %zu searches each\n", copies_.size(), sizes_.searches);
    words_ = MakeWordPairs(bare, copies_.size(), sizes_.searches);
    Compare("two words", words_, bare);
    Compare("pieces of file names", MakeNamePieces(copies_, sizes_.searches), bare);
  }

  static void Compare(const std::string& what, const std::vector<SearchedFor>& searches, const BareSearch& bare) {
    Latencies engine_latencies;
    Latencies bare_latencies;
    for (const SearchedFor& search : searches) {
      engine_latencies.Measure([&] { FirstPage(search); });
      bare_latencies.Measure([&] {
        if (bare.FirstPage(search.terms) == 0) throw std::runtime_error("a bare search found nothing");
      });
    }
    Print((what + ", library and engine").c_str(), engine_latencies);
    Print((what + ", bare Xapian").c_str(), bare_latencies);
    PrintRatio(engine_latencies, bare_latencies);
  }

  static void FirstPage(const SearchedFor& search) {
    Json::Value request = QueryRequest(kCopied, search.qsl);
    request["data"]["query"]["load_field"].append("_score");
    request["data"]["query"]["size"] = kPage;
    Ask(request);
  }

  static void Ask(const Json::Value& request) {
    Json::Value response;
    quarrox::SendRequestImpl(response, request);
    const Json::Value& hits = response["data"];
    if (!hits.isArray() || hits.empty()) throw std::runtime_error("found nothing: " + request.toStyledString());
  }

  // What others wait while one index takes documents; the yardstick is the same without that. The client that sends the
  // documents takes its part of the machine, too.
  void Beside() {
    Json::Value path(Json::objectValue);
    path["term"]["VEXOMDPath"] = corpus_.paths.front();
    const Json::Value look_up = QueryRequest(kTexts, path);
    size_t next = 0;
    const std::vector<std::function<void()>> requests = {[&] { Ask(look_up); },
                                                         [&] { FirstPage(words_[next++ % words_.size()]); }};
    printf("requests every 20 ms while %zu texts are indexed\n", sizes_.beside);
    const auto alone = MeasureBeside(
        requests, [&] { std::this_thread::sleep_for(std::chrono::milliseconds(sizes_.idle_milliseconds)); });
    const auto beside = MeasureBeside(requests, [&] { UpsertAll(corpus_.paths, sizes_.beside, kCopied); });
    for (size_t i = 0; i < requests.size(); ++i) {
      const std::string what = i == 0 ? "a path in another index" : "two words in that index";
      Print((what + ", alone").c_str(), alone[i]);
      Print((what + ", beside").c_str(), beside[i]);
      printf("  %-40s %8.2f of the median, %zu requests\n", "beside, of alone", beside[i].At(0.5) / alone[i].At(0.5),
             beside[i].size());
    }
  }

  const Sizes sizes_;
  const quarrox::support::TempDir directory_;
  const TextCorpus corpus_;
  const std::string old_top_ = directory_ / "copies/old";
  std::vector<std::string> copies_;
  std::vector<SearchedFor> words_;
  std::unique_ptr<EngineProcess> engine_;  // stops before the directory goes
};

}  // namespace

int main(int argc, char** argv) {
  // The bare loop is committed when it says so, as the engine is.
  setenv("XAPIAN_FLUSH_THRESHOLD", "1000000000", 1);
  try {
    Bench(argc > 1 && strcmp(argv[1], "--small") == 0 ? kSmall : kFull).Run();
  } catch (const std::exception& error) {
    fprintf(stderr, "search_bench: %s\n", error.what());
    return 1;
  }
  return 0;
}
