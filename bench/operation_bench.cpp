// What operations on many folders cost: adding them in one request, beside writing their list once; listing them with
// their status and summing them up, beside loading their list and reading their queues once. Search engine and indexing
// daemon answer at once.
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <thread>

#include "common/comm.h"
#include "common/queue_file.h"
#include "fileindex/communication.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "measure.h"
#include "support/private_machine.h"

namespace {

using namespace quarrox;
using fileindex::Folder;
using fileindex::FolderMgr;

constexpr size_t kShares = 10;
constexpr int kRounds = 3;

double Milliseconds(const std::function<void()>& work) {
  return bench::Seconds(work) * 1e3;
}

// The least of some rounds: what else runs here only adds.
double Least(const std::function<void()>& work) {
  double least = 1e18;
  for (int round = 0; round < kRounds; ++round) least = std::min(least, Milliseconds(work));
  return least;
}

// Answers {"success":true} to every frame, one connection after another, until the program ends.
void AnswerAt(const char* path) {
  const int listener = socket(PF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  strncpy(address.sun_path, path, sizeof(address.sun_path) - 1);
  if (bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) abort();
  if (listen(listener, 16) != 0) abort();
  std::thread([listener] {
    const char answer[] = R"({"success":true})";
    const uint32_t size = sizeof(answer);
    for (int fd; (fd = accept(listener, nullptr, nullptr)) >= 0; close(fd)) {
      uint32_t length = 0;
      if (recv(fd, &length, sizeof(length), MSG_WAITALL) != sizeof(length)) continue;
      std::string request(length, '\0');
      recv(fd, request.data(), length, MSG_WAITALL);
      send(fd, &size, sizeof(size), MSG_NOSIGNAL);
      send(fd, answer, size, MSG_NOSIGNAL);
    }
  }).detach();
}

std::string ShareOf(size_t folder) {
  return "share" + std::to_string(folder % kShares);
}

std::string PathOf(size_t folder) {
  return "/" + ShareOf(folder) + "/projects/folder" + std::to_string(folder);
}

std::string QueueOf(const std::string& volume, size_t folder) {
  return volume + "/@fileindex/" + ShareOf(folder) + "/queue";
}

void MakeShares(const std::string& volume, size_t folders) {
  std::filesystem::create_directories("/etc/vexo");
  std::ofstream conf("/etc/vexo/shares.conf");
  for (size_t i = 0; i < kShares; ++i) conf << "[" << ShareOf(i) << "]\npath = " << volume << "/" << ShareOf(i) << "\n";
  conf.close();
  for (size_t i = 0; i < folders; ++i) std::filesystem::create_directories(volume + PathOf(i));
  usleep(100000);  // a list read right after its file was written is not kept
}

Json::Value Records(size_t count) {
  Json::Value records(Json::arrayValue);
  for (size_t i = 0; i < count; ++i) {
    const std::string name = "Folder " + std::to_string(i);
    records.append(Folder(PathOf(i), name, "admin", "", true, i % 2, false, false, false, false).GetData());
  }
  return records;
}

void MeasureAdding(size_t count) {
  const Json::Value records = Records(count);
  const double added = Milliseconds([&] { fileindex::FolderAdd(records, false); });
  const double saved = Least([] { FolderMgr().Save(); });
  const double set = Milliseconds([&] { fileindex::FolderSet(records, false); });
  printf("  add %zu folders in %zu shares %8.1f ms   change them %.1f ms; load and write the list once %.1f ms\n",
         count, kShares, added, set, saved);
  Json::Value paths(Json::arrayValue);
  for (const Json::Value& record : records) paths.append(record["path"]);
  printf("  reindex them               %8.1f ms\n", Milliseconds([&] { fileindex::FolderReindex(paths); }));
  printf("  delete them                %8.1f ms\n", Milliseconds([&] { fileindex::FolderDelete(paths); }));
}

// Half of the folders wait; most of a queue is about few of them.
void FillQueues(const std::string& volume, size_t folders, size_t events) {
  std::string lines[kShares];
  for (size_t i = 0; i < events; ++i) {
    const size_t folder = i % 10 == 0 ? i / 10 % (folders / 2) : i % kShares;
    lines[folder % kShares] += R"({"event":8,"is_dir":false,"path":")" + volume + PathOf(folder) +
                               "/2026/reports/Report" + std::to_string(i) + R"(.pdf","path_old":"","data":null})" +
                               "\n";
  }
  for (size_t i = 0; i < kShares; ++i) {
    std::filesystem::remove(QueueOf(volume, i) + ".tmp");
    std::filesystem::remove(QueueOf(volume, i));
    if (!lines[i].empty()) AppendToQueue(QueueOf(volume, i), lines[i]);
  }
}

void ReadQueues(const std::string& volume) {
  for (size_t i = 0; i < kShares; ++i) {
    QueueLines lines(QueueOf(volume, i));
    for (std::string_view line; lines.Next(line);) {
    }
  }
}

void MeasureQuestions(const std::string& volume, size_t folders, size_t events) {
  FillQueues(volume, folders, events);
  Json::Value status(Json::arrayValue);
  status.append("status");
  Json::Value result;
  const double load = Least([] { const FolderMgr list; });
  const double read = Least([&] { ReadQueues(volume); });
  const double list = Least([&] { fileindex::FolderList(result, 0, ~0U, "", "", fileindex::kAll, "", status); });
  if (result["folder"].size() != folders) abort();
  size_t pending = 0;
  for (const Json::Value& folder : result["folder"]) pending += folder["additional"]["status"]["text"] != "finished";
  const double sum = Least([&] { fileindex::FolderSummary(result); });
  printf("  %zu folders, %zu of them pending in %zu events: list with status %.0f ms, sum up %.0f ms; ", folders,
         pending, events, list, sum);
  printf("load the list %.0f ms, read the queues %.0f ms\n", load, read);
}

}  // namespace

int main(int argc, char** argv) {
  const bool small = argc > 1 && strcmp(argv[1], "--small") == 0;
  support::PrivateMachine machine;
  if (!machine.Enter()) {
    printf("needs a private mount namespace, which is not to be had here\n");
    return 0;
  }
  AnswerAt(kElasticdSocketPath);
  AnswerAt(fileindex::kDaemonSocketPath);
  const std::string volume = machine.scratch() + "/volume1";
  const size_t many = small ? 500 : 10000;
  MakeShares(volume, many);
  for (const size_t count : {many / 10, many}) MeasureAdding(count);
  fileindex::FolderAdd(Records(many), false);
  for (const size_t events : {size_t{0}, many, 100 * many}) MeasureQuestions(volume, many, events);
  return 0;
}
