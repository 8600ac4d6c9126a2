#include <charconv>
#include <cstdint>
#include <ctime>
#include <functional>
#include <iostream>
#include <memory>
#include <string>

#include "command.h"
#include "common/error.h"
#include "common/json.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "output.h"
#include "typed_path.h"

namespace quarrox::ctl {
namespace {

using fileindex::StatusMgr;

int HoursOf(const std::string& text) {
  int hours = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), hours);
  if (error != std::errc() || end != text.data() + text.size()) {
    throw UsageError("HOURS is a whole number, not '" + text + "'");
  }
  return hours;
}

// An operation saves before it tells the daemon: where only that failed, people are to know that the change holds.
// `wanted` and `saved` give the resume time that was asked for and that which is written down.
int Change(const Arguments& arguments, const std::string& subject, const std::function<void()>& operation,
           const std::function<int64_t()>& wanted, const std::function<int64_t()>& saved) {
  try {
    operation();
  } catch (const Error& error) {
    if (error.code == kErrSystem && saved() == wanted()) {
      std::cerr << "fileindexctl: saved: " << subject << DescribePause(wanted())
                << "; but fileindexd was not reached\n";
    }
    throw;
  }
  if (arguments.Has("--json")) {
    Json::Value answer;
    answer["resume_time"] = Json::Int64{wanted()};
    std::cout << toString(answer) << '\n';
  } else {
    std::cout << subject << DescribePause(wanted()) << '\n';
  }
  return kDone;
}

int ChangeAll(const Arguments& arguments, const std::function<void(StatusMgr& status)>& set) {
  StatusMgr status;
  return Change(
      arguments, "", [&] { set(status); }, [&] { return status.GetPauseInfo(); },
      [] { return StatusMgr().GetPauseInfo(); });
}

// kNotPaused, or as FolderPauses has it.
int64_t EndOf(const std::string& path) {
  std::shared_ptr<fileindex::Folder> folder;
  fileindex::FolderMgr().Get(folder, path);
  return fileindex::FolderPauses().EndOf(*folder).value_or(fileindex::kNotPaused);
}

int ChangeFolder(const Arguments& arguments, int64_t resume_time) {
  const std::string path = FolderPath(fileindex::FolderMgr(), arguments.operands().front());
  const auto operation = [&] {
    if (resume_time == fileindex::kNotPaused) return fileindex::FolderResume(path);
    fileindex::FolderPause(path, resume_time);
  };
  return Change(
      arguments, Visible(path) + ": ", operation, [&] { return resume_time; }, [&] { return EndOf(path); });
}

}  // namespace

int Pause(const Arguments& arguments) {
  const int hours = arguments.operands().empty() ? 0 : HoursOf(arguments.operands().front());
  return ChangeAll(arguments, [&](StatusMgr& status) { status.Pause(hours); });
}

int Resume(const Arguments& arguments) {
  return ChangeAll(arguments, [](StatusMgr& status) { status.Resume(); });
}

int FolderPause(const Arguments& arguments) {
  const int hours = arguments.operands().size() < 2 ? 0 : HoursOf(arguments.operands()[1]);
  if (hours < 0) throw UsageError("HOURS is not negative");
  return ChangeFolder(arguments, hours == 0 ? fileindex::kPausedWithoutEnd : time(nullptr) + int64_t{3600} * hours);
}

int FolderResume(const Arguments& arguments) {
  return ChangeFolder(arguments, fileindex::kNotPaused);
}

}  // namespace quarrox::ctl
