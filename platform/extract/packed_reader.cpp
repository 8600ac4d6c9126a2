#include "extract/packed_reader.h"

#include <archive.h>
#include <archive_entry.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <stdexcept>
#include <system_error>

namespace platform::extract {
namespace {

using Support = int (*)(archive*);

constexpr Support kFilters[] = {
    archive_read_support_filter_gzip, archive_read_support_filter_bzip2,    archive_read_support_filter_xz,
    archive_read_support_filter_lzma, archive_read_support_filter_zstd,     archive_read_support_filter_lz4,
    archive_read_support_filter_lzip, archive_read_support_filter_compress,
};
constexpr Support kFormats[] = {
    archive_read_support_format_zip,     archive_read_support_format_tar,  archive_read_support_format_7zip,
    archive_read_support_format_rar,     archive_read_support_format_rar5, archive_read_support_format_cpio,
    archive_read_support_format_iso9660, archive_read_support_format_cab,  archive_read_support_format_lha,
    archive_read_support_format_raw,
};

[[noreturn]] void Throw(archive* packed) {
  const char* const reason = archive_error_string(packed);
  const int error = archive_errno(packed);
  if (error == EIO || error == ESTALE || error == ETIMEDOUT) {
    throw std::system_error(error, std::generic_category(), "read");
  }
  throw std::runtime_error(reason == nullptr ? "damaged archive" : reason);
}

}  // namespace

PackedReader::PackedReader(const Source& source, Formats formats)
    : source_(source), archive_(archive_read_new()), locale_(newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr)) {
  former_locale_ = uselocale(locale_);
  if (formats == Formats::kZip) {
    archive_read_support_format_zip(archive_);
  } else {
    for (const Support support : kFilters) support(archive_);
    for (const Support support : kFormats) support(archive_);
  }
}

PackedReader::~PackedReader() {
  archive_read_free(archive_);
  uselocale(former_locale_);
  if (locale_ != nullptr) freelocale(locale_);
}

void PackedReader::Open() {
  if (lseek(source_.fd, 0, SEEK_SET) != 0) throw std::system_error(errno, std::generic_category(), "lseek");
  if (archive_read_open_fd(archive_, source_.fd, kPiece) != ARCHIVE_OK) Throw(archive_);
  is_open_ = true;
}

bool PackedReader::Next() {
  if (!is_open_) Open();
  if (++members_ > kMostMembers || (members_ > 1 && !Skip())) return false;
  content_ = 0;
  const int result = archive_read_next_header(archive_, &entry_);
  if (result == ARCHIVE_EOF) return false;
  if (result < ARCHIVE_WARN || (IsWholeFile() && !IsUnpacked())) Throw(archive_);
  const char* const name = archive_entry_pathname(entry_);
  name_ = name == nullptr ? "" : name;
  return true;
}

// Leaves the member as it would be left anyway, but not for longer than there is something to be unpacked.
bool PackedReader::Skip() {
  if (IsUnpacked()) {
    while (unpacked_ < kMostUnpacked) {
      if (ReadBlock().empty()) return true;
    }
    return false;
  }
  const int format = archive_format(archive_);
  if (format != ARCHIVE_FORMAT_7ZIP && format != ARCHIVE_FORMAT_RAR_V5) return true;  // it is a seek
  const auto size = static_cast<uint64_t>(archive_entry_size(entry_));
  if (size > kMostUnpacked - std::min(unpacked_, kMostUnpacked)) return false;
  unpacked_ += size;
  return true;
}

std::string_view PackedReader::ReadBlock() {
  const void* block = nullptr;
  size_t size = 0;
  la_int64_t offset = 0;
  int result = ARCHIVE_OK;
  while (size == 0 && result >= ARCHIVE_WARN && result != ARCHIVE_EOF) {
    result = archive_read_data_block(archive_, &block, &size, &offset);
  }
  if (result == ARCHIVE_EOF) return {};
  if (result < ARCHIVE_WARN) Throw(archive_);
  unpacked_ += size;
  content_ += size;
  return {static_cast<const char*>(block), size};
}

std::string_view PackedReader::Piece() {
  if (content_ >= kLongestContent || unpacked_ >= kMostUnpacked || archive_entry_is_encrypted(entry_) != 0) return {};
  return ReadBlock();
}

bool PackedReader::HasEncrypted() const {
  return is_open_ && archive_read_has_encrypted_entries(archive_) > 0;  // what is not open has no format to ask
}

bool PackedReader::IsUnpacked() const {
  return archive_filter_count(archive_) > 1;  // the last one is the file itself
}

bool PackedReader::IsWholeFile() const {
  return archive_format(archive_) == ARCHIVE_FORMAT_RAW;
}

}  // namespace platform::extract
