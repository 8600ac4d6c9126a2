#include <iostream>
#include <string>

#include "command.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/sdk/share.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_move.h"
#include "output.h"

namespace quarrox::ctl {
namespace {

// What an operation does with a share in which no folder is indexed.
enum class WithoutFolders { kActs, kDoesNothing };

// Calls an operation on the share that is the first operand, under the lock that its callers owe it.
template <typename Operation>
int Change(const Arguments& arguments, const char* done, WithoutFolders without_folders, const Operation& operation) {
  const std::string& share = arguments.operands().front();
  const LockFile lock(fileindex::kFolderLockPath, true);
  const bool acts = without_folders == WithoutFolders::kActs || fileindex::FolderMgr().IsShareIndexed(share);
  operation(share);
  if (arguments.Has("--json")) {
    Json::Value answer;
    answer["success"] = true;
    answer["share"] = share;
    answer["changed"] = acts;
    std::cout << toString(answer) << '\n';
  } else {
    std::cout << Visible(share) << ": " << (acts ? done : "none of its folders is indexed, nothing was done") << '\n';
  }
  return kDone;
}

// The operand as the full path of a directory, without the slashes that a shell's completion leaves.
std::string FullPath(const Arguments& arguments, size_t operand) {
  std::string path = arguments.operands()[operand];
  if (!path.empty() && path.front() != '/') throw UsageError("'" + path + "' is no full path; it begins with \"/\"");
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

}  // namespace

int ShareRename(const Arguments& arguments) {
  const sdk::SDKShare exists(arguments.operands()[1]);  // the list is saved before the operation asks for it
  return Change(arguments, "its folders and its index follow", WithoutFolders::kActs,
                [&](const std::string& share) { fileindex::ShareRename(share, arguments.operands()[1]); });
}

int ShareMigrate(const Arguments& arguments) {
  const std::string from = FullPath(arguments, 1);
  const std::string to = FullPath(arguments, 2);
  return Change(arguments, "its index follows", WithoutFolders::kDoesNothing,
                [&](const std::string& share) { fileindex::ShareMigrate(share, from, to); });
}

int SharePause(const Arguments& arguments) {
  return Change(arguments, "paused", WithoutFolders::kDoesNothing, fileindex::SharePause);
}

int ShareResume(const Arguments& arguments) {
  return Change(arguments, "resumed", WithoutFolders::kDoesNothing, fileindex::ShareResume);
}

int ShareRebuild(const Arguments& arguments) {
  return Change(arguments, "has a new index; a reindex of all of it waits in the queue", WithoutFolders::kDoesNothing,
                fileindex::ShareRebuild);
}

int ShareAutoClean(const Arguments& arguments) {
  return Change(arguments, "its index is removed, its folders stay", WithoutFolders::kDoesNothing,
                fileindex::ShareAutoClean);
}

int ShareClearPaused(const Arguments& arguments) {
  const std::string path = FullPath(arguments, 1);
  const int status = Change(arguments, "its index and its folders are removed", WithoutFolders::kActs,
                            [&](const std::string& share) { fileindex::ShareClearPaused(share, path); });
  fileindex::CleanFormerPlace(path);  // of one that was not paused, also what tells the notification daemon to watch it
  return status;
}

int ShareCheckRecycle(const Arguments& arguments) {
  return Change(arguments, "a reindex of its recycle bin waits in the queue", WithoutFolders::kActs,
                fileindex::ShareCheckRecycle);
}

}  // namespace quarrox::ctl
