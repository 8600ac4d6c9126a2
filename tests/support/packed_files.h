// Containers that tests make: archives, and the one that office programs wrote before 2007.
#pragma once

#include <archive.h>
#include <archive_entry.h>
#include <locale.h>

#include <cstdint>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace quarrox::support {

using Members = std::vector<std::pair<std::string, std::string>>;

// `format` and `filter` are libarchive's names of them; "none" is no filter.
inline std::string Pack(const char* format, const char* filter, const Members& members) {
  std::string bytes;
  const locale_t locale = newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);  // what names are converted from
  const locale_t former = uselocale(locale);
  archive* const packed = archive_write_new();
  archive_write_set_format_by_name(packed, format);
  if (filter != std::string_view("none")) archive_write_add_filter_by_name(packed, filter);
  archive_write_set_bytes_in_last_block(packed, 1);
  const auto append = [](archive*, void* to, const void* block, size_t size) {
    static_cast<std::string*>(to)->append(static_cast<const char*>(block), size);
    return static_cast<la_ssize_t>(size);
  };
  bool ok = archive_write_open2(packed, &bytes, nullptr, append, nullptr, nullptr) == ARCHIVE_OK;
  for (const auto& [name, content] : members) {
    archive_entry* const entry = archive_entry_new();
    archive_entry_set_pathname(entry, name.c_str());
    archive_entry_set_filetype(entry, AE_IFREG);
    archive_entry_set_perm(entry, 0644);
    archive_entry_set_size(entry, static_cast<la_int64_t>(content.size()));
    ok = ok && archive_write_header(packed, entry) >= ARCHIVE_WARN &&
         archive_write_data(packed, content.data(), content.size()) >= 0;
    archive_entry_free(entry);
  }
  ok = archive_write_close(packed) == ARCHIVE_OK && ok;
  archive_write_free(packed);
  uselocale(former);
  freelocale(locale);
  if (!ok) throw std::runtime_error("cannot pack");
  return bytes;
}

// A number in `size` bytes, the least first.
inline std::string Bytes(uint64_t number, size_t size) {
  std::string bytes;
  for (; bytes.size() < size; number >>= 8U) bytes.push_back(static_cast<char>(number));
  return bytes;
}

// Streams of at least 4096 bytes each, in sectors of 512.
inline std::string PackOle(const Members& streams) {
  constexpr size_t kSector = 512;
  constexpr uint64_t kEnd = 0xfffffffe;
  constexpr uint64_t kNone = 0xffffffff;
  std::string data;
  std::string table;
  const auto put = [&](std::string stream) {
    const size_t start = data.size() / kSector;
    stream.resize((stream.size() + kSector - 1) / kSector * kSector);
    data += stream;
    for (size_t i = start + 1; i < data.size() / kSector; ++i) table += Bytes(i, 4);
    table += Bytes(kEnd, 4);
    return start;
  };
  std::string directory;
  const auto add = [&](const std::string& name, uint64_t type, uint64_t child, uint64_t right, uint64_t start,
                       size_t size) {
    std::string wide;
    for (const char c : name) wide += Bytes(static_cast<unsigned char>(c), 2);
    wide.resize(64);
    directory += wide + Bytes(2 * name.size() + 2, 2) + Bytes(type, 1) + Bytes(1, 1) + Bytes(kNone, 4) +
                 Bytes(right, 4) + Bytes(child, 4) + std::string(36, '\0') + Bytes(start, 4) + Bytes(size, 8);
  };
  add("Root Entry", 5, 1, kNone, kEnd, 0);
  for (size_t i = 0; i < streams.size(); ++i) {
    std::string stream = streams[i].second;
    if (stream.size() < 4096) stream.resize(4096);
    const size_t size = stream.size();
    add(streams[i].first, 2, kNone, i + 1 < streams.size() ? i + 2 : kNone, put(std::move(stream)), size);
  }
  const size_t directory_start = put(directory);
  const size_t table_start = data.size() / kSector;
  table += Bytes(0xfffffffd, 4);
  table.resize(kSector, '\xff');
  std::string header = "\xd0\xcf\x11\xe0\xa1\xb1\x1a\xe1" + std::string(16, '\0') + Bytes(0x3e, 2) + Bytes(3, 2) +
                       Bytes(0xfffe, 2) + Bytes(9, 2) + Bytes(6, 2) + std::string(10, '\0') + Bytes(1, 4) +
                       Bytes(directory_start, 4) + Bytes(0, 4) + Bytes(4096, 4) + Bytes(kEnd, 4) + Bytes(0, 4) +
                       Bytes(kEnd, 4) + Bytes(0, 4) + Bytes(table_start, 4);
  header.resize(kSector, '\xff');
  return header + data + table;
}

}  // namespace quarrox::support
