// One indexed folder: which folder of which share, what is indexed in it, and who sees it.
#pragma once

#include <cstdint>
#include <string>
#include <unordered_map>

#include <json/json.h>

#include "common/export.h"

namespace quarrox::fileindex {

// The group that stands for all groups; no folder may bear it. Exact.
inline constexpr char kAll[] = "all";

// GetFullPath for many share paths: opens each share once and remembers where it lies, for as long as the object lives.
// A share that is not there is asked for again each time. Not thread-safe.
class QUARROX_API ShareVolumes {
 public:
  // Throws as GetFullPath does.
  std::string GetFullPath(const std::string& share_path);

 private:
  std::unordered_map<std::string, std::string> volumes_;  // by share
};

// A record of the folder list. A path is a share path here: "/", the share's name, and the rest.
//
// The share and the full path are computed when they are first asked for, and kept; this is why questions of one object
// belong to one thread.
class QUARROX_API Folder {
 public:
  // Reads the object that GetData makes. "path", "name" and the four kinds are required; what else is missing, or of
  // the wrong type, is empty or false. Throws Error 120 for a member that is required, and as Validate.
  explicit Folder(const Json::Value& data);

  // The fourth text is not stored: group and volume mark are empty. Throws as Validate.
  Folder(const std::string& path, const std::string& name, const std::string& owner, const std::string& not_stored,
         bool document, bool audio, bool video, bool photo, bool privileged, bool paused);

  const std::string& GetPath() const { return path_; }
  const std::string& GetName() const { return name_; }
  const std::string& GetOwner() const { return owner_; }                         // empty for none
  const std::string& GetGroup() const { return group_; }                         // empty for none
  const std::string& GetVolumeToBeClean() const { return volume_to_be_clean_; }  // empty for none
  bool HasDocument() const { return document_; }                                 // kinds of files that are indexed
  bool HasAudio() const { return audio_; }
  bool HasVideo() const { return video_; }
  bool HasPhoto() const { return photo_; }
  bool IsPrivileged() const { return privileged_; }
  bool IsPaused() const { return paused_; }

  // All that is stored, as it stands in the folder list and in answers.
  Json::Value GetData() const;

  // The four kinds only.
  Json::Value GetIndexCfg() const;

  // Throws Error 120 where the group is kAll.
  void Validate() const;

  // The share that the path names. Throws Error 120 where the path does not begin with "/".
  std::string GetShare() const;

  // Where the folder lies on its volume. Throws as fileindex::GetFullPath. The second form opens no share that
  // `volumes` knows.
  std::string GetFullPath() const;
  std::string GetFullPath(ShareVolumes& volumes) const;

  void SetOwner(const std::string& owner) { owner_ = owner; }
  void SetVolumeToBeClean(const std::string& volume) { volume_to_be_clean_ = volume; }
  void SetPaused(bool paused) { paused_ = paused; }

  // Moves the record to another share: the first component of its path becomes `new_share`. A full path that was
  // asked for before stays as it was; who needs the new one makes a new record of GetData.
  void SetShare(const std::string& new_share);

  // How often SetShare was called on any record in this process: who keeps records by path or share looks here whether
  // they may have changed. Thread-safe.
  static uint64_t ShareChanges();

  // GetData, with each extra that the array names ("status" is the one there is) as a member of "additional". Throws
  // Error 120 for what is no array, no string, or no such extra, and what the extra throws.
  Json::Value GetDataWithAdditional(const Json::Value& additionals) const;

  // Whether files of the folder wait to be indexed. Throws where its share or that share's queue cannot be looked at.
  bool IsIndexing() const;

  // Sets "text" in `out` to "error" (with "desc"), "need_reindex", "processing", "paused" or "finished". Throws as
  // IsIndexing, and where the state of indexing cannot be read.
  void GetStatus(Json::Value& out) const;

 private:
  std::string path_;
  std::string name_;
  std::string owner_;
  std::string group_;
  std::string volume_to_be_clean_;
  bool document_ = false;
  bool audio_ = false;
  bool video_ = false;
  bool photo_ = false;
  bool privileged_ = false;
  bool paused_ = false;
  mutable std::string share_;      // empty until it is asked for
  mutable std::string full_path_;  // empty until it is asked for
};

}  // namespace quarrox::fileindex
