#include "index_handler_writer.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

#include "common/comm.h"
#include "common/error.h"
#include "common/log.h"
#include "fileindex/elastic_control.h"

namespace quarrox::fileindexd {
namespace {

namespace elastic = fileindex::elastic;
using fileindex::Entry;
using fileindex::LookAt;

// Refusals of the engine that concern the one document.
constexpr int kBadArgument = 612;
constexpr int kNoSuchDocument = 614;

bool ConcernsOnePath(int code) {
  return code == kErrEngineParse || code == kErrEngineReply || code == kBadArgument || code == kNoSuchDocument;
}

// Errors that go away without a change of the file: of the disk, of rights further up, of the machine's resources, of
// another machine that lends the disk. What is not there while the file is, is a program that reads it.
bool MaySucceedLater(int error) {
  constexpr int kPassing[] = {EIO,    ENOENT, EACCES, EPERM,  ENOMEM,    EAGAIN,   EBUSY,        EINTR,     EMFILE,
                              ENFILE, ENOSPC, EDQUOT, ESTALE, ETIMEDOUT, ENOTCONN, EHOSTUNREACH, ECONNRESET};
  return std::find(std::begin(kPassing), std::end(kPassing), error) != std::end(kPassing);
}

}  // namespace

std::optional<std::string> IndexWriter::PlaceOf(const std::string& path) const {
  const std::string& directory = scope_.directory();
  if (!path.starts_with(directory)) return std::nullopt;
  std::string place = path.substr(directory.size());
  if (!place.empty() && place.front() != '/') return std::nullopt;
  return place;
}

void IndexWriter::Reset() {
  Forget();
  tally_ = {};
}

// What is wrong with the one path that is changed, if something is.
std::optional<IndexWriter::Failure> IndexWriter::Try(const std::function<void()>& change) const {
  errno = 0;
  try {
    change();
    return std::nullopt;
  } catch (const Error& error) {
    const int system_error = error.code == kErrEngineParse ? errno : 0;
    errno = 0;
    if (!ConcernsOnePath(error.code)) throw;
    Failure failure;
    failure.code = error.code;
    failure.reason = error.reason;
    const std::string why = error.code == kErrEngineParse ? elastic::LastReadFailure() : "";
    if (!why.empty()) failure.reason.append(", reason=").append(why);
    failure.may_succeed_later = MaySucceedLater(system_error);
    return failure;
  }
}

void IndexWriter::Note(const std::string& path, const Entry& entry, Failure failure) {
  ++tally_.failed;
  const std::optional<std::string> place = PlaceOf(path);
  if (!place) return;
  if (entry.presence == Entry::kThere) failure.SetFile(entry.info);
  failures_.Note(*place, std::move(failure));
}

void IndexWriter::NoteUnread(const std::string& path, int error) {
  Failure failure;
  failure.code = kErrSystem;
  failure.reason = path + " cannot be read, reason=" + strerror(error);
  failure.may_succeed_later = MaySucceedLater(error);
  Note(path, {}, std::move(failure));
}

void IndexWriter::Done(const std::string& path) {
  ++tally_.done;
  tally_.path = path;
}

// Where it fails, it is tried once more without the contents: the name is to be found.
void IndexWriter::Upsert(const std::string& path) {
  const std::optional<std::string> place = failures_.empty() ? std::nullopt : PlaceOf(path);
  const Failure* before = place ? failures_.Find(*place) : nullptr;
  const Entry found = LookAt(path);
  if (found.presence == Entry::kThere) recent_reads_.Add(path, found.info);
  const bool is_hopeless = before != nullptr && !before->may_succeed_later && before->IsAbout(found.info);
  if (is_hopeless && !before->has_document) return;
  const bool wants_contents = scope_.NeedsMeta(path) && !is_hopeless;
  const auto upsert = [&](bool need_meta) {
    return Try([&] { elastic::IndexUpsert(scope_.share(), path, need_meta); });
  };
  std::optional<Failure> failure = upsert(wants_contents);
  if (failure) {
    const Entry entry = LookAt(path);
    if (entry.presence == Entry::kGone) return Delete(path);
    failure->has_document = wants_contents && !upsert(false);
    errno = 0;
    QUARROX_LOG_FAILURE("%.8192s is not indexed as it is, code=%d, reason=%.8192s", path.c_str(), failure->code,
                        failure->reason.c_str());
    const bool has_document = failure->has_document;
    Note(path, entry, *std::move(failure));
    if (!has_document) return;
  } else if (before != nullptr && !is_hopeless) {
    failures_.Forget(*place);
  }
  fresh_.insert(std::hash<std::string>()(path));
  Done(path);
}

bool IndexWriter::RefreshAttributes(const std::string& path) {
  const std::optional<std::string> place = failures_.empty() ? std::nullopt : PlaceOf(path);
  if (place && failures_.Find(*place) != nullptr) return false;
  bool is_same = false;
  if (Try([&] { is_same = elastic::IndexAttrOfSame(scope_.share(), path); }) || !is_same) return false;
  Done(path);
  return true;
}

void IndexWriter::Delete(const std::string& path) {
  Forget(path);
  const auto failure = Try([&] { elastic::IndexDel(scope_.share(), path); });
  errno = 0;
  if (failure && failure->code != kNoSuchDocument) {
    QUARROX_LOG_FAILURE("%.8192s is not deleted from the index, code=%d, reason=%.8192s", path.c_str(), failure->code,
                        failure->reason.c_str());
  }
  if (const std::optional<std::string> place = PlaceOf(path)) failures_.Forget(*place);
  Done(path);
}

void IndexWriter::DeleteWithAllBelow(const std::string& path) {
  Delete(path);
  elastic::IndexDelDir(scope_.share(), path);
  if (const std::optional<std::string> place = PlaceOf(path)) failures_.ForgetBelow(*place);
}

void IndexWriter::Delete(const std::vector<std::string>& paths) {
  Json::Value items(Json::arrayValue);
  for (const std::string& path : paths) {
    Forget(path);
    if (const std::optional<std::string> place = PlaceOf(path)) failures_.Forget(*place);
    Done(path);
    Json::Value item(Json::objectValue);
    item["command"] = "document_del_by_id";
    item["data"]["doc_id"] = path;
    items.append(std::move(item));
  }
  SendAll(std::move(items));
}

void IndexWriter::DeleteBelow(const std::vector<std::string>& paths) {
  Json::Value items(Json::arrayValue);
  for (const std::string& path : paths) {
    Json::Value item(Json::objectValue);
    item["command"] = "document_del_by_query";
    item["data"]["query"]["qsl"]["prefix"]["VEXOMDPath"] = path + '/';
    items.append(std::move(item));
  }
  SendAll(std::move(items));
}

// Changes of this share's index, with one request.
void IndexWriter::SendAll(Json::Value items) {
  if (items.empty()) return;
  const std::string index_id = elastic::GetFileIndexID(scope_.share());
  for (Json::Value& item : items) item["data"]["id"] = index_id;
  Json::Value request(Json::objectValue);
  request["compound"].swap(items);
  Json::Value response;
  SendRequestImpl(response, request);
}

bool IndexWriter::Move(const std::string& path, const std::string& path_old,
                       const OperationHandler::CheckPoint& check_point) {
  const auto failure = Try([&] { elastic::IndexRename(scope_.share(), path, path_old, check_point); });
  if (failure) {
    QUARROX_LOG_FAILURE("%.8192s is indexed anew, because its documents cannot be moved, code=%d, reason=%.8192s",
                        path.c_str(), failure->code, failure->reason.c_str());
    return false;
  }
  const std::optional<std::string> place = PlaceOf(path);
  const std::optional<std::string> place_old = PlaceOf(path_old);
  if (place && place_old) failures_.MoveBelow(*place_old, *place);
  Done(path);
  return true;
}

}  // namespace quarrox::fileindexd
