// queue_drain QUEUE RECORD [end]: drains a queue, pass after pass, and appends the path of each operation to RECORD, a
// line each; with "end" until nothing is left, else until it is killed.
#include <fcntl.h>

#include <cstdio>

#include "fileindex/queue_mgr.h"

int main(int argc, char** argv) {
  const int record = open(argv[2], O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
  const auto write_down = [=](const auto& op) { dprintf(record, "%s\n", op->node.lock()->GetPath().c_str()); };
  for (quarrox::fileindex::QueueMgr queue(argv[1]);; queue.DeleteTmp()) {
    queue.PrepareTmpQueue();
    if (queue.ProcessOP(write_down, true) == 0 && argc == 4) return 0;
  }
}
