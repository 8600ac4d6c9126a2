// Loaded into a daemon: its wall clock is as many seconds ahead as the file named by CLOCK_OFFSET says.
#include <fcntl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdlib>
#include <ctime>

namespace {

time_t Offset() {
  const char* file = getenv("CLOCK_OFFSET");
  const int fd = file == nullptr ? -1 : open(file, O_RDONLY | O_CLOEXEC);
  char text[32] = "";
  const bool known = fd >= 0 && read(fd, text, sizeof(text) - 1) > 0;
  if (fd >= 0) close(fd);
  return known ? strtol(text, nullptr, 10) : 0;
}

}  // namespace

extern "C" __attribute__((visibility("default"))) int clock_gettime(clockid_t clock, timespec* now) noexcept {
  const auto result = static_cast<int>(syscall(SYS_clock_gettime, clock, now));
  if (result == 0 && (clock == CLOCK_REALTIME || clock == CLOCK_REALTIME_COARSE)) now->tv_sec += Offset();
  return result;
}

extern "C" __attribute__((visibility("default"))) time_t time(time_t* result) noexcept {
  timespec now = {};
  clock_gettime(CLOCK_REALTIME, &now);
  if (result != nullptr) *result = now.tv_sec;
  return now.tv_sec;
}
