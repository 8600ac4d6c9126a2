#include "index_handler_compare.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <memory>
#include <utility>
#include <vector>

#include "common/comm.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/unique_fd.h"
#include "fileindex/elastic_control.h"
#include "wait.h"

namespace quarrox::fileindexd {
namespace {

// Documents in one answer: some ten megabytes. The engine skips those of the pages before, so that small pages would
// cost the square.
constexpr Json::ArrayIndex kPage = 100000;

// Large enough that the connection costs little, small enough that a signal need not wait.
constexpr size_t kDeletesAtOnce = 1000;

int64_t NumberOf(const Json::Value& hit, const char* field) {
  const Json::Value& value = hit[field];
  return value.isNumeric() ? static_cast<int64_t>(value.asDouble()) : -1;
}

struct CloseDirectory {
  void operator()(DIR* directory) const { closedir(directory); }
};
using OpenDirectory = std::unique_ptr<DIR, CloseDirectory>;

// Null and errno where it cannot be opened. A link in its place is not followed.
OpenDirectory Open(const std::string& path) {
  const int fd = open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
  return OpenDirectory(fd < 0 ? nullptr : fdopendir(fd));
}

bool IsGone(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP;
}

}  // namespace

void IndexComparison::Remember(const Json::Value& hit) {
  std::string path;
  if (hit.isObject()) GetJsonValue(path, hit, "VEXOMDPath", false);
  if (path.empty()) return;
  Document& document = documents_[path];
  document.size = NumberOf(hit, "VEXOMDFSSize");
  document.changed = NumberOf(hit, "VEXOMDFSContentChangeDate");
  document.attributes_changed = NumberOf(hit, "VEXOMDAttributeChangeDate");
  const Json::Value& is_directory = hit["VEXOMDIsDir"];
  document.is_directory = is_directory.isConvertibleTo(Json::booleanValue) && is_directory.asBool();
}

void IndexComparison::Load(const char* kind, const std::string& text) {
  Json::Value request(Json::objectValue);
  request["command"] = "document_get_by_query";
  request["data"]["id"] = fileindex::elastic::GetFileIndexID(scope_.share());
  Json::Value& query = request["data"]["query"];
  query["qsl"][kind]["VEXOMDPath"] = text;
  for (const char* field :
       {"VEXOMDPath", "VEXOMDFSSize", "VEXOMDFSContentChangeDate", "VEXOMDAttributeChangeDate", "VEXOMDIsDir"}) {
    query["load_field"].append(field);
  }
  query["size"] = kPage;
  for (Json::ArrayIndex from = 0;; from += kPage) {
    check_point_();
    query["from"] = from;
    Json::Value response;
    SendRequestImpl(response, request);
    const Json::Value& hits = std::as_const(response)["data"];
    if (!hits.isArray()) throw Error(kErrEngineNoData, toString(response));
    for (const Json::Value& hit : hits) Remember(hit);
    if (hits.size() < kPage) return;
  }
}

void IndexComparison::Visit(const std::string& path, const struct stat& info) {
  const auto found = documents_.find(path);
  if (found == documents_.end()) return writer_.Upsert(path);
  const Document document = found->second;
  documents_.erase(found);
  const bool is_directory = S_ISDIR(info.st_mode);
  const bool is_same = document.is_directory == is_directory && document.size == info.st_size &&
                       document.changed == info.st_mtim.tv_sec && (is_directory || !forced_.Has(path));
  if (is_same && document.attributes_changed == info.st_ctim.tv_sec) return;
  // A directory has nothing else than what its attributes say.
  if (is_directory || !is_same || !writer_.RefreshAttributes(path)) writer_.Upsert(path);
}

// Directories in it go to `pending`.
void IndexComparison::ReadDirectory(const std::string& directory, std::vector<std::string>& pending) {
  const OpenDirectory open_directory = Open(directory);
  int error = errno;
  std::string path;
  while (open_directory) {
    errno = 0;
    const dirent* entry = readdir(open_directory.get());
    error = errno;
    if (entry == nullptr) break;
    const std::string name = entry->d_name;
    if (name == "." || name == "..") continue;
    path.assign(directory).append("/").append(name);
    struct stat info;
    if (fstatat(dirfd(open_directory.get()), name.c_str(), &info, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT) != 0) {
      const int look_error = errno;
      if (IsGone(look_error)) continue;
      writer_.NoteUnread(path, look_error);
      unread_.insert(path);
      continue;
    }
    if (S_ISDIR(info.st_mode)) {
      pending.push_back(path);
    } else if (IndexScope::AcceptsEntry(name, info.st_mode)) {
      check_point_();
      Visit(path, info);
    }
  }
  if (error == 0 || IsGone(error)) return;
  errno = error;
  QUARROX_LOG_FAILURE("%.8192s cannot be read; what the index has below it stays", directory.c_str());
  writer_.NoteUnread(directory, error);
  unread_.insert(directory);
}

void IndexComparison::Walk(const std::string& start) {
  std::vector<std::string> pending = {start};
  while (!pending.empty()) {
    check_point_();
    const std::string path = std::move(pending.back());
    pending.pop_back();
    const Entry entry = LookAt(path);
    if (entry.presence == Entry::kUnknown) {
      writer_.NoteUnread(path, entry.error);
      unread_.insert(path);
    }
    if (entry.presence != Entry::kThere || !scope_.Accepts(path)) continue;
    Visit(path, entry.info);
    if (entry.IsDirectory()) ReadDirectory(path, pending);
  }
}

void IndexComparison::DeleteWhatWasNotMet() {
  std::vector<std::string> gone;
  const auto remove = [&] {
    if (gone.empty()) return;
    check_point_();
    scope_.CheckDirectory();
    writer_.Delete(gone);
    gone.clear();
  };
  for (const auto& [path, document] : documents_) {
    if (!HoldsAtOrAbove(unread_, path)) gone.push_back(path);
    if (gone.size() == kDeletesAtOnce) remove();
  }
  remove();
}

void IndexComparison::Run(const std::string& path) {
  const bool is_whole_index = path == scope_.directory();
  if (!is_whole_index) Load("term", path);
  Load("prefix", is_whole_index ? "/" : path + "/");
  for (const std::string& start : scope_.Starts(path)) Walk(start);
  DeleteWhatWasNotMet();
}

}  // namespace quarrox::fileindexd
