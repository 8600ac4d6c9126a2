#define QUARROX_LOG_UNIT "index_mgr"

#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/sdk/credentials.h"
#include "fileindex/index_mgr.h"

namespace quarrox::fileindex {
namespace {

// The user information file as it was when the object was made.
class UserInfos {
 public:
  UserInfos() {
    const bool exists = IsFileExist(kUserInfosPath);
    if (exists && (!fromFile(users_, kUserInfosPath) || !users_.isObject())) {
      QUARROX_THROW("IsFileExist(kUserInfosPath) && !infos.fromFile(kUserInfosPath)", kErrJsonLoad,
                    std::string("Cannot load json: ") + kUserInfosPath);
    }
  }

  // Takes a user out of the file. False where there was none.
  bool Remove(const std::string& user, Json::Value& info) {
    return users_.removeMember(user.data(), user.data() + user.size(), &info);
  }

  void Add(const std::string& user, const Json::Value& info) { users_[user] = info; }

  void Save() const {
    sdk::SDKCredentials credentials;
    credentials.AsUser("root");
    if (!toFile(users_, kUserInfosPath)) {
      QUARROX_THROW("!infos.toFile(kUserInfosPath)", kErrJsonSave, std::string("Cannot save json: ") + kUserInfosPath);
    }
  }

 private:
  Json::Value users_{Json::objectValue};
};

// False where no folder is the user's.
bool RenameOwner(const FolderMgr& folder_mgr, const std::string& user_from, const std::string& user_to) {
  bool changed = false;
  for (const auto& folder : folder_mgr.GetFolders()) {
    if (folder->GetOwner() != user_from) continue;
    folder->SetOwner(user_to);
    changed = true;
  }
  return changed;
}

Json::Value PathsOf(const std::string& user) {
  Json::Value paths(Json::arrayValue);
  for (const auto& folder : FolderMgr().GetFolders()) {
    if (folder->GetOwner() == user) paths.append(folder->GetPath());
  }
  return paths;
}

}  // namespace

void UserRename(const std::string& user_from, const std::string& user_to) {
  if (user_from.empty()) QUARROX_THROW("user_from.empty()", kErrBadParameter, "Missing user_from");
  if (user_to.empty()) QUARROX_THROW("user_to.empty()", kErrBadParameter, "Missing user_to");
  const LockFile lock(kFolderLockPath, true);
  const FolderMgr folder_mgr;
  UserInfos infos;
  if (RenameOwner(folder_mgr, user_from, user_to)) folder_mgr.Save();
  Json::Value info;
  if (!infos.Remove(user_from, info)) return;
  infos.Add(user_to, info);
  infos.Save();
}

void UserDelete(const std::string& user_name) {
  if (user_name.empty()) QUARROX_THROW("user_name.empty()", kErrBadParameter, "Missing user name");
  const Json::Value paths = PathsOf(user_name);
  if (!paths.empty()) FolderDelete(paths);
  const LockFile lock(kFolderLockPath, true);
  UserInfos infos;
  Json::Value info;
  if (infos.Remove(user_name, info)) infos.Save();
}

}  // namespace quarrox::fileindex
