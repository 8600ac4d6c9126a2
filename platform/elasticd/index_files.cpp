#include "index_files.h"

#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <system_error>

#include <json/json.h>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "error_code.h"

namespace fs = std::filesystem;

namespace quarrox::elasticd {
namespace {

// What belongs to an index in its directory. Others keep files there, too.
constexpr const char* kOwnNames[] = {"index", "index.damaged", "index.moving", "closed.json", "CACHEDIR.TAG"};

// Tells programs that back up files that these can be made again: https://bford.info/cachedir/
constexpr char kCacheTag[] =
    "Signature: 8a477f597d28d172789f06886806bc55\n"
    "# A full-text index, made from the files of a shared folder. Delete it with: fileindexctl folder delete\n";

[[noreturn]] void Fail(const std::error_code& error, const std::string& what) {
  const bool no_room = error == std::errc::no_space_on_device || error.value() == EDQUOT;
  throw Error(no_room ? kNoRoom : kInputOutput, what + " failed, reason=" + error.message());
}

void Rename(const std::string& from, const std::string& to, std::error_code& error) {
  fs::rename(from, to, error);
}

// The lock of a database, whose time changes whenever somebody opens it.
constexpr char kLock[] = "flintlock";

// What the mark says of the files as they are now.
Json::Value Describe(const std::string& directory) {
  Json::Value files(Json::objectValue);
  std::error_code error;
  for (fs::directory_iterator file(directory, error), end; !error && file != end; file.increment(error)) {
    struct stat info;
    if (file->path().filename() == kLock || stat(file->path().c_str(), &info) != 0) continue;
    Json::Value& entry = files[file->path().filename().string()];
    entry.append(Json::Int64{info.st_size});
    entry.append(Json::Int64{info.st_mtim.tv_sec});
    entry.append(Json::Int64{info.st_mtim.tv_nsec});
  }
  return files;
}

void MakeDirectories(const fs::path& path) {
  std::error_code error;
  if (path.empty() || fs::is_directory(path, error)) return;
  MakeDirectories(path.parent_path());
  if (mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) {
    Fail(std::error_code(errno, std::generic_category()), "mkdir " + path.string());
  }
}

}  // namespace

bool IndexFiles::Exists() const {
  std::error_code error;
  return fs::exists(Database(), error);
}

void IndexFiles::MakeDirectory() const {
  MakeDirectories(path_);
  // Without it the index is only backed up.
  if (std::ofstream tag(path_ + "/CACHEDIR.TAG"); !(tag << kCacheTag)) errno = 0;
}

bool IndexFiles::WasClosedInOrder() const {
  Json::Value mark;
  return fromFile(mark, path_ + "/closed.json") && mark == Describe(Database());
}

void IndexFiles::MarkClosed() const {
  if (!toFile(Describe(Database()), path_ + "/closed.json")) {
    QUARROX_LOG_FAILURE("%s was not marked as closed in order; it is checked when it is opened again", path_.c_str());
  }
}

void IndexFiles::RemoveMark() const {
  std::error_code error;
  fs::remove(path_ + "/closed.json", error);
  if (error) Fail(error, "removing " + path_ + "/closed.json");
}

void IndexFiles::SetAside() const {
  std::error_code error;
  const std::string aside = path_ + "/index.damaged";
  fs::remove_all(aside, error);
  Rename(Database(), aside, error);
  if (error) fs::remove_all(Database(), error);
}

void IndexFiles::MoveTo(const std::string& path) const {
  const IndexFiles target(path);
  if (target.Exists()) throw Error(kIndexExists, "there is already an index at " + path + ": delete that one first");
  target.MakeDirectory();
  std::error_code error;
  Rename(Database(), target.Database(), error);
  if (error == std::errc::cross_device_link) {
    const std::string moving = path + "/index.moving";
    fs::remove_all(moving, error);
    fs::copy(Database(), moving, fs::copy_options::recursive, error);
    if (!error) Rename(moving, target.Database(), error);
  }
  if (error) Fail(error, "moving " + Database() + " to " + path);
  Delete();
}

void IndexFiles::Delete() const {
  std::error_code error;
  for (const char* name : kOwnNames) {
    fs::remove_all(path_ + '/' + name, error);
    if (error) Fail(error, "deleting " + path_ + '/' + name);
  }
  fs::remove(path_, error);  // where it is empty
}

}  // namespace quarrox::elasticd
