// Figures for Prometheus, in its text format: https://prometheus.io/docs/instrumenting/exposition_formats/
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <map>
#include <system_error>

#include "command.h"
#include "common/comm.h"
#include "common/error.h"
#include "common/file.h"
#include "common/sdk/open_shares.h"
#include "daemon_exchange.h"
#include "fileindex/communication.h"
#include "fileindex/elastic_control.h"
#include "fileindex/index_failures.h"
#include "fileindex/index_progress.h"
#include "status.h"

namespace quarrox::ctl {
namespace {

namespace fs = std::filesystem;
using fileindex::IndexFailures;
using fileindex::IndexProgress;

// By the numbers of FileIndexOP; the first is none.
constexpr const char* kKinds[] = {nullptr,  "delete",  "create",       "attributes", "update_directory",
                                  "rename", "reindex", "damaged_queue"};

struct Family {
  const char* name;
  const char* type;
  const char* help;
};

constexpr Family kFamilies[] = {
    {"fileindex_up", "gauge", "Whether a daemon answers."},
    {"fileindex_engine_answer_seconds", "gauge", "How long the search engine took for a small question."},
    {"fileindex_share_state", "gauge", "1 for the state that a share is in."},
    {"fileindex_documents", "gauge", "Files and directories that searches in a share can find."},
    {"fileindex_index_bytes", "gauge", "What the index of a share takes on the disk."},
    {"fileindex_queue_bytes", "gauge", "Events that wait."},
    {"fileindex_queue_age_seconds", "gauge", "How long the oldest event has waited; 0 where none does."},
    {"fileindex_operations_total", "counter", "Operations carried out, by kind."},
    {"fileindex_failures", "gauge", "Files that are not indexed as they are, by reason."},
    {"fileindex_last_commit_timestamp_seconds", "gauge", "When a share was last in line with its folders."},
};

std::string Quoted(const std::string& value) {
  std::string text = "\"";
  for (const char c : value) {
    if (c == '"' || c == '\\') text += '\\';
    text += c == '\n' ? std::string("\\n") : std::string(1, c);
  }
  return text + '"';
}

// The samples of each family, which stand together in the text.
class Samples {
 public:
  using Labels = std::initializer_list<std::pair<const char*, std::string>>;

  void Add(const std::string& family, const Labels& labels, double value) {
    std::string& text = texts_[family];
    text += family;
    char separator = '{';
    for (const auto& [name, label] : labels) {
      text += separator + std::string(name) + '=' + Quoted(label);
      separator = ',';
    }
    char number[32];
    snprintf(number, sizeof(number), "%.15g", value);
    text += (labels.size() == 0 ? " " : "} ") + std::string(number) + '\n';
  }

  std::string Text() const {
    std::string text;
    for (const Family& family : kFamilies) {
      const auto found = texts_.find(family.name);
      if (found == texts_.end()) continue;
      text.append("# HELP ").append(family.name).append(" ").append(family.help).append("\n# TYPE ");
      text.append(family.name).append(" ").append(family.type).append("\n").append(found->second);
    }
    return text;
  }

