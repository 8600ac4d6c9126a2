#include "fileindex/folder_mgr.h"

#include <sys/stat.h>

#include <algorithm>
#include <utility>

#include "common/file.h"
#include "common/json.h"
#include "common/log.h"
#include "common/sdk/credentials.h"
#include "common/strings.h"
#include "fileindex/folder_mgr_table.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/util.h"
#include "vexo/unicode.h"

namespace quarrox::fileindex {
namespace {

using FolderPtr = std::shared_ptr<Folder>;

constexpr mode_t kListMode = 0644;

bool IsCaseLess(const std::string& a, const std::string& b) {
  return VLIBCUnicodeUTF8StrCaseCmp(a.c_str(), b.c_str()) < 0;
}

// Whether one folder comes before another, by the sort keys; any other key is that of the name.
using Before = bool (*)(const FolderPtr& a, const FolderPtr& b);

Before OrderOf(const std::string& sort_by) {
  static const struct {
    const char* key;
    Before before;
  } orders[] = {
      {"document", [](const FolderPtr& a, const FolderPtr& b) { return !a->HasDocument() && b->HasDocument(); }},
      {"audio", [](const FolderPtr& a, const FolderPtr& b) { return !a->HasAudio() && b->HasAudio(); }},
      {"video", [](const FolderPtr& a, const FolderPtr& b) { return !a->HasVideo() && b->HasVideo(); }},
      {"photo", [](const FolderPtr& a, const FolderPtr& b) { return !a->HasPhoto() && b->HasPhoto(); }},
      {"path", [](const FolderPtr& a, const FolderPtr& b) { return IsCaseLess(a->GetPath(), b->GetPath()); }},
  };
  for (const auto& order : orders) {
    if (sort_by == order.key) return order.before;
  }
  return [](const FolderPtr& a, const FolderPtr& b) { return IsCaseLess(a->GetName(), b->GetName()); };
}

}  // namespace

FolderMgr::FolderMgr() : folders_(std::make_unique<FolderTable>()) {
  Json::Value folders(Json::arrayValue);
  const bool exists = IsFileExist(kFileIndexFoldersCfgPath);
  if (exists && (!fromFile(folders, kFileIndexFoldersCfgPath) || !folders.isArray())) {
    QUARROX_THROW("IsFileExist(kFileIndexFoldersCfgPath) && !folders.fromFile(kFileIndexFoldersCfgPath)", kErrJsonLoad,
                  std::string("Cannot load json: ") + kFileIndexFoldersCfgPath);
  }
  for (const Json::Value& data : folders) folders_->Append(std::make_shared<Folder>(data));
}

FolderMgr::~FolderMgr() = default;

void FolderMgr::Save() const {
  sdk::SDKCredentials credentials;
  credentials.AsUser("root");
  Json::Value folders(Json::arrayValue);
  for (const auto& [position, folder] : folders_->records()) folders.append(folder->GetData());
  MakeDirectoriesOf(kFileIndexFoldersCfgPath);
  if (!toFile(folders, kFileIndexFoldersCfgPath)) {
    QUARROX_THROW("!folders.toFile(kFileIndexFoldersCfgPath)", kErrJsonSave, kFileIndexFoldersCfgPath);
  }
  if (-1 == chmod(kFileIndexFoldersCfgPath, kListMode)) {
    QUARROX_THROW("-1 == chmod(kFileIndexFoldersCfgPath, 0644)", kErrSystem, kFileIndexFoldersCfgPath);
  }
  FolderPauses pauses;
  pauses.KeepOnly(GetFolders());
  pauses.Save();
}

void FolderMgr::Get(std::shared_ptr<Folder>& folder, const std::string& path) const {
  FolderPtr found = folders_->FindByPath(path);
  if (found == nullptr) QUARROX_THROW("it == folders_.end()", kErrNoSuchFolder, path);
  folder = std::move(found);
}

bool FolderMgr::HasFolder(const std::string& path) const {
  return folders_->FindByPath(path) != nullptr;
}

std::vector<std::shared_ptr<Folder>> FolderMgr::GetFolders() const {
  std::vector<FolderPtr> all;
  all.reserve(folders_->records().size());
  for (const auto& [position, folder] : folders_->records()) all.push_back(folder);
  return all;
}

std::shared_ptr<Folder> FolderMgr::GetMostSuitableCfg(const std::string& full_path) const {
  return folders_->FindCovering(full_path);
}

bool FolderMgr::IsFullPathIndexed(const std::string& full_path) const {
  return folders_->FindCovering(full_path) != nullptr;
}

bool FolderMgr::IsFullPathHasOwnCfg(const std::string& full_path) const {
  return folders_->FindByFullPath(full_path) != nullptr;
}

bool FolderMgr::IsShareIndexed(const std::string& share) const {
  return folders_->HasShare(share);
}

bool FolderMgr::IsFullPathNeedMeta(const std::string& full_path) const {
  const FolderPtr folder = folders_->FindCovering(full_path);
  if (folder == nullptr) return false;
  switch (GetFileTypeByFullPath(full_path)) {
    case kFileTypeDocument:
      return folder->HasDocument();
    case kFileTypeAudio:
      return folder->HasAudio();
    case kFileTypeVideo:
      return folder->HasVideo();
    case kFileTypePhoto:
      return folder->HasPhoto();
    case kFileTypeOther:
      break;
  }
  return true;
}

void FolderMgr::Upsert(std::shared_ptr<Folder>& diff, const std::shared_ptr<Folder>& folder) {
  FolderPtr result = DiffCfg(folder, folders_->FindCovering(folders_->FullPathOf(*folder)));
  folders_->RemoveFirst(folder->GetPath());
  folders_->Append(folder);
  diff = std::move(result);  // last: `diff` may be `folder` itself
}

void FolderMgr::Delete(std::shared_ptr<Folder>& diff, const std::string& path) {
  const std::string full_path = folders_->FullPathOf(path);
  const FolderPtr before = folders_->FindCovering(full_path);
  folders_->RemoveFirst(path);
  diff = DiffCfg(before, folders_->FindCovering(full_path));
}

void FolderMgr::DeleteByShare(const std::string& share) {
  folders_->RemoveShare(share);
}

std::shared_ptr<Folder> FolderMgr::DiffCfg(const std::shared_ptr<Folder>& a, const std::shared_ptr<Folder>& b) {
  if (a == nullptr) return nullptr;
  const auto differs = [&](bool (Folder::*has)() const) { return b == nullptr || ((*a).*has)() != ((*b).*has)(); };
  return std::make_shared<Folder>(a->GetPath(), a->GetName(), "", "", differs(&Folder::HasDocument),
                                  differs(&Folder::HasAudio), differs(&Folder::HasVideo), differs(&Folder::HasPhoto),
                                  false, false);
}

void FolderMgr::List(std::vector<std::shared_ptr<Folder>>& out, size_t& total, size_t offset, size_t limit,
                     const std::string& sort_by, const std::string& sort_direction, const std::string& group,
                     const std::string& keyword) const {
  const std::string word = ToLower(Trim(keyword));
  out = GetFolders();
  std::erase_if(out, [&](const FolderPtr& folder) {
    const bool in_group = group == kAll || folder->GetGroup() == group;
    return !in_group || ToLower(folder->GetName()).find(word) == std::string::npos;
  });
  total = out.size();
  std::sort(out.begin(), out.end(), OrderOf(sort_by));
  if (ToLower(sort_direction) == "desc") std::reverse(out.begin(), out.end());
  const size_t begin = std::min(offset, out.size());
  const size_t count = std::min(limit, out.size() - begin);
  out = std::vector<FolderPtr>(out.begin() + static_cast<ptrdiff_t>(begin),
                               out.begin() + static_cast<ptrdiff_t>(begin + count));
}

std::set<std::string> FolderMgr::GetIndexedShares() const {
  std::set<std::string> shares;
  for (const auto& [position, folder] : folders_->records()) shares.insert(folder->GetShare());
  return shares;
}

std::set<std::string> FolderMgr::GetGroups() const {
  std::set<std::string> groups;
  for (const auto& [position, folder] : folders_->records()) {
    if (!folder->GetGroup().empty()) groups.insert(folder->GetGroup());
  }
  return groups;
}

}  // namespace quarrox::fileindex
