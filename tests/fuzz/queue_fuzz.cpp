// A whole queue, folded as the daemon does and line by line in the plainest way: both must come to the same.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/optree.h"
#include "support/reference_fold.h"

namespace {

using namespace quarrox::fileindex;
using quarrox::support::ReferenceFold;
using Operations = std::vector<ReferenceFold::Operation>;

Operations Fold(const std::string& queue, size_t& entries) {
  const int fd = memfd_create("queue", MFD_CLOEXEC);
  if (fd < 0 || write(fd, queue.data(), queue.size()) != static_cast<ssize_t>(queue.size())) abort();
  OPTree tree("/proc/self/fd/" + std::to_string(fd));
  tree.BuildTree();
  close(fd);
  Operations operations;
  entries = tree.ProcessOP([&](const std::shared_ptr<OP>& op) {
    operations.push_back({op->op, op->node.lock()->GetPath(), op->path_old, quarrox::toString(op->data)});
  });
  return operations;
}

void InsertInto(ReferenceFold& reference, const std::string& queue) {
  std::istringstream lines(queue);
  for (std::string line; std::getline(lines, line);) {
    try {
      reference.Insert(Event(line));
    } catch (const quarrox::Error&) {
      // skipped, as in the daemon
    }
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string queue(reinterpret_cast<const char*>(data), size);
  ReferenceFold reference;
  InsertInto(reference, queue);
  size_t entries = 0;
  if (Fold(queue, entries) != reference.Process() || entries != reference.Entries()) abort();
  return 0;
}
