// queue_produce QUEUE FIRST END: appends events to a queue, each of a path that bears its number twice. Takes its time,
// so that a consumer can be killed meanwhile.
#include <unistd.h>

#include <cstdlib>

#include "common/queue_file.h"

int main(int, char** argv) {
  for (long i = atol(argv[2]); i < atol(argv[3]); ++i) {
    const std::string number = std::to_string(i);
    quarrox::AppendToQueue(argv[1], "{\"event\":64,\"path\":\"/v/" + number + "/" + number + "\"}\n");
    usleep(50);
  }
}
