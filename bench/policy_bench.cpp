// What the questions about shares and paths cost, beside one stat() of the same path, with few and with many shares.
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>

#include "common/sdk/share.h"
#include "fileindex/util.h"
#include "support/private_machine.h"

namespace {

using namespace quarrox;

constexpr int kRounds = 7;

// Nanoseconds a call, the least of some rounds: what else runs here only adds.
double Nanoseconds(const std::function<void()>& call, int calls) {
  double least = 1e18;
  for (int round = 0; round < kRounds; ++round) {
    const auto start = std::chrono::steady_clock::now();
    for (int i = 0; i < calls; ++i) call();
    const std::chrono::duration<double, std::nano> spent = std::chrono::steady_clock::now() - start;
    least = std::min(least, spent.count() / calls);
  }
  return least;
}

// Shares in a private /etc, each with a directory of its own; returns a file in the middle one.
std::string MakeShares(const std::string& scratch, int count) {
  const std::string volume = scratch + "/volume1";
  std::filesystem::create_directories("/etc/vexo");
  std::ofstream conf("/etc/vexo/shares.conf");
  for (int i = 0; i < count; ++i) {
    const std::string name = "share" + std::to_string(i);
    const std::filesystem::path directory = std::filesystem::path(volume) / name;
    std::filesystem::create_directories(directory / "projects/2026/reports");
    conf << "[" << name << "]\npath = " << directory.string() << "\n";
  }
  conf.close();
  std::string file = volume + "/share" + std::to_string(count / 2) + "/projects/2026/reports/Report.PDF";
  std::ofstream(file) << "text";
  usleep(100000);  // a list read right after its file was written is not kept
  return file;
}

void Measure(int shares, int calls, const std::string& scratch) {
  const std::string file = MakeShares(scratch, shares);
  const std::string share = "share" + std::to_string(shares / 2);
  std::string name;
  std::string dir;
  struct stat info;
  const struct {
    const char* what;
    std::function<void()> call;
  } questions[] = {
      {"open a share", [&] { const sdk::SDKShare opened(share); }},
      {"share of a path", [&] { fileindex::GetShareNamePathByFullPath(name, dir, file); }},
      {"may a path be indexed",
       [&] {
         if (!fileindex::CanFullPathBeIndexed(file)) abort();
       }},
      {"file type",
       [&] {
         if (fileindex::GetFileTypeByFullPath(file) != fileindex::kFileTypeDocument) abort();
       }},
  };
  const double yardstick = Nanoseconds(
      [&] {
        if (stat(file.c_str(), &info) != 0) abort();
      },
      calls);
  printf("%d shares: one stat %.0f ns\n", shares, yardstick);
  for (const auto& [what, call] : questions) {
    const double cost = Nanoseconds(call, calls);
    printf("  %-24s %8.0f ns %6.2f stats\n", what, cost, cost / yardstick);
  }
}

}  // namespace

int main(int argc, char** argv) {
  const bool small = argc > 1 && strcmp(argv[1], "--small") == 0;
  for (const int shares : {10, 1000}) {
    fflush(stdout);
    const pid_t child = fork();  // each list in an /etc of its own
    if (child == 0) {
      support::PrivateMachine etc;
      if (etc.Enter())
        Measure(shares, small ? 200 : 20000, etc.scratch());
      else
        printf("%d shares: needs a private mount namespace, which is not to be had here\n", shares);
      fflush(stdout);
      _exit(0);
    }
    int status = 0;
    if (child < 0 || waitpid(child, &status, 0) != child || status != 0) return 1;
  }
  return 0;
}
