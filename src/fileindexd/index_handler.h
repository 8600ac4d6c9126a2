// Carries out a share's pending operations on its index.
//
// An operation says what to look at, the disk says what is true: a delete of what is there indexes it, a create of what
// is gone deletes it, and so on. So operations may come in any order and more than once.
//
// A pass fails early where the engine is not there, and is not done where the engine that commits is another one than
// that which took the documents: both are told by the engine's socket file. Where the engine has no such index, it gets
// one, and everything in the share's folders is indexed, once a pass. The share's status flags say so until that was
// committed, so that a worker that dies meanwhile begins again. In the same way the folders with which the index was
// made are written down with it, and what is indexed otherwise since then is done first.
//
// While a folder is paused, what happens in it is passed over, and written down with the folders: once it is paused no
// more, it is compared. A pass that is under way when a folder is paused starts anew.
//
// What fails at one path is written down beside the index, when the rest is committed, and keeps nothing else from
// being done. A pass is also due where something that failed is to be tried again.
//
// Documents know times by the second. So a comparison does not trust them about what changed since the last committed
// pass began, or a little before, because events take a while to be written: this must have been read as it is by this
// process. When that pass began is the time of the folders' file.
#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "fileindex/folder_kinds.h"
#include "fileindex/index_scope.h"
#include "index_handler_writer.h"
#include "operation_handler.h"

namespace quarrox::fileindexd {

using fileindex::FolderKinds;
using fileindex::IndexScope;
using fileindex::Kinds;
using fileindex::PathSet;

class IndexHandler final : public OperationHandler {
 public:
  explicit IndexHandler(const std::string& share) : scope_(share), writer_(scope_, failures_) {}

  // Where the share's status asks for a reindex, something is to be tried again, or the folders are others than those
  // that the index was made with.
  bool HasWork() override;
  std::optional<int64_t> NextWork() const override;
  void Begin(const CheckPoint& check_point) override;
  void Handle(const fileindex::OP& operation) override;
  void Commit() override;
  const Tally& tally() const override;

 private:
  // Whose the documents at a path are before it is compared: its own, where nothing is said.
  struct Documents {
    bool of_others = false;  // perhaps of what was there before
    std::string moved_from = {};
    std::string moved_to = {};
  };

  bool NeedsReindex() const;
  bool HasOtherFolders();
  void ReadFailures();
  bool IsPausedPlace(const std::string& place) const { return scope_.IsPaused(scope_.directory() + place); }
  int64_t ChangedSince() const;
  bool LookAgain();
  void TryAgain();
  void Reindex(const std::string& path, const Kinds& forced = {});
  bool PassOver(const std::string& path);
  void ForgetStrangers(const std::string& path);
  void CountLooks(const std::string& path);
  void CarryOut(const fileindex::OP& operation);
  void Create(const std::string& path);
  void RefreshAttributes(const std::string& path);
  void Delete(const std::string& path);
  void DeleteBelowFiles();
  bool MayHaveChanged(const std::string& path) const;
  bool Move(const std::string& path, const std::string& path_old);
  void Rename(const std::string& path, const std::string& path_old);
  void FollowMoves();
  void Compare(const std::string& path, const Kinds& forced);
  void FindDifferences(const std::string& path, const Kinds& forced, const Documents& documents);
  bool IsDoubtful(const std::string& file, const struct stat& info, const Documents& documents);
  void CompareAll();
  void FollowFolders();
  Kinds DifferenceOf(const std::string& path, const std::string& other) const;
  void CreateIndex() const;
  void Rebuild();
  bool WithIndex(const std::function<void()>& work);
  void CheckEngine() const;

  IndexScope scope_;
  fileindex::IndexFailures failures_;
  IndexWriter writer_;
  std::optional<FolderKinds> committed_kinds_;  // of the last pass that was committed
  std::optional<struct stat> folders_seen_;     // the folder list that the index was made with

  std::optional<int64_t> tried_since_;  // when the first pass after that began, in seconds since the epoch

  // Of this pass:
  CheckPoint check_point_;
  struct stat engine_ = {};                  // its socket file
  std::optional<FolderKinds> kinds_before_;  // that the index was made with, where that is known
  FolderKinds kinds_;                        // that it is made with now
  FolderKinds begun_with_;                   // that the list had
  PathSet compared_;                         // where all that was pending before has been met
  PathSet moved_to_;                         // where documents were moved to
  std::set<std::string> moved_to_below_;     // the same, in order
  std::vector<std::string> written_;         // files, below which documents of a directory may be left
  PathSet refreshed_;                        // and the kinds were seen to
  std::vector<std::string> former_places_;   // of the share's directory
  bool compared_all_ = false;
  bool rebuilt_ = false;
  uint64_t looked_at_ = 0;              // by the comparison under way
  std::optional<uint64_t> to_look_at_;  // by it in all
  mutable Tally tally_;
  int64_t began_ = 0;   // in seconds since the epoch, as the next
  int64_t recent_ = 0;  // what changed since then may differ from its document although its times do not
};

}  // namespace quarrox::fileindexd
