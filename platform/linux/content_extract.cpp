#include "vexo/content_extract.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <optional>
#include <stdexcept>
#include <system_error>
#include <utility>

#include "common/strings.h"
#include "linux/content_extract_text.h"

namespace {

// The unit of statx's stx_blocks, whatever the file system's own block is.
constexpr unsigned int kBlockSize = 512;

struct statx Look(const std::string& path) {
  if (path.empty() || path.front() != '/' || path.find('\0') != std::string::npos) {
    throw std::invalid_argument("not an absolute path: " + path);
  }
  struct statx info;
  constexpr unsigned int kWanted = STATX_BASIC_STATS | STATX_BTIME;
  if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, kWanted, &info) != 0) {
    throw std::system_error(errno, std::generic_category(), path);
  }
  return info;
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

}  // namespace

namespace VEXO::CONTENT_EXTRACT {

void ParseFile(const std::string& path, const Json::Value& options, Json::Value& document) {
  const struct statx info = Look(path);
  Json::Value fields(Json::objectValue);
  SetNames(path, fields);
  SetAttributes(info, fields);
  if (S_ISREG(info.stx_mode) && NeedsContent(options)) {
    std::optional<std::string> text = platform::ReadPlainText(path);
    if (text) fields["VEXOMDTextContent"] = *text;
  }
  for (auto field = fields.begin(); field != fields.end(); ++field) document[field.name()].swap(*field);
}

}  // namespace VEXO::CONTENT_EXTRACT
