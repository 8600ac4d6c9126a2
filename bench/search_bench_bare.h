// Xapian in a loop of its own: what indexing, renaming and searching texts costs where nobody asks for it over a
// socket, keeps identities or recovers from anything. The yardstick of the engine.
#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include "measure.h"

namespace quarrox::bench {

enum class BareTerms {
  kOurs,   // of the engine's analysis, for the library's own schema
  kXapian  // of Xapian's term generator, for the text and the name
};

constexpr size_t kCommitEvery = 1000;

// Indexes every file into a new database in `directory`, in a process of its own: its terms, the numbers that the file
// system knows, its path as the document's data, its text compressed beside it; committed after every so many.
Cost IndexBare(const std::vector<std::string>& paths, BareTerms terms, size_t commit_every,
               const std::string& directory);

// Renames the directory `old_top` in such a database of `paths` with our terms, in a process of its own, as who keeps a
// document's place inside it must: reads and analyzes each file again and replaces its document. What is compressed
// beside it stays. The files are still at their old paths.
Cost RenameBare(const std::vector<std::string>& paths, const std::string& old_top, const std::string& new_top,
                const std::string& directory);

// A database that is open for searches. Not thread-safe.
class BareSearch {
 public:
  explicit BareSearch(const std::string& directory);
  ~BareSearch();
  BareSearch(const BareSearch&) = delete;
  BareSearch& operator=(const BareSearch&) = delete;

  // Finds what has all terms and reads the paths of the ten best; returns how many these are.
  size_t FirstPage(const std::vector<std::string>& terms) const;

  // The words of plain letters in a document's text as terms with the number of documents that have them, in order of
  // bytes. Documents count from 1.
  struct Word {
    std::string text;
    std::string term;
    double share;  // of all documents
  };
  std::vector<Word> Words(unsigned int document) const;

 private:
  struct Impl;
  std::unique_ptr<Impl> impl_;
};

// How many a page of hits has.
constexpr unsigned int kPage = 10;

}  // namespace quarrox::bench
