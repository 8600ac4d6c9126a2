// What questions about paths cost with few and with many folders, beside one stat() of the same path, and what loading,
// listing and changing the list costs.
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "fileindex/folder_mgr.h"
#include "measure.h"
#include "support/private_machine.h"

namespace {

using namespace quarrox;
using bench::Seconds;
using fileindex::Folder;
using fileindex::FolderMgr;

constexpr int kRounds = 7;
constexpr size_t kShares = 10;
constexpr size_t kPaths = 1000;  // asked one after another, so that no single one stays in the processor's cache

// Nanoseconds a path, the least of some rounds: what else runs here only adds.
double Nanoseconds(const std::vector<std::string>& paths, const std::function<void(const std::string&)>& ask) {
  double least = 1e18;
  for (int round = 0; round < kRounds; ++round) {
    least = std::min(least, Seconds([&] { std::for_each(paths.begin(), paths.end(), ask); }));
  }
  return least / static_cast<double>(paths.size()) * 1e9;
}

std::string PathOf(size_t folder) {
  return "/share" + std::to_string(folder % kShares) + "/projects/folder" + std::to_string(folder);
}

void MakeShares(const std::string& volume) {
  std::filesystem::create_directories("/etc/vexo");
  std::ofstream conf("/etc/vexo/shares.conf");
  for (size_t i = 0; i < kShares; ++i) {
    const std::string directory = volume + "/share" + std::to_string(i);
    std::filesystem::create_directories(directory + "/projects");
    conf << "[share" << i << "]\npath = " << directory << "\n";
  }
  conf.close();
  usleep(100000);  // a list read right after its file was written is not kept
}

void AddFolders(FolderMgr& folders, size_t count) {
  std::shared_ptr<Folder> diff;
  for (size_t i = 0; i < count; ++i) {
    folders.Upsert(diff, std::make_shared<Folder>(PathOf(i), "Folder " + std::to_string(i), "admin", "", true, i % 2,
                                                  false, false, false, false));
  }
}

void Report(const char* what, double seconds, const char* yardstick) {
  printf("  %-36s %8.1f ms   %s\n", what, seconds * 1e3, yardstick);
}

void MeasureList(size_t count) {
  printf("%zu folders in %zu shares\n", count, kShares);
  std::unique_ptr<FolderMgr> made = std::make_unique<FolderMgr>();
  Report("add one after another", Seconds([&] { AddFolders(*made, count); }), "");
  Report("save", Seconds([&] { made->Save(); }), "");
  std::unique_ptr<FolderMgr> folders;
  Report("load", Seconds([&] { folders = std::make_unique<FolderMgr>(); }), "");
  Report("first question", Seconds([&] { folders->IsFullPathIndexed("/"); }), "computes every full path");
  std::vector<std::shared_ptr<Folder>> page;
  size_t total = 0;
  Report("a page of 100, sorted by name",
         Seconds([&] { folders->List(page, total, 0, 100, "name", "", fileindex::kAll, ""); }), "");
  Report("change one after another", Seconds([&] { AddFolders(*folders, count); }), "");
  std::shared_ptr<Folder> diff;
  Report("remove one after another", Seconds([&] {
           for (size_t i = count / 2; i < count; ++i) folders->Delete(diff, PathOf(i));
         }),
         "half of them");
  Report("remove by share", Seconds([&] {
           for (size_t i = 0; i < kShares; ++i) folders->DeleteByShare("share" + std::to_string(i));
         }),
         "the rest");
}

struct Question {
  const char* name;
  std::function<void(const FolderMgr&, const std::string&)> ask;
};

void MeasureQuestions(const std::string& volume, size_t few, size_t many) {
  // The first folders are in both lists, so that both answer the same.
  std::vector<std::string> paths;
  for (size_t i = 0; i < kPaths; ++i) {
    paths.push_back(volume + PathOf(i * 7919 % many) + "/2026/reports/Report" + std::to_string(i) + ".pdf");
    std::filesystem::create_directories(std::filesystem::path(paths.back()).parent_path());
    std::ofstream(paths.back()) << "text";
  }
  const std::unique_ptr<FolderMgr> lists[] = {std::make_unique<FolderMgr>(), std::make_unique<FolderMgr>()};
  AddFolders(*lists[0], few);
  AddFolders(*lists[1], many);
  const Question questions[] = {
      {"GetMostSuitableCfg", [](const FolderMgr& list, const std::string& path) { list.GetMostSuitableCfg(path); }},
      {"IsFullPathIndexed", [](const FolderMgr& list, const std::string& path) { list.IsFullPathIndexed(path); }},
      {"IsFullPathHasOwnCfg", [](const FolderMgr& list, const std::string& path) { list.IsFullPathHasOwnCfg(path); }},
      {"IsFullPathNeedMeta", [](const FolderMgr& list, const std::string& path) { list.IsFullPathNeedMeta(path); }},
      {"IsShareIndexed", [](const FolderMgr& list, const std::string&) { list.IsShareIndexed("share7"); }},
  };
  struct stat info;
  const double yardstick = Nanoseconds(paths, [&](const std::string& path) {
    if (stat(path.c_str(), &info) != 0) abort();
  });
  printf("one question, with %zu and with %zu folders: one stat %.0f ns\n", few, many, yardstick);
  for (const Question& question : questions) {
    double cost[2];
    for (int i = 0; i < 2; ++i) {
      cost[i] = Nanoseconds(paths, [&](const std::string& path) { question.ask(*lists[i], path); });
    }
    printf("  %-20s %6.0f ns %6.0f ns   ratio %.2f   %.2f stats\n", question.name, cost[0], cost[1], cost[1] / cost[0],
           cost[1] / yardstick);
  }
}

}  // namespace

int main(int argc, char** argv) {
  const bool small = argc > 1 && strcmp(argv[1], "--small") == 0;
  support::PrivateMachine machine;
  if (!machine.Enter()) {
    printf("needs a private mount namespace, which is not to be had here\n");
    return 0;
  }
  const std::string volume = machine.scratch() + "/volume1";
  MakeShares(volume);
  const size_t many = small ? 500 : 10000;
  for (const size_t count : {many / 10, many}) MeasureList(count);
  MeasureQuestions(volume, 10, many);
  return 0;
}
