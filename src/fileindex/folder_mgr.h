// The indexed folders of the machine: the folder list file, questions about paths, and changes.
//
// A FolderMgr is short-lived: load, ask or change, Save, drop. It takes no lock: who changes the list holds the lock of
// the folder list around all of this. Not thread-safe, not even for questions: what they need is computed when they are
// first asked.
//
// A folder covers a full path that is its own or lies below it, by whole components. Questions about full paths cost
// the depth of the path, however many folders there are. The first of them computes the full path of every folder, in
// the order of the list, and opens each share once; where one of the shares is gone it throws Error 800, and so does
// the next until DeleteByShare has taken that share's folders out.
#pragma once

#include <cstddef>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "common/export.h"
#include "fileindex/folder.h"

namespace quarrox::fileindex {

inline constexpr char kFileIndexFoldersCfgPath[] = "/var/packages/Quarrox/etc/fileindex.folders";

class FolderTable;

class QUARROX_API FolderMgr {
 public:
  // Reads the folder list; one that is not there is empty. Throws Error 504 where it is no JSON array, and what a
  // record throws that cannot be read.
  FolderMgr();
  ~FolderMgr();
  FolderMgr(const FolderMgr&) = delete;
  FolderMgr& operator=(const FolderMgr&) = delete;

  // Writes the list as root, mode 0644, with the directories above it where they are missing, and drops from
  // FolderPauses what it does not hold any more; the process is who it was again afterwards. Throws Error 503 where it
  // may not be root, 505 where a file cannot be written, 502 where the list's mode cannot be set.
  void Save() const;

  // The first folder with exactly this share path. Get throws Error 902 where there is none.
  void Get(std::shared_ptr<Folder>& folder, const std::string& path) const;
  bool HasFolder(const std::string& path) const;

  // All folders in the order of the list. The records are the list's own.
  std::vector<std::shared_ptr<Folder>> GetFolders() const;

  // The deepest folder that covers a full path, of several at one place the first in the list; null where none does.
  std::shared_ptr<Folder> GetMostSuitableCfg(const std::string& full_path) const;

  // Whether a folder covers a full path, and whether one is there itself.
  bool IsFullPathIndexed(const std::string& full_path) const;
  bool IsFullPathHasOwnCfg(const std::string& full_path) const;

  // Whether a folder lies in a share. Opens none.
  bool IsShareIndexed(const std::string& share) const;

  // Whether the folder that governs a file indexes files of its kind; true for a file of no known kind. False where no
  // folder does.
  bool IsFullPathNeedMeta(const std::string& full_path) const;

  // Puts a folder at the end of the list, in the place of the first one with its path. `diff` gets the kinds in which
  // it differs from the folder that governed its place before.
  void Upsert(std::shared_ptr<Folder>& diff, const std::shared_ptr<Folder>& folder);

  // Removes the first folder with this path. `diff` gets the kinds in which the folders that govern its place before
  // and after differ; null where none governed it. Throws Error 800 where the path's share is gone.
  void Delete(std::shared_ptr<Folder>& diff, const std::string& path);

  // Removes all folders of a share, which need not exist.
  void DeleteByShare(const std::string& share);

  // A folder at the place of `a` with each kind in which `a` and `b` differ: with all kinds where `b` is null. Null
  // where `a` is null.
  static std::shared_ptr<Folder> DiffCfg(const std::shared_ptr<Folder>& a, const std::shared_ptr<Folder>& b);

  // At most `limit` folders from `offset` on, of those in `group` (kAll: of every group) whose name contains `keyword`,
  // blanks around it and case put aside. `total` gets how many there are of these.
  // `sort_by` is "document", "audio", "video" or "photo" (those without the kind first), "path", or else the name;
  // `sort_direction` is "desc" in any case for the opposite order. Folders that compare equal come in any order.
  void List(std::vector<std::shared_ptr<Folder>>& out, size_t& total, size_t offset, size_t limit,
            const std::string& sort_by, const std::string& sort_direction, const std::string& group,
            const std::string& keyword) const;

  // The shares in which folders lie, and the groups that they are in.
  std::set<std::string> GetIndexedShares() const;
  std::set<std::string> GetGroups() const;

 private:
  std::unique_ptr<FolderTable> folders_;
};

}  // namespace quarrox::fileindex
