// What disk and index disagree on, at a path and below it.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include <json/json.h>

#include "common/export.h"
#include "fileindex/index_scope.h"

struct dirent;

namespace quarrox::fileindex {

struct ListedDocument;

// Who is told of differences, one by one as they are found. Paths are full ones. What a method throws ends the
// comparison.
class QUARROX_API IndexDifferences {
 public:
  virtual ~IndexDifferences() = default;

  // Comes before each difference, request and directory, and otherwise every fraction of a millisecond.
  virtual void CheckPoint() = 0;

  virtual void Missing(const std::string& path) = 0;  // the index does not have it
  virtual void Changed(const std::string& path) = 0;  // its type, size or time of change is another, or it is forced
  virtual void AttributesChanged(const std::string& path, bool is_directory) = 0;  // nothing else did
  virtual void Gone(const std::vector<std::string>& paths) = 0;                    // what only the index has, some
  virtual void Unreadable(const std::string& path, int error) = 0;  // nothing can be said of it, nor of what is below
};

// The engine is asked for all documents of the subtree, and then the subtree is walked. Links are not followed.
//
// It holds about 200 bytes for each document of the subtree, which the file's path makes up most of. One object
// compares one subtree, once.
class QUARROX_API IndexComparison {
 public:
  // What counts as changed also where it does not differ. Empty: nothing.
  using IsForced = std::function<bool(const std::string& path, const struct stat& info)>;

  // kThorough looks at the name fields of each document, its mode and owners, too, which the engine has to read for it:
  // what disagrees there is told as a change of attributes. It asks for no more of a directory.
  enum class Care { kUsual, kThorough };

  IndexComparison(const IndexScope& scope, IndexDifferences& differences, IsForced is_forced, Care care = Care::kUsual)
      : scope_(scope), differences_(differences), is_forced_(std::move(is_forced)), care_(care) {}

  // The share's own directory stands for the whole index. What is paused is left out. Throws what the engine and
  // `differences` throw, and Error 502 where the share's directory goes away meanwhile; nothing is told to be gone
  // then.
  void Run(const std::string& path);

  // Those that the index has.
  uint64_t documents() const { return loaded_; }

 private:
  // What the index says of a file.
  struct Document {
    int64_t size = -1;
    int64_t changed = -1;  // seconds since the epoch, as the next
    int64_t attributes_changed = -1;
    bool is_directory = false;
    bool has_its_names = true;
    std::string access = {};  // the mode and the owners, where they are looked at
  };

  // By name. Walks and listings go directory by directory, so that each is looked up once and its names lie together.
  using Directory = std::unordered_map<std::string, Document>;

  Directory& DirectoryOf(const std::string& path);
  void Load(const char* kind, const std::string& text);
  size_t LoadPage(const Json::Value& request);
  void Remember(const Json::Value& hit);
  void Remember(ListedDocument&& listed);
  void Walk(const std::string& start);
  void ReadDirectory(const std::string& directory, std::vector<std::string>& pending);
  void ReadEntry(int directory_fd, const dirent& entry, const std::string& path, std::vector<std::string>& pending);
  bool IsSameFile(const Document& document, const std::string& path, const struct stat& info) const;
  bool HasSameAttributes(const Document& document, const struct stat& info) const;
  void Visit(const std::string& path, const struct stat& info);
  void LeaveUnread(const std::string& path, int error);
  void TellWhatWasNotMet();

  const IndexScope& scope_;
  IndexDifferences& differences_;
  const IsForced is_forced_;
  const Care care_;
  uint64_t loaded_ = 0;
  uint64_t met_ = 0;                                      // that do not differ
  std::unordered_map<std::string, Directory> documents_;  // those that were not met yet, by directory
  std::string last_directory_;
  Directory* last_documents_ = nullptr;  // of it
  PathSet unread_;                       // directories and files that cannot be looked at
};

}  // namespace quarrox::fileindex
