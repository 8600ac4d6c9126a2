// Makes the index say what the disk says, at a path and below it.
#pragma once

#include <cstdint>
#include <string>
#include <unordered_map>

#include "index_handler_scope.h"
#include "index_handler_writer.h"
#include "operation_handler.h"

namespace quarrox::fileindexd {

// The engine is asked for all documents of the subtree, and then the subtree is walked: what is new or differs in size
// or time of change is indexed, where only the attributes changed these are refreshed, and what was not met is deleted.
// A directory that cannot be read is left as it is in the index. Links are not followed.
//
// It holds about 200 bytes for each document of the subtree, which the file's path makes up most of. One object
// compares one subtree, once.
class IndexComparison {
 public:
  // Files of a kind in `forced` are indexed also where they do not differ.
  IndexComparison(const IndexScope& scope, IndexWriter& writer, const OperationHandler::CheckPoint& check_point,
                  const Kinds& forced)
      : scope_(scope), writer_(writer), check_point_(check_point), forced_(forced) {}

  // The share's own directory stands for the whole index. Throws what the engine and the check point throw, and Error
  // 502 where the share's directory goes away meanwhile; nothing is deleted then.
  void Run(const std::string& path);

 private:
  // What the index says of a file.
  struct Document {
    int64_t size = -1;
    int64_t changed = -1;  // seconds since the epoch, as the next
    int64_t attributes_changed = -1;
    bool is_directory = false;
  };

  void Load(const char* kind, const std::string& text);
  void Remember(const Json::Value& hit);
  void Walk(const std::string& start);
  void ReadDirectory(const std::string& directory, std::vector<std::string>& pending);
  void Visit(const std::string& path, const struct stat& info);
  void DeleteWhatWasNotMet();

  const IndexScope& scope_;
  IndexWriter& writer_;
  const OperationHandler::CheckPoint& check_point_;
  const Kinds forced_;
  std::unordered_map<std::string, Document> documents_;  // those that were not met yet
  PathSet unread_;                                       // directories and files that cannot be looked at
};

}  // namespace quarrox::fileindexd
