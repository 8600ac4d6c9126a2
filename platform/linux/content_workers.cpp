#include "linux/content_workers.h"

#include <dlfcn.h>
#include <pthread.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <climits>
#include <thread>
#include <utility>

#include "common/strings.h"

namespace platform {
namespace {

std::atomic<ContentWorkers*> of_process{nullptr};

// The child has the parent's descriptors, but must not talk over them, and may have been forked while another thread
// held the lock: what it has of these is left alone.
void ForgetInChild() {
  of_process = nullptr;
}

std::string OwnFile() {
  Dl_info info = {};
  if (dladdr(reinterpret_cast<void*>(&OwnFile), &info) != 0 && info.dli_fname[0] == '/') return info.dli_fname;
  char path[PATH_MAX];  // a program goes by the name that it was called by
  const ssize_t size = readlink("/proc/self/exe", path, sizeof(path));
  return size < 0 ? std::string() : std::string(path, static_cast<size_t>(size));
}

}  // namespace

std::string ContentProgram() {
  static const std::string program = quarrox::Dirname(OwnFile()) + "/fileindex/vexocontentextract";
  return program;
}

// The right to use one of them. Given back however the reading ends; what is not ready then is not used again.
class ContentWorkers::Turn {
 public:
  explicit Turn(ContentWorkers& workers) : workers_(workers) {
    std::unique_lock<std::mutex> lock(workers_.mutex_);
    workers_.freed_.wait(lock, [&] { return workers_.busy_ < workers_.most_; });
    ++workers_.busy_;
    if (workers_.idle_.empty()) return;
    worker = std::move(workers_.idle_.back());
    workers_.idle_.pop_back();
  }
  ~Turn() {
    if (worker && !worker->is_ready()) worker.reset();
    const std::lock_guard<std::mutex> lock(workers_.mutex_);
    --workers_.busy_;
    if (worker) workers_.idle_.push_back(std::move(worker));
    workers_.freed_.notify_one();
  }
  Turn(const Turn&) = delete;
  Turn& operator=(const Turn&) = delete;

  std::unique_ptr<ContentWorker> worker;

 private:
  ContentWorkers& workers_;
};

ContentWorkers::ContentWorkers(std::string program, std::chrono::milliseconds time_for_file)
    : program_(std::move(program)),
      time_for_file_(time_for_file),
      most_(std::max(1U, std::thread::hardware_concurrency())) {}

// Never destroyed: threads may still read while the process ends.
ContentWorkers& ContentWorkers::OfProcess() {
  static const int registered = pthread_atfork(nullptr, nullptr, ForgetInChild);
  static_cast<void>(registered);
  ContentWorkers* workers = of_process;
  if (workers != nullptr) return *workers;
  auto made = std::make_unique<ContentWorkers>(ContentProgram());
  if (of_process.compare_exchange_strong(workers, made.get())) return *made.release();
  return *workers;
}

// One that ended while it was idle has not heard of the file; a new one has no time to.
void ContentWorkers::Read(const ContentFile& file, Json::Value& fields) {
  Turn turn(*this);
  if (!turn.worker || !turn.worker->Ask(file)) {
    turn.worker = std::make_unique<ContentWorker>(program_, time_for_file_);
    turn.worker->Ask(file);  // where it is gone by now, the answer is missing, too
  }
  turn.worker->Receive(fields);
}

}  // namespace platform
