// The operations with which the package's web API, its hook tools and the command manage the index. Each brings the
// folder list, the monitor configurations of the notification daemon, the search engine, the indexing daemon and the
// event queues in line with one change, or answers one question.
//
// All take JSON and names as their callers have them and check them before anything else. A failure is an Error, logged
// in the name of the operation; what a callee throws passes through and stops the operation where it stands. Nothing is
// rolled back: an operation that failed may be called again. An operation reads each file once and answers from what it
// read then. A search engine that is not ready, or busy, is waited for without end.
//
// Paths are share paths ("/", the share's name, the rest) unless they are called full. Thread-safe as far as the
// process may switch its effective user to root for single calls.
#pragma once

#include <cstdint>
#include <string>

#include <json/json.h>

#include "common/export.h"
#include "fileindex/folder_mgr.h"

namespace quarrox::fileindex {

// The lock file of the folder list. Which operations take it themselves is said below; around the share operations the
// caller takes it (LockFile, exclusive). It is not recursive.
inline constexpr char kFolderLockPath[] = "/tmp/quarrox_cfg_folder.lock";

// --- folders -------------------------------------------------------------------------------------------------------

// One page of the folders as {"folder": [...], "total": N, "offset": N}; the four options are FolderMgr::List's in its
// order, `additional` is that of Folder::GetDataWithAdditional. Takes no lock.
QUARROX_API void FolderList(Json::Value& result, unsigned int offset, unsigned int limit, const std::string& sort_by,
                            const std::string& sort_direction, const std::string& group, const std::string& keyword,
                            const Json::Value& additional);

// The record of one folder. Throws Error 902 where there is none at this path. Takes no lock.
QUARROX_API void FolderGet(Json::Value& result, const std::string& path);

// The names of all groups, an array in ascending order. Takes no lock.
QUARROX_API void FolderListGroups(Json::Value& result);

// What all folders do, as {"items": [{"name", "text"}...], "status": text}: an item for each folder without a group,
// then one (with "group": true) for each group. Takes no lock.
//
// A text is "finished", "processing", "paused", "need_reindex" or "error". Texts are put together in order: "error"
// stays whatever follows; of the others but "finished" the later one replaces the earlier, save that "paused" does not
// replace "need_reindex". So the result depends on the order of the folders.
QUARROX_API void FolderSummary(Json::Value& result);

// Adds folders, or changes ones; `folder_list` is an array of records as Folder reads them. Under the folder lock:
// checks all of the request, switches the related services on, makes the index of each new share, writes the monitor
// configurations, saves the list, tells the daemon, and queues what is to be indexed.
//
// With `updater_mode`, for an upgrade that takes over folders as they are, the rules on paths do not apply and nothing
// is queued.
//
// Throws, before anything is changed: Error 120 where the request is no array or a record is bad, 903 for a path that
// may not be indexed, 901 (FolderAdd only) for one that is a folder already, 1003 where its share has no room, 800
// where it has no share.
QUARROX_API void FolderAdd(const Json::Value& folder_list, bool updater_mode);
QUARROX_API void FolderSet(const Json::Value& folder_list, bool updater_mode);

// FolderSet of one folder that is in the list, by the members that are to change: read, changed and saved under one
// lock, so that of two processes that change different members at once neither undoes what the other did. `result` gets
// the record as it is then. Throws Error 902 where there is no folder at this path, 120 where `changes` is no object or
// names another path, and as FolderSet; before anything is changed.
QUARROX_API void FolderChange(Json::Value& result, const std::string& path, const Json::Value& changes);

// Takes folders out of the list, by an array of their paths; a path that is no folder is passed over. A share that has
// no folder left loses its index, monitor configuration and files; where no folder is left at all, the related services
// are switched off. Under the folder lock. Throws Error 120 where the request is no array of strings, or one can be no
// path, 800 for a path whose share is gone: both before anything is changed.
QUARROX_API void FolderDelete(const Json::Value& path_list);

// The same for all folders of a share.
QUARROX_API void FolderDelete(const std::string& share_name);

// Queues a reindex of each path of an array; a share whose index is known to be unusable gets a new one instead. Clears
// the marks of what was missing. Paths in shares without folders are passed over. Takes no lock. Throws Error 120 where
// the request is no array of strings, or one can be no path; what is before it is then queued already.
QUARROX_API void FolderReindex(const Json::Value& path_list);

// Pauses one folder, but not the folders that lie in it: its files are not looked at until it is resumed, and searches
// go on to find what was indexed before. `resume_time` is when it ends, in seconds since the epoch; 0: without end.
// FolderResume has it compared with the disk; without a pause it does nothing. Under the folder lock. Both throw Error
// 902 where there is no folder at this path, 120 for a negative time and where the folder's share is paused.
QUARROX_API void FolderPause(const std::string& path, int64_t resume_time);
QUARROX_API void FolderResume(const std::string& path);

// Resumes the folders of a share whose pauses have come to their end, for the share's worker. Takes the folder lock
// where there are such. What fails there is logged only; throws what reading the list throws.
QUARROX_API void EndFolderPauses(const std::string& share_name);

// --- shares --------------------------------------------------------------------------------------------------------

// Each follows, or leads, a change of a share on the machine. None takes the folder lock: the caller holds it. An empty
// argument throws Error 120 "Missing ..." before anything else, and so does a text that can be no name or path and
// would be written down; a share that is asked for its place and is gone throws Error 800.

// The share `share_from` now bears the name `share_to`: its folders and its index follow, and the daemon is to look at
// the move of its directory. The folder list is saved before the engine is told.
QUARROX_API void ShareRename(const std::string& share_from, const std::string& share_to);

// The directory of a share moved from one full path to another. Does nothing for a share without folders.
QUARROX_API void ShareMigrate(const std::string& share_name, const std::string& path_from, const std::string& path_to);

// The recycle bin of a share was switched on or off: queues a reindex of it. Does nothing where the share's directory
// is missing. An empty name is no share's.
QUARROX_API void ShareCheckRecycle(const std::string& share_name);

// Stops indexing in a share: the daemon's worker, the notifications, the index. ShareResume is the way back, also for
// folders that were paused before. Both do nothing for a share without folders, and save the list last.
QUARROX_API void SharePause(const std::string& share_name);
QUARROX_API void ShareResume(const std::string& share_name);

// Makes the index of a share anew and queues a reindex of all of it. Does nothing for a share without folders, which
// must exist all the same.
QUARROX_API void ShareRebuild(const std::string& share_name);

// Removes the index and the files of a share, whose folders stay in the list. Does nothing for a share without folders,
// which must exist all the same.
QUARROX_API void ShareAutoClean(const std::string& share_name);

// Removes the files, the index and the folders of a share that need not exist any more; `share_path` is the full path
// of its directory. Where no folder is left at all, the related services are switched off.
QUARROX_API void ShareClearPaused(const std::string& share_name, const std::string& share_path);

// --- volumes -------------------------------------------------------------------------------------------------------

// A volume is named by its mount point, the directory that holds its shares' directories: a full path, whose slashes at
// the end do not count. Each operation takes the folder lock; before that it throws Error 120 "Missing mount point" for
// an empty argument.

// The volume is about to be taken away: pauses all of its shares that have folders, as SharePause does. Their folders
// are marked first, as paused and with the volume as "volume_to_be_clean", and the list is saved: so that after a
// failure VolumeResume and VolumeClean know them, and VolumePause may be called again. A share that cannot be looked at
// is logged and left alone.
QUARROX_API void VolumePause(const std::string& mount_point);

// The volume is back: resumes the shares whose folders VolumePause marked, as ShareResume does, and takes the mark
// away; the list is saved last. A share that is locked loses the mark only, and stays paused for ShareResume, when it
// is unlocked. One that cannot be opened is logged and stays as it is.
QUARROX_API void VolumeResume(const std::string& mount_point);

// The volume is gone for good: removes the files, the index and all folders of the shares whose folders VolumePause
// marked and that are still paused, as ShareClearPaused does. They need not exist any more.
QUARROX_API void VolumeClean(const std::string& mount_point);

// --- users and homes -----------------------------------------------------------------------------------------------

// What is kept about single users: a JSON object with a member for each. The values are kept as they are.
inline constexpr char kUserInfosPath[] = "/var/packages/Quarrox/etc/userinfos";

// A user now bears the name `user_to`: follows in the folders' owners and in the user information, where what another
// user of that name left is replaced. Each file is written only where something in it changed. Takes the folder lock.
// Throws Error 120 "Missing user_from" or "Missing user_to" before that, then 504 where the user information cannot be
// read, before anything is changed, and 505 where it cannot be written.
QUARROX_API void UserRename(const std::string& user_from, const std::string& user_to);

// A user is gone: takes the folders that were theirs out of the list, as FolderDelete does and with its lock, then
// their user information, with the lock taken again. Throws Error 120 "Missing user name", and as FolderDelete and
// UserRename do.
QUARROX_API void UserDelete(const std::string& user_name);

// The home service was switched on, or is about to be switched off: resumes or pauses the share "homes", as ShareResume
// and SharePause do. Takes the folder lock.
QUARROX_API void HomeEnable(bool enable);

// --- services, processing status and term suggestion ---------------------------------------------------------------

// Brings the related services in line with whether there is any folder: the SMB service's search, content extraction
// and the indexing daemon. What fails there is logged only. Throws what loading the folder list throws.
QUARROX_API void PrepareServices();

// Tells the notification daemon which directories of a share to watch: those of `folder_mgr`, saved or not. An empty
// list is told, too. Throws Error 502 where that fails, 800 where there is no such share. The caller holds the folder
// lock.
QUARROX_API void UpsertVEXONotifydCfg(const std::string& share_name, FolderMgr& folder_mgr);

// Takes a share's configuration back from the notification daemon. Throws as UpsertVEXONotifydCfg.
QUARROX_API void DeleteVEXONotifydCfg(const std::string& share_name);

// "finished" where no share that can be indexed has events left, else "paused" or "processing". A share that cannot be
// looked at is logged and passed over. Takes no lock.
QUARROX_API std::string GetIndexProcessingStatus();

// Makes the term suggestions anew of each share for which the engine says that they are missing or damaged. While that
// lasts, the file "term.sugg.running" stands in the share's database directory; one that cannot be made or removed is
// only logged. An engine that fails ends all of it, and leaves the file of the share in hand. Takes no lock.
QUARROX_API void UpdateTermSuggestion();

}  // namespace quarrox::fileindex
