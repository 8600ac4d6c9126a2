#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <iostream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "command.h"
#include "common/error.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "fileindex/optree.h"
#include "fileindex/queue_mgr.h"
#include "output.h"

namespace quarrox::ctl {
namespace {

using fileindex::OP;
using fileindex::OPTree;
using fileindex::QueueMgr;
using sdk::SDKShare;

std::string AsText(const OP& op) {
  std::ostringstream stream;
  stream << op;
  return Visible(stream.str());
}

std::string AsJson(const OP& op) {
  Json::Value object;
  object["op"] = op.op;
  object["path"] = std::shared_ptr<fileindex::OPNode>(op.node)->GetPath();
  if (op.op == fileindex::kOpRename) object["path_old"] = op.path_old;
  object["data"] = op.data;
  return toString(object);
}

struct Summary {
  size_t lines = 0;
  size_t bad_lines = 0;
  size_t operations = 0;
  size_t entries = 0;
};

void PrintText(const Summary& summary) {
  std::cerr << summary.lines << " lines, " << summary.bad_lines << " bad lines, " << summary.operations
            << " operations, " << summary.entries << " entries\n";
}

void PrintJson(std::ostream& out, const Summary& summary) {
  Json::Value object;
  object["lines"] = Json::UInt64(summary.lines);
  object["bad_lines"] = Json::UInt64(summary.bad_lines);
  object["operations"] = Json::UInt64(summary.operations);
  object["entries"] = Json::UInt64(summary.entries);
  out << toString(object) << '\n';
}

// One file of a share's queue. When its newest event was written is what the file system knows; the oldest is older.
struct QueueFile {
  std::string share = {};
  std::string path = {};
  bool exists = false;
  uint64_t bytes = 0;
  int64_t idle_seconds = 0;  // since it was written to
};

QueueFile LookAt(const std::string& share, const std::string& path) {
  QueueFile file{.share = share, .path = path};
  struct stat info;
  if (stat(path.c_str(), &info) == 0) {
    file.exists = true;
    file.bytes = static_cast<uint64_t>(info.st_size);
    file.idle_seconds = std::max<int64_t>(0, time(nullptr) - info.st_mtime);
  } else if (errno != ENOENT && errno != ENOTDIR) {
    throw Error(kErrSystem, "Cannot look at " + path + ": " + strerror(errno));
  }
  return file;
}

// The ".tmp", which is drained first, stands before the queue, and only where there is one. A share that goes while the
// list is walked is left out.
std::vector<QueueFile> AllQueueFiles() {
  std::vector<QueueFile> files;
  for (const std::string& name : SDKShare::Enum()) {
    try {
      const QueueMgr queue(SDKShare(name).GetQueuePath());
      files.push_back(LookAt(name, queue.queue_path_tmp()));
      if (!files.back().exists) files.pop_back();
      files.push_back(LookAt(name, queue.queue_path()));
    } catch (const Error& error) {
      if (error.code != kErrNoSuchShare) throw;
    }
  }
  return files;
}

std::string AsJson(const QueueFile& file) {
  Json::Value object;
  object["share"] = file.share;
  object["path"] = file.path;
  object["exists"] = file.exists;
  object["bytes"] = Json::UInt64(file.bytes);
  object["idle_seconds"] = file.exists ? Json::Value(Json::Int64(file.idle_seconds)) : Json::Value();
  return toString(object);
}

}  // namespace

int QueueList(const Arguments& arguments) {
  std::vector<std::vector<std::string>> rows = {{"SHARE", "BYTES", "LAST WRITTEN", "QUEUE"}};
  for (const QueueFile& file : AllQueueFiles()) {
    if (arguments.Has("--json")) {
      std::cout << AsJson(file) << '\n';
    } else {
      rows.push_back({Visible(file.share), std::to_string(file.bytes),
                      file.exists ? Duration(file.idle_seconds) + " ago" : "never", Visible(file.path)});
    }
  }
  if (rows.size() > 1) PrintTable(std::cout, rows);
  return kDone;
}

int QueueShow(const Arguments& arguments) {
  const QueueMgr queue(SDKShare(arguments.operands().front()).GetQueuePath());
  const bool json = arguments.Has("--json");
  const auto print = [&](const std::shared_ptr<OP>& op) { std::cout << (json ? AsJson(*op) : AsText(*op)) << '\n'; };
  queue.ProcessOP(print, true);
  queue.ProcessOP(print, false);
  return kDone;
}

// The operations go to standard output, the summary to standard error; with --summary there is only the summary, which
// with
// --json is then the one object of the output.
int QueueFold(const Arguments& arguments) {
  const bool json = arguments.Has("--json");
  const bool only_summary = arguments.Has("--summary");
  OPTree tree(arguments.operands().front());
  tree.BuildTree();
  Summary summary{tree.counts().lines, tree.counts().bad_lines, 0, 0};
  summary.entries = tree.ProcessOP([&](const std::shared_ptr<OP>& op) {
    ++summary.operations;
    if (!only_summary) std::cout << (json ? AsJson(*op) : AsText(*op)) << '\n';
  });
  std::cout.flush();
  if (json) {
    PrintJson(only_summary ? std::cout : std::cerr, summary);
  } else {
    PrintText(summary);
  }
  return kDone;
}

}  // namespace quarrox::ctl
