#include "common/json.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "common/json_reader.h"
#include "common/log.h"
#include "common/strings.h"
#include "common/unique_fd.h"

namespace quarrox {
namespace {

bool ReadAll(int fd, std::string& text) {
  char buffer[65536];
  for (;;) {
    const ssize_t n = read(fd, buffer, sizeof(buffer));
    if (n == 0) return true;
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    text.append(buffer, static_cast<size_t>(n));
  }
}

bool WriteAll(int fd, const std::string& text) {
  size_t done = 0;
  while (done < text.size()) {
    const ssize_t n = write(fd, text.data() + done, text.size() - done);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    done += static_cast<size_t>(n);
  }
  return true;
}

int OpenDirectoryOf(const std::string& path) {
  std::string directory = Dirname(path);
  if (directory.empty()) directory = StringStartWith(path, "/") ? "/" : ".";
  return open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
}

bool WriteTemporary(int fd, const std::string& path, const std::string& text) {
  struct stat old;
  const mode_t mode = stat(path.c_str(), &old) == 0 ? (old.st_mode & 07777) : 0644;
  return fchmod(fd, mode) == 0 && WriteAll(fd, text) && fsync(fd) == 0;
}

}  // namespace

bool fromString(Json::Value& value, const std::string& text) {
  return ReadPlainJson(value, text) || ReadJsonByRules(value, text);
}

bool fromFile(Json::Value& value, const std::string& path) {
  UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  std::string text;
  return fd.get() >= 0 && ReadAll(fd.get(), text) && fromString(value, text);
}

bool toFile(const Json::Value& value, const std::string& path) {
  return ReplaceFile(path, toString(value) + "\n");
}

bool ReplaceFile(const std::string& path, const std::string& text) {
  const UniqueFd directory(OpenDirectoryOf(path));  // first: nothing but the disk itself may fail after the rename
  if (directory.get() < 0) return false;
  std::string temporary = path + ".XXXXXX";
  UniqueFd fd(mkostemp(temporary.data(), O_CLOEXEC));
  if (fd.get() < 0) return false;
  if (WriteTemporary(fd.get(), path, text) && fd.Close() && rename(temporary.c_str(), path.c_str()) == 0) {
    return fsync(directory.get()) == 0;
  }
  const int error = errno;
  unlink(temporary.c_str());
  errno = error;
  return false;
}

std::string AppendData(const Json::Value& value) {
  return ", data=" + toString(value);
}

void FailGetJsonValue(const char* condition, const std::string& reason, const Json::Value& object) {
  QUARROX_THROW_IN("GetJsonValue", condition, kErrBadParameter, reason + AppendData(object));
}

void JsonApplyChanges(Json::Value& target, const Json::Value& changes) {
  if (!target.isObject()) target = Json::Value(Json::objectValue);
  for (const std::string& key : changes.getMemberNames()) {
    const Json::Value& change = changes[key];
    if (change.isNull()) {
      target.removeMember(key);
    } else if (change.isObject()) {
      JsonApplyChanges(target[key], change);
    } else {
      target[key] = change;
    }
  }
}

}  // namespace quarrox