 private:
  std::map<std::string, std::string> texts_;
};

// Files may come and go meanwhile.
uint64_t BytesBelow(const std::string& directory) {
  uint64_t blocks = 0;
  std::error_code error;
  for (fs::recursive_directory_iterator file(directory, error), end; !error && file != end; file.increment(error)) {
    struct stat info;
    if (lstat(file->path().c_str(), &info) == 0) blocks += static_cast<uint64_t>(info.st_blocks);
  }
  return blocks * 512;  // whatever the file system's own block is
}

std::string ReasonOf(int code) {
  return code == kErrEngineParse ? "not_readable" : code == kErrSystem ? "not_accessible" : "refused_by_engine";
}

void AddFailures(Samples& samples, const std::string& share, const sdk::SDKShare& opened) {
  const IndexFailures failures(IndexFailures::FileOf(opened));
  std::map<std::string, size_t> reasons = {{"not_readable", 0}, {"not_accessible", 0}, {"refused_by_engine", 0}};
  for (const std::string& path : failures.AtOrBelow("")) ++reasons[ReasonOf(failures.Find(path)->code)];
  reasons["not_listed"] = failures.omitted();
  for (const auto& [reason, count] : reasons) {
    samples.Add("fileindex_failures", {{"share", share}, {"reason", reason}}, static_cast<double>(count));
  }
}

void AddShare(Samples& samples, const ShareStatus& share, sdk::OpenShares& shares) {
  using State = ShareStatus::State;
  for (const State state : {State::kCurrent, State::kPending, State::kWorking, State::kWaiting, State::kPaused,
                            State::kOutdated, State::kBlocked}) {
    samples.Add("fileindex_share_state", {{"share", share.name}, {"state", NameOf(state)}},
                share.state == state ? 1 : 0);
  }
  const auto add = [&](const char* family, double value) { samples.Add(family, {{"share", share.name}}, value); };
  if (share.documents) add("fileindex_documents", static_cast<double>(*share.documents));
  add("fileindex_queue_bytes", static_cast<double>(share.queue_bytes));
  add("fileindex_queue_age_seconds", static_cast<double>(share.queue_age.value_or(0)));
  if (share.progress_file.empty()) return;  // the share is gone
  const sdk::SDKShare& opened = shares.Get(share.name);
  add("fileindex_index_bytes", static_cast<double>(BytesBelow(opened.GetDBPath())));
  AddFailures(samples, share.name, opened);
  const IndexProgress told = IndexProgress::Load(share.progress_file).value_or(IndexProgress());
  if (told.committed != 0) add("fileindex_last_commit_timestamp_seconds", static_cast<double>(told.committed));
  for (size_t kind = 1; kind < std::size(kKinds); ++kind) {
    samples.Add("fileindex_operations_total", {{"share", share.name}, {"kind", kKinds[kind]}},
                static_cast<double>(told.operations[kind]));
  }
}

// The question is answered without a look at any index.
void AddEngine(Samples& samples) {
  Json::Value request(Json::objectValue);
  request["command"] = "list_term_sugg_db";
  request["data"] = Json::Value(Json::objectValue);
  const auto began = std::chrono::steady_clock::now();
  try {
    Exchange(kElasticdSocketPath, request);
    samples.Add("fileindex_engine_answer_seconds", {},
                std::chrono::duration<double>(std::chrono::steady_clock::now() - began).count());
    samples.Add("fileindex_up", {{"daemon", "vexoelasticd"}}, 1);
  } catch (const Error&) {
    samples.Add("fileindex_up", {{"daemon", "vexoelasticd"}}, 0);
  }
}

// Read by others, who look for it at any time.
void WriteWhole(const std::string& path, const std::string& text) {
  const std::string beside = path + "." + std::to_string(getpid()) + ".new";
  FILE* const file = fopen(beside.c_str(), "we");
  bool is_done = file != nullptr && fwrite(text.data(), 1, text.size(), file) == text.size();
  if (file != nullptr) is_done = fclose(file) == 0 && is_done;
  if (is_done && rename(beside.c_str(), path.c_str()) == 0) return;
  const int error = errno;
  unlink(beside.c_str());
  throw Error(kErrSystem, "writing " + path + " failed, reason=" + strerror(error));
}

}  // namespace

int Metrics(const Arguments& arguments) {
  Samples samples;
  const IndexingStatus status = LookAtIndexing(false);
  samples.Add("fileindex_up", {{"daemon", "fileindexd"}}, status.daemon_runs ? 1 : 0);
  AddEngine(samples);
  sdk::OpenShares shares;
  for (const ShareStatus& share : status.shares) AddShare(samples, share, shares);
  const std::string file = arguments.Value("--textfile", "");
  if (file.empty()) {
    std::cout << samples.Text();
  } else {
    WriteWhole(file, samples.Text());
  }
  return 0;
}

}  // namespace quarrox::ctl
