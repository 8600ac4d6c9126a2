#include <iostream>
#include <memory>
#include <sstream>
#include <string>

#include "command.h"
#include "common/json.h"
#include "fileindex/optree.h"
#include "output.h"

namespace quarrox::ctl {
namespace {

using fileindex::OP;
using fileindex::OPTree;

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

}  // namespace

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
