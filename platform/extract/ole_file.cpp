#include "extract/ole_file.h"

#include <algorithm>
#include <stdexcept>

namespace platform::extract {
namespace {

constexpr uint64_t kLastSector = 0xfffffffa;  // what is above has another meaning
constexpr uint64_t kSmallSector = 64;

// More than any program writes: of table lists as a number, of the others in bytes.
constexpr int kMostLists = 100;
constexpr uint64_t kLongestDirectory = 1 << 20;
constexpr uint64_t kLongestSmall = 16 << 20;

// Where numbers are in the header and in an entry of the directory; most have four bytes.
constexpr uint64_t kSectorShift = 30, kDirectory = 48, kSmallBelow = 56, kSmallTable = 60, kNextList = 68, kList = 76;
constexpr uint64_t kHeader = 512, kEntry = 128, kStart = 116, kSize = 120;

uint64_t Number(std::string_view bytes, uint64_t at) {
  return LittleEndian(bytes, at, 4);
}

}  // namespace

uint64_t LittleEndian(std::string_view bytes, uint64_t at, size_t size) {
  if (at > bytes.size() || size > bytes.size() - at) throw std::runtime_error("cut short");
  uint64_t number = 0;
  for (size_t i = size; i-- > 0;) number = number << 8U | static_cast<unsigned char>(bytes[at + i]);
  return number;
}

OleFile::OleFile(std::string_view bytes) : bytes_(bytes) {
  const uint64_t shift = LittleEndian(bytes, kSectorShift, 2);
  if (!bytes.starts_with("\xd0\xcf\x11\xe0") || (shift != 9 && shift != 12)) throw std::runtime_error("no OLE file");
  sector_size_ = uint64_t{1} << shift;
  tables_ = bytes.substr(kList, kHeader - kList);
  uint64_t following = Number(bytes, kNextList);
  for (int left = kMostLists; following < kLastSector && left > 0; --left) {
    const std::string_view list = Sector(following);
    following = Number(list, sector_size_ - 4);
    tables_ += list.substr(0, sector_size_ - 4);
  }
  directory_ = Chain(Number(bytes, kDirectory), kLongestDirectory);
}

std::string_view OleFile::Sector(uint64_t number) const {
  return bytes_.substr(std::min<uint64_t>((number + 1) * sector_size_, bytes_.size()), sector_size_);
}

std::string OleFile::Chain(uint64_t start, uint64_t limit) const {
  std::string chain;
  const uint64_t in_table = sector_size_ / 4;
  for (uint64_t sector = start; sector < kLastSector && chain.size() < limit;) {
    if (Sector(sector).empty()) throw std::runtime_error("OLE file with a sector past its end");
    chain += Sector(sector).substr(0, limit - chain.size());
    sector = Number(Sector(Number(tables_, 4 * (sector / in_table))), 4 * (sector % in_table));
  }
  return chain;
}

// Names are in UTF-16 and end with a zero.
std::string_view OleFile::Entry(std::string_view name) const {
  std::string wide;
  for (const char c : name) wide.append({c, '\0'});
  wide.append(2, '\0');
  for (uint64_t at = 0; at + kEntry <= directory_.size(); at += kEntry) {
    const std::string_view entry = std::string_view(directory_).substr(at, kEntry);
    if (entry.starts_with(wide)) return entry;
  }
  return {};
}

std::string OleFile::Read(std::string_view name, uint64_t limit) const {
  const std::string_view entry = Entry(name);
  if (entry.empty()) return {};
  const uint64_t size = Number(entry, kSize);
  const uint64_t wanted = std::min(limit, size);
  uint64_t sector = Number(entry, kStart);
  if (size >= Number(bytes_, kSmallBelow)) return Chain(sector, wanted);
  // The short ones are in the first entry's stream, in sectors of their own.
  const std::string table = Chain(Number(bytes_, kSmallTable), kLongestDirectory);
  const std::string all = Chain(Number(directory_, kStart), std::min(Number(directory_, kSize), kLongestSmall));
  std::string stream;
  for (; stream.size() < wanted && kSmallSector * sector < all.size(); sector = Number(table, 4 * sector)) {
    stream += all.substr(kSmallSector * sector, std::min(kSmallSector, wanted - stream.size()));
  }
  return stream;
}

}  // namespace platform::extract
