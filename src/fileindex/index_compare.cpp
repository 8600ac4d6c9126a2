#include "fileindex/index_compare.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <memory>
#include <string_view>
#include <utility>

#include "common/comm.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/open_file.h"
#include "common/strings.h"
#include "fileindex/elastic_control.h"
#include "fileindex/index_rows.h"

namespace quarrox::fileindex {
namespace {

// Documents in one answer: some ten megabytes. The engine skips those of the pages before, so that small pages would
// cost the square.
constexpr Json::ArrayIndex kPage = 100000;

// Large enough that a request for them costs little, small enough that a signal need not wait.
constexpr size_t kGoneAtOnce = 1000;

// Entries that are looked at between two looks around: some tenths of a millisecond.
constexpr uint64_t kEntriesAtOnce = 64;

constexpr const char* kUsualFields[] = {"VEXOMDPath", "VEXOMDFSSize", "VEXOMDFSContentChangeDate",
                                        "VEXOMDAttributeChangeDate", "VEXOMDIsDir"};

// Those that hold the last component of the path, and others that a thorough comparison looks at.
constexpr const char* kNameFields[] = {"VEXOMDFSName", "VEXOMDSearchFileName", "VEXOMDDisplayName"};
constexpr char kExtensionField[] = "VEXOMDExtension";
constexpr const char* kAccessFields[] = {"VEXOMDPrivilege", "VEXOMDOwnerUserID", "VEXOMDOwnerGroupID"};

int64_t NumberOf(const Json::Value& hit, const char* field) {
  const Json::Value& value = hit[field];
  return value.isNumeric() ? static_cast<int64_t>(value.asDouble()) : -1;
}

bool HasItsNames(const Json::Value& hit, const std::string& path) {
  const std::string name = Basename(path);
  for (const char* field : kNameFields) {
    if (hit[field] != name) return false;
  }
  return hit[kExtensionField] == GetFileExtension(path, true);
}

// The mode and the owners, as a document has them and as the disk does.
std::string AccessOf(const Json::Value& hit) {
  std::string access;
  for (const char* field : kAccessFields) access += hit[field].isString() ? hit[field].asString() + ' ' : "- ";
  return access;
}

std::string AccessOf(const struct stat& info) {
  char text[64];
  snprintf(text, sizeof(text), "%03o %u %u ", info.st_mode & 07777U, info.st_uid, info.st_gid);
  return text;
}

struct CloseDirectory {
  void operator()(DIR* directory) const { closedir(directory); }
};
using OpenDirectory = std::unique_ptr<DIR, CloseDirectory>;

// Null and errno where it cannot be opened. A link in its place or above is not followed.
OpenDirectory Open(const std::string& path) {
  const int fd = OpenWithoutLinks(path, O_RDONLY | O_DIRECTORY | O_NONBLOCK);
  return OpenDirectory(fd < 0 ? nullptr : fdopendir(fd));
}

// What follows the last "/" of a path.
std::string NameOf(const std::string& path) {
  return path.substr(path.rfind('/') + 1);
}

bool IsGone(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP;
}

}  // namespace

IndexComparison::Directory& IndexComparison::DirectoryOf(const std::string& path) {
  const std::string_view directory = std::string_view(path).substr(0, path.rfind('/') + 1);
  if (last_documents_ == nullptr || directory != last_directory_) {
    last_directory_ = directory;
    last_documents_ = &documents_[last_directory_];
  }
  return *last_documents_;
}

void IndexComparison::Remember(const Json::Value& hit) {
  std::string path;
  if (hit.isObject()) GetJsonValue(path, hit, "VEXOMDPath", false);
  if (path.empty()) return;
  if (scope_.IsPaused(path)) return void(++loaded_);
  Document document;
  document.size = NumberOf(hit, "VEXOMDFSSize");
  document.changed = NumberOf(hit, "VEXOMDFSContentChangeDate");
  document.attributes_changed = NumberOf(hit, "VEXOMDAttributeChangeDate");
  const Json::Value& is_directory = hit["VEXOMDIsDir"];
  document.is_directory = is_directory.isConvertibleTo(Json::booleanValue) && is_directory.asBool();
  if (care_ == Care::kThorough) {
    document.has_its_names = HasItsNames(hit, path);
    document.access = AccessOf(hit);
  }
  loaded_ += DirectoryOf(path).insert_or_assign(NameOf(path), document).second ? 1 : 0;
}

void IndexComparison::Remember(ListedDocument&& listed) {
  if (scope_.IsPaused(listed.path)) return void(++loaded_);
  Document document;
  document.size = listed.size;
  document.changed = listed.changed;
  document.attributes_changed = listed.attributes_changed;
  document.is_directory = listed.is_directory;
  loaded_ += DirectoryOf(listed.path).insert_or_assign(NameOf(listed.path), document).second ? 1 : 0;
}

void IndexComparison::Load(const char* kind, const std::string& text) {
  Json::Value request(Json::objectValue);
  request["command"] = "document_get_by_query";
  request["data"]["id"] = elastic::GetFileIndexID(scope_.share());
  Json::Value& query = request["data"]["query"];
  query["qsl"][kind]["VEXOMDPath"] = text;
  for (const char* field : kUsualFields) query["load_field"].append(field);
  if (care_ == Care::kThorough) {
    for (const char* field : kNameFields) query["load_field"].append(field);
    for (const char* field : kAccessFields) query["load_field"].append(field);
    query["load_field"].append(kExtensionField);
  }
  query["size"] = kPage;
  for (Json::ArrayIndex from = 0;; from += kPage) {
    differences_.CheckPoint();
    query["from"] = from;
    if (LoadPage(request) < kPage) return;
  }
}

// Returns how many elements the page has.
size_t IndexComparison::LoadPage(const Json::Value& request) {
  size_t elements = 0;
  bool is_taken = false;
  Json::Value response;
  SendRequestImpl(response, request, [&](const std::string& text) {
    is_taken =
        care_ == Care::kUsual && ReadListing(
                                     text, [this](ListedDocument&& listed) { Remember(std::move(listed)); }, elements);
    return is_taken;
  });
  if (is_taken) return elements;
  const Json::Value& hits = std::as_const(response)["data"];
  if (!hits.isArray()) throw Error(kErrEngineNoData, toString(response));
  for (const Json::Value& hit : hits) Remember(hit);
  return hits.size();
}

// Whether only attributes can differ. What is in a directory changes its size and times without an event that tells of
// it; they are put right when somebody compares in the usual way.
bool IndexComparison::IsSameFile(const Document& document, const std::string& path, const struct stat& info) const {
  const bool is_directory = S_ISDIR(info.st_mode);
  if (document.is_directory != is_directory || (is_forced_ && is_forced_(path, info))) return false;
  if (is_directory && care_ == Care::kThorough) return true;
  return document.size == info.st_size && document.changed == info.st_mtim.tv_sec;
}

bool IndexComparison::HasSameAttributes(const Document& document, const struct stat& info) const {
  if (care_ == Care::kThorough && (!document.has_its_names || document.access != AccessOf(info))) return false;
  if (S_ISDIR(info.st_mode) && care_ == Care::kThorough) return true;
  return document.attributes_changed == info.st_ctim.tv_sec;
}

void IndexComparison::Visit(const std::string& path, const struct stat& info) {
  Directory& documents = DirectoryOf(path);
  const auto found = documents.find(NameOf(path));
  const bool is_missing = found == documents.end();
  const Document document = is_missing ? Document() : std::move(found->second);
  if (!is_missing) documents.erase(found);
  const bool is_same = !is_missing && IsSameFile(document, path, info);
  if (is_same && HasSameAttributes(document, info)) {
    if (++met_ % kEntriesAtOnce == 0) differences_.CheckPoint();
    return;
  }
  differences_.CheckPoint();
  if (is_missing) return differences_.Missing(path);
  if (!is_same) return differences_.Changed(path);
  differences_.AttributesChanged(path, S_ISDIR(info.st_mode));
}

void IndexComparison::LeaveUnread(const std::string& path, int error) {
  unread_.insert(path);
  differences_.Unreadable(path, error);
}

// A directory goes to `pending`.
void IndexComparison::ReadEntry(int directory_fd, const dirent& entry, const std::string& path,
                                std::vector<std::string>& pending) {
  if (scope_.IsPaused(path)) return;
  if (entry.d_type == DT_DIR) return pending.push_back(path);
  struct stat info;
  if (fstatat(directory_fd, entry.d_name, &info, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT) != 0) {
    const int error = errno;
    if (!IsGone(error)) LeaveUnread(path, error);
    return;
  }
  if (S_ISDIR(info.st_mode)) return pending.push_back(path);
  if (IndexScope::AcceptsEntry(entry.d_name, info.st_mode)) Visit(path, info);
}

void IndexComparison::ReadDirectory(const std::string& directory, std::vector<std::string>& pending) {
  const OpenDirectory open_directory = Open(directory);
  int error = errno;
  std::string path = directory + '/';
  while (open_directory) {
    errno = 0;
    const dirent* entry = readdir(open_directory.get());
    error = errno;
    if (entry == nullptr) break;
    const std::string_view name = entry->d_name;
    if (name == "." || name == "..") continue;
    path.resize(directory.size() + 1);
    ReadEntry(dirfd(open_directory.get()), *entry, path.append(name), pending);
  }
  if (error == 0 || IsGone(error)) return;
  errno = error;
  QUARROX_LOG_FAILURE("%.8192s cannot be read; what the index has below it stays", directory.c_str());
  LeaveUnread(directory, error);
}

void IndexComparison::Walk(const std::string& start) {
  std::vector<std::string> pending = {start};
  while (!pending.empty()) {
    differences_.CheckPoint();
    const std::string path = std::move(pending.back());
    pending.pop_back();
    const Entry entry = LookAt(path);
    if (entry.presence == Entry::kUnknown) LeaveUnread(path, entry.error);
    if (entry.presence != Entry::kThere) continue;
    // What follows the start is an entry of a directory that was accepted.
    const bool is_found = path != start && entry.IsDirectory();
    if (!(is_found ? scope_.AcceptsDirectoryIn(path) : scope_.Accepts(path))) continue;
    Visit(path, entry.info);
    if (entry.IsDirectory()) ReadDirectory(path, pending);
  }
}

void IndexComparison::TellWhatWasNotMet() {
  std::vector<std::string> gone;
  const auto tell = [&] {
    if (gone.empty()) return;
    differences_.CheckPoint();
    scope_.CheckDirectory();
    differences_.Gone(gone);
    gone.clear();
  };
  for (const auto& [directory, documents] : documents_) {
    for (const auto& [name, document] : documents) {
      std::string path = directory + name;
      if (!HoldsAtOrAbove(unread_, path)) gone.push_back(std::move(path));
      if (gone.size() == kGoneAtOnce) tell();
    }
  }
  tell();
}

void IndexComparison::Run(const std::string& path) {
  const bool is_whole_index = path == scope_.directory();
  if (!is_whole_index) Load("term", path);
  Load("prefix", is_whole_index ? "/" : path + "/");
  for (const std::string& start : scope_.Starts(path)) Walk(start);
  TellWhatWasNotMet();
}

}  // namespace quarrox::fileindex
