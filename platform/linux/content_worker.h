// A process that reads the contents of files for this one: files are hostile.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <string>

#include <json/json.h>

#include "common/unique_fd.h"
#include "linux/content_extract_wire.h"

namespace platform {

struct ContentFile {
  int fd = -1;  // open for reading
  uint64_t size = 0;
  std::string extension;  // lower case
};

// The slowest real files take seconds. Its own processor time counts, too, so that a file is not blamed where others
// keep the reader from running.
inline constexpr std::chrono::milliseconds kTimeForFile{30000};

// Used by one thread at a time, not always the same. Ends with this object, and with the process that it works for.
class ContentWorker {
 public:
  // Starts one. Throws std::system_error where that fails.
  explicit ContentWorker(const std::string& program, std::chrono::milliseconds time_for_file = kTimeForFile);
  ~ContentWorker();
  ContentWorker(const ContentWorker&) = delete;
  ContentWorker& operator=(const ContentWorker&) = delete;

  // False where it was gone before it heard of the file.
  bool Ask(const ContentFile& file);

  // Adds what is in the file that was asked for to the fields; those that are there stay. Throws std::system_error
  // where it may succeed another time, else std::runtime_error; the text is about the file, without its name.
  void Receive(Json::Value& fields);

  // What keeps it from doing anything else, as an object.
  const Json::Value& features() const { return features_; }

  // Whether it takes another file: it has answered, and lives.
  bool is_ready() const { return is_ready_; }

 private:
  using Clock = std::chrono::steady_clock;
  enum Outcome { kDone, kLate, kEnded };

  void Greet();
  void StartClock(std::chrono::milliseconds time);
  std::chrono::nanoseconds ProcessorTime() const;
  bool IsKeptWaiting();
  bool AwaitInput();
  Outcome ReceiveAll(void* buffer, size_t size);
  void ReceivePart(void* buffer, size_t size);
  void TakeFields(const std::string& words, const std::string& text, Json::Value& fields);
  [[noreturn]] void FailWithNonsense();
  int End();

  const std::chrono::milliseconds time_for_file_;
  const std::string name_;
  quarrox::UniqueFd socket_;
  pid_t pid_ = 0;
  bool is_ready_ = false;
  Json::Value features_;
  std::string type_;  // of the file at hand, where it is known

  // Of the answer that is waited for.
  std::chrono::milliseconds time_{0};
  int patience_ = 0;
  Clock::time_point deadline_;
  std::chrono::nanoseconds used_at_start_{0};  // processor time
  std::chrono::nanoseconds used_{0};
};

}  // namespace platform
