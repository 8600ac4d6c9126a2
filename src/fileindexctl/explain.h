// What is known of one path: where it belongs, what became of it, and who may find it.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "fileindex/folder.h"
#include "fileindex/index_failures.h"
#include "readers.h"
#include "refusal.h"

namespace quarrox::ctl {

// What became of a path that can be indexed. What cannot be told is absent.
struct Fate {
  std::optional<bool> is_pending = {};
  std::string share_state = {};  // what the work on its share waits for or is at, where the path is pending
  std::optional<bool> is_indexed = {};
  std::optional<int64_t> indexed_at = {};   // in seconds since the epoch
  std::optional<uint64_t> text_bytes = {};  // that the index has of its contents
  std::optional<fileindex::IndexFailure> failure = {};
  std::string paused = {};  // the folder that it is in, or its share, and until when, where that is paused
};

struct Explanation {
  std::string path = {};                           // on its volume
  std::string share = {};                          // empty where no share holds it
  std::string share_path = {};                     // as users see it; empty likewise
  std::shared_ptr<fileindex::Folder> folder = {};  // that governs it; null where none does
  bool is_folder_known = true;                     // false: whether one governs it cannot be told
  std::string file_type = {};                      // "directory", or a kind of files
  bool wants_contents = false;                     // what is in the file belongs into the index
  Refusal refusal = {};
  Fate fate = {};
  std::string remedy = {};  // what to do first where anything is not as people may expect; empty where all is
  Readers readers = {};
  std::string user = {};  // whose rights were asked for; empty for nobody's
  Access access = {};
};

// Takes a path as people type it: a full path, a share path, or a relative one. Throws as AccessAs for a user.
Explanation Explain(const std::string& typed, const std::string& user);

void PrintAsJson(const Explanation& explanation);
void PrintAsText(const Explanation& explanation);

}  // namespace quarrox::ctl
