// Looks at databases that nobody has closed in order, one after the other, each in a process of its own: reading a
// damaged one may crash.
#pragma once

#include <sys/types.h>

#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace quarrox::elasticd {

class Recovery {
 public:
  struct Job {
    std::string directory;           // of the database
    std::function<void(bool)> done;  // whether it is sound; not called where Stop() came first
  };

  Recovery() = default;
  ~Recovery() { Stop(); }
  Recovery(const Recovery&) = delete;
  Recovery& operator=(const Recovery&) = delete;

  // Begins with the jobs; `done` is called from another thread.
  void Start(std::vector<Job> jobs);

  void Stop();

 private:
  void Work(const std::vector<Job>& jobs);
  int Check(const std::string& directory);

  std::mutex mutex_;
  bool stopping_ = false;
  pid_t child_ = 0;  // 0 where none runs
  std::thread thread_;
};

}  // namespace quarrox::elasticd
