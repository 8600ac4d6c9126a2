#include "vexo/content_extract.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include <cerrno>
#include <cstdio>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <system_error>

#include "common/open_file.h"
#include "common/strings.h"
#include "common/unique_fd.h"
#include "linux/content_extract_text.h"
#include "linux/content_workers.h"

namespace {

// The unit of statx's stx_blocks, whatever the file system's own block is.
constexpr unsigned int kBlockSize = 512;

struct statx Look(int fd) {
  struct statx info;
  constexpr unsigned int kWanted = STATX_BASIC_STATS | STATX_BTIME;
  if (fd < 0 || statx(fd, "", AT_EMPTY_PATH | AT_NO_AUTOMOUNT, kWanted, &info) != 0) {
    throw std::system_error(errno, std::generic_category());
  }
  return info;
}

struct statx Look(const std::string& path) {
  if (path.empty() || path.front() != '/' || path.find('\0') != std::string::npos) {
    throw std::invalid_argument("it has no absolute path");
  }
  return Look(quarrox::UniqueFd(quarrox::OpenWithoutLinks(path, O_PATH)).get());
}

const char* Kind(const struct statx& info) {
  if (S_ISDIR(info.stx_mode)) return "folder";
  if (S_ISREG(info.stx_mode)) return "file";
  return S_ISLNK(info.stx_mode) ? "link" : "other";
}

void SetNames(const std::string& path, Json::Value& fields) {
  std::string plain = path;
  while (plain.size() > 1 && plain.back() == '/') plain.pop_back();
  const std::string name = plain == "/" ? plain : quarrox::Basename(plain);
  const std::string parent = quarrox::Dirname(plain);
  fields["VEXOMDPath"] = plain;
  fields["VEXOMDFSName"] = name;
  fields["VEXOMDDisplayName"] = name;
  fields["VEXOMDParent"] = parent.empty() ? "/" : parent;
  fields["VEXOMDExtension"] = quarrox::GetFileExtension(plain, true);
}

void SetAttributes(const struct statx& info, Json::Value& fields) {
  fields["VEXOMDKind"] = Kind(info);
  fields["VEXOMDIsDir"] = S_ISDIR(info.stx_mode);
  fields["VEXOMDFSSize"] = Json::UInt64{info.stx_size};
  fields["VEXOMDLogicalSize"] = Json::UInt64{info.stx_size};
  fields["VEXOMDPhysicalSize"] = Json::UInt64{kBlockSize * info.stx_blocks};
  fields["VEXOMDFSContentChangeDate"] = Json::Int64{info.stx_mtime.tv_sec};
  fields["VEXOMDContentModificationDate"] = Json::Int64{info.stx_mtime.tv_sec};
  fields["VEXOMDAttributeChangeDate"] = Json::Int64{info.stx_ctime.tv_sec};
  fields["VEXOMDLastUsedDate"] = Json::Int64{info.stx_atime.tv_sec};
  if ((info.stx_mask & STATX_BTIME) != 0) fields["VEXOMDFSCreationDate"] = Json::Int64{info.stx_btime.tv_sec};
  fields["VEXOMDOwnerUserID"] = std::to_string(info.stx_uid);
  fields["VEXOMDOwnerGroupID"] = std::to_string(info.stx_gid);
  char privilege[8];
  snprintf(privilege, sizeof(privilege), "%03o", info.stx_mode & 07777U);
  fields["VEXOMDPrivilege"] = privilege;
}

bool NeedsContent(const Json::Value& options) {
  if (!options.isObject()) return false;
  const Json::Value& needed = options["need_meta"];
  return needed.isBool() && needed.asBool();
}

// Reading for the index is no use of the file, so its access time stays; only the owner and root may ask for that.
int OpenUnnoticed(const std::string& path) {
  constexpr int kFlags = O_RDONLY | O_NONBLOCK | O_NOCTTY;
  const int fd = quarrox::OpenWithoutLinks(path, kFlags | O_NOATIME);
  return fd < 0 && errno == EPERM ? quarrox::OpenWithoutLinks(path, kFlags) : fd;
}

// What cannot be opened as it is, whoever tries again: not readable, a symbolic link, a socket, a device that is not
// there.
bool HasNoContent(int error) {
  return error == EACCES || error == EPERM || error == ELOOP || error == ENXIO || error == ENODEV;
}

// Whether there may be tags or comments of people in the file's extended attributes; reading them takes some parsing.
bool HasNotes(int fd) {
  constexpr std::string_view kOfUsers("\0user.", 6);
  char names[4096] = "";  // each ends with a zero byte
  const ssize_t size = flistxattr(fd, names + 1, sizeof(names) - 1);
  if (size < 0) return errno == ERANGE;
  return std::string_view(names, static_cast<size_t>(size) + 1).find(kOfUsers) != std::string_view::npos;
}

// Adds what is in a file. By now the path may name anything, and what is read is to have its own attributes: who may
// find a text is known by them.
void ReadContents(const std::string& path, Json::Value& fields) {
  const quarrox::UniqueFd fd(OpenUnnoticed(path));
  if (!fd && HasNoContent(errno)) return;
  const struct statx info = Look(fd.get());
  if (!S_ISREG(info.stx_mode)) return;
  SetAttributes(info, fields);
  const std::string extension = fields["VEXOMDExtension"].asString();
  const uint64_t size = info.stx_size;
  const std::optional<std::string> text =
      !HasNotes(fd.get()) ? platform::ReadPlainText(fd.get(), size, extension) : std::optional<std::string>();
  if (text) {
    fields["VEXOMDTextContent"] = *text;
  } else {
    platform::ContentWorkers::OfProcess().Read({fd.get(), size, extension}, fields);
  }
}

thread_local std::string last_failure;

}  // namespace

namespace VEXO::CONTENT_EXTRACT {

void ParseFile(const std::string& path, const Json::Value& options, Json::Value& document) {
  last_failure.clear();
  try {
    const struct statx info = Look(path);
    Json::Value fields(Json::objectValue);
    SetNames(path, fields);
    SetAttributes(info, fields);
    if (S_ISREG(info.stx_mode) && NeedsContent(options)) ReadContents(path, fields);
    for (auto field = fields.begin(); field != fields.end(); ++field) document[field.name()].swap(*field);
  } catch (const std::exception& error) {
    last_failure = error.what();
    throw;
  }
}

std::string LastFailure() {
  return last_failure;
}

Json::Value ReaderFeatures() {
  const std::string program = platform::ContentProgram();
  Json::Value features(Json::objectValue);
  try {
    features = platform::ContentWorker(program).features();
  } catch (const std::system_error& error) {
    features["failure"] = error.what();
  }
  features["program"] = program;
  return features;
}

}  // namespace VEXO::CONTENT_EXTRACT
