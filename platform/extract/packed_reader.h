// The members of an archive, in its order.
#pragma once

#include <locale.h>

#include <cstdint>
#include <string>
#include <string_view>

#include "extract/pieces.h"

struct archive;
struct archive_entry;

namespace platform::extract {

// How much is unpacked of one archive, whatever its members promise. In bytes.
inline constexpr uint64_t kMostUnpacked = uint64_t{256} << 20;

// How many members of one archive are looked at.
inline constexpr int kMostMembers = 100'000;

// Reads by the descriptor, whose offset it moves. An archive in an archive is a member like any other. What is past a
// bound is as if it were not there. Throws std::runtime_error where the archive is none, or damaged. Not thread-safe.
class PackedReader {
 public:
  enum class Formats {
    kZip,
    kAll,  // a compressed file that is no archive is one member
  };

  PackedReader(const Source& source, Formats formats);
  ~PackedReader();
  PackedReader(const PackedReader&) = delete;
  PackedReader& operator=(const PackedReader&) = delete;

  // Goes on to the next member. False at the end.
  bool Next();

  // Of the member: its name as it stands in the archive, UTF-8 where the archive says what it is.
  const std::string& name() const { return name_; }
  std::string_view Piece();  // its content, at most kLongestContent bytes; empty at its end, and where it is encrypted
  bool IsWholeFile() const;  // it is all that a compressed file holds

  // Whether a member was encrypted so far, or the list of them is.
  bool HasEncrypted() const;

 private:
  void Open();
  bool Skip();
  bool IsUnpacked() const;  // the archive as a whole is compressed
  std::string_view ReadBlock();

  const Source& source_;
  archive* archive_;
  archive_entry* entry_ = nullptr;
  bool is_open_ = false;
  std::string name_;
  int members_ = 0;
  uint64_t unpacked_ = 0;  // of all members
  uint64_t content_ = 0;   // of this one
  locale_t locale_;        // what names are converted to
  locale_t former_locale_;
};

}  // namespace platform::extract
