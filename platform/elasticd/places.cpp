#include "places.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <algorithm>

namespace quarrox::elasticd {
namespace {

constexpr char kEntryKey = 'E';
constexpr char kBranchKey = 'D';
constexpr char kNumberKey[] = "N";

// A longer name has its beginning and its hash in the key. File systems give names of up to 255 bytes.
constexpr size_t kLongestNameInKey = 200;

// Directories that are remembered with their paths: more than anybody works in at a time.
constexpr size_t kRemembered = 4096;

// More components than the longest request has bytes for one path.
constexpr size_t kDeepest = size_t{1} << 20;

void AppendNumber(std::string& text, uint64_t number) {
  for (int shift = 56; shift >= 0; shift -= 8) text += static_cast<char>(number >> shift);
}

uint64_t TakeNumber(std::string_view& text) {
  if (text.size() < sizeof(uint64_t)) throw DamagedDatabase("a place is too short");
  uint64_t number = 0;
  for (size_t i = 0; i < sizeof(number); ++i) number = number << 8 | static_cast<unsigned char>(text[i]);
  text.remove_prefix(sizeof(number));
  return number;
}

// 7 bits a byte, the last one without the high bit.
void AppendShortNumber(std::string& text, uint64_t number) {
  for (; number >= 0x80; number >>= 7) text += static_cast<char>(number | 0x80);
  text += static_cast<char>(number);
}

uint64_t TakeShortNumber(std::string_view& text) {
  uint64_t number = 0;
  for (int shift = 0; shift < 64 && !text.empty(); shift += 7) {
    const auto byte = static_cast<unsigned char>(text.front());
    text.remove_prefix(1);
    number |= uint64_t{byte & 0x7fU} << shift;
    if (byte < 0x80) return number;
  }
  throw DamagedDatabase("a number of a place is cut short");
}

std::string EntryKeys(DirectoryId directory) {
  std::string key(1, kEntryKey);
  AppendNumber(key, directory);
  return key;
}

std::string EntryKey(DirectoryId directory, std::string_view name) {
  std::string key = EntryKeys(directory);
  if (name.size() <= kLongestNameInKey) return key.append(name);
  const XXH128_hash_t hash = XXH3_128bits(name.data(), name.size());
  key.append(name.substr(0, kLongestNameInKey + 1));  // one more than a name that is there as a whole
  AppendNumber(key, hash.high64);
  AppendNumber(key, hash.low64);
  return key;
}

bool IsHashed(const std::string& key) {
  return key.size() > 1 + sizeof(DirectoryId) + kLongestNameInKey;
}

std::string BranchKey(DirectoryId directory) {
  std::string key(1, kBranchKey);
  AppendNumber(key, directory);
  return key;
}

// A path's directory, without a slash at the end, and its last component.
struct Parts {
  std::string_view directory;
  std::string_view name;
};

Parts Split(std::string_view path) {
  const size_t slash = path.rfind('/');
  if (slash == std::string_view::npos || path.front() != '/') {
    throw Error(kBadArgument, "A document's path begins with a slash: '" + std::string(path) + "' does not");
  }
  return {path.substr(0, slash), path.substr(slash + 1)};
}

// Hands out the components of a directory's path from the top, until `take` returns false.
template <typename Take>
void ForEachComponent(std::string_view directory, Take take) {
  for (size_t begin = 1; begin <= directory.size();) {
    const size_t slash = std::min(directory.find('/', begin), directory.size());
    if (!take(directory.substr(begin, slash - begin))) return;
    begin = slash + 1;
  }
}

}  // namespace

std::string PackPlace(const Place& place) {
  std::string packed;
  AppendNumber(packed, place.directory);
  return packed += place.name;
}

Place UnpackPlace(const std::string& packed) {
  std::string_view rest = packed;
  const DirectoryId directory = TakeNumber(rest);
  return {directory, std::string(rest)};
}

std::optional<Places::Entry> Places::Look(DirectoryId directory, std::string_view name) const {
  const std::string key = EntryKey(directory, name);
  const std::string value = store_.Get(key);
  if (value.empty()) return std::nullopt;
  std::string_view rest = value;
  Entry entry;
  entry.document = static_cast<DocumentId>(TakeShortNumber(rest));
  entry.directory = TakeShortNumber(rest);
  entry.name = name;
  if (IsHashed(key) && rest != name) throw Error(kBadArgument, "two names have the same hash: " + entry.name);
  return entry;
}

Places::Branch Places::LookUp(DirectoryId directory) const {
  const std::string value = store_.Get(BranchKey(directory));
  std::string_view rest = value;
  Branch branch;
  branch.above = TakeNumber(rest);
  branch.name = rest;
  return branch;
}

void Places::ForEachEntry(DirectoryId directory, std::string_view begin,
                          const std::function<bool(const Entry&)>& take) const {
  const std::string keys = EntryKeys(directory);
  const std::string beginning = keys + std::string(begin.substr(0, kLongestNameInKey));
  store_.ForEachKey(beginning, [&](const std::string& key) {
    const std::string value = store_.Get(key);
    std::string_view rest = value;
    Entry entry;
    entry.document = static_cast<DocumentId>(TakeShortNumber(rest));
    entry.directory = TakeShortNumber(rest);
    entry.name = IsHashed(key) ? std::string(rest) : key.substr(keys.size());
    return entry.name.compare(0, begin.size(), begin) != 0 || take(entry);
  });
}

DirectoryId Places::FindDirectory(std::string_view path) const {
  DirectoryId directory = kRoot;
  ForEachComponent(path, [&](std::string_view name) {
    const std::optional<Entry> entry = Look(directory, name);
    directory = entry ? entry->directory : 0;
    return directory != 0;
  });
  return directory;
}

DocumentId Places::Find(std::string_view path) const {
  const Parts parts = Split(path);
  const DirectoryId directory = FindDirectory(parts.directory);
  if (directory == 0) return 0;
  const std::optional<Entry> entry = Look(directory, parts.name);
  return entry ? entry->document : 0;
}

// The path of each directory on the way up is remembered: neighbours ask for the same ones.
std::string Places::DirectoryPath(DirectoryId directory) const {
  if (paths_.size() > kRemembered) paths_.clear();
  std::vector<std::pair<DirectoryId, std::string>> way;  // from the bottom up
  std::string path;
  for (DirectoryId at = directory; at != kRoot;) {
    const auto known = paths_.find(at);
    if (known != paths_.end()) {
      path = known->second;
      break;
    }
    Branch branch = LookUp(at);
    way.emplace_back(at, std::move(branch.name));
    if (way.size() > kDeepest) throw DamagedDatabase("a directory has no end above it");
    at = branch.above;
  }
  for (auto step = way.rbegin(); step != way.rend(); ++step) {
    path += '/';
    path += step->second;
    paths_[step->first] = path;
  }
  return path;
}

std::string Places::PathOf(const Place& place) const {
  return DirectoryPath(place.directory) + '/' + place.name;
}

// A directory's entries are read before those below it, of which only the numbers are kept meanwhile.
void Places::ForEach(std::string_view prefix, const Take& take) const {
  const Parts parts = prefix.empty() ? Parts{} : Split(prefix);
  const DirectoryId top = FindDirectory(parts.directory);
  if (top == 0) return;
  struct Step {
    DirectoryId directory;
    std::string path;
  };
  std::vector<Step> left = {{top, std::string(parts.directory)}};
  std::string_view begin = parts.name;
  bool going = true;
  while (going && !left.empty()) {
    const Step step = std::move(left.back());
    left.pop_back();
    ForEachEntry(step.directory, begin, [&](const Entry& entry) {
      if (entry.directory != 0) left.push_back({entry.directory, step.path + '/' + entry.name});
      if (entry.document != 0) going = take(entry.document, step.path, entry.name);
      return going;
    });
    begin = {};
  }
}

void Places::Collect(std::vector<DirectoryId> left, std::unordered_set<DirectoryId>& tree) const {
  while (!left.empty()) {
    const DirectoryId directory = left.back();
    left.pop_back();
    if (!tree.insert(directory).second) throw DamagedDatabase("a directory is below itself");
    ForEachEntry(directory, {}, [&](const Entry& entry) {
      if (entry.directory != 0) left.push_back(entry.directory);
      return true;
    });
  }
}

std::unordered_set<DirectoryId> Places::Tree(DirectoryId top) const {
  std::unordered_set<DirectoryId> tree;
  Collect({top}, tree);
  return tree;
}

std::unordered_set<DirectoryId> Places::TreesIn(DirectoryId top, std::string_view begin) const {
  std::vector<DirectoryId> left;
  ForEachEntry(top, begin, [&](const Entry& entry) {
    if (entry.directory != 0) left.push_back(entry.directory);
    return true;
  });
  std::unordered_set<DirectoryId> tree;
  Collect(std::move(left), tree);
  return tree;
}

std::unordered_set<DirectoryId> Places::TreesThatFit(size_t count, bool from_root, const Fits& fits) const {
  std::unordered_map<DirectoryId, Branch> branches;
  store_.ForEachKey(std::string(1, kBranchKey), [&](const std::string& key) {
    std::string_view number = std::string_view(key).substr(1);
    const DirectoryId directory = TakeNumber(number);
    return branches.emplace(directory, LookUp(directory)).second;
  });
  const auto is_top = [&](DirectoryId directory) {
    for (size_t left = count; left > 0; --left) {
      const auto at = branches.find(directory);
      if (at == branches.end() || !fits(left - 1, at->second.name)) return false;
      directory = at->second.above;
    }
    return !from_root || directory == kRoot;
  };
  std::unordered_map<DirectoryId, bool> inside = {{kRoot, false}};
  std::unordered_set<DirectoryId> trees;
  for (const auto& [directory, branch] : branches) {
    std::vector<DirectoryId> way;  // up to the first directory of which it is known
    DirectoryId at = directory;
    for (; !inside.contains(at); at = branches.at(at).above) {
      if (way.size() > branches.size() || !branches.contains(at)) {
        throw DamagedDatabase("a directory has no end above it");
      }
      way.push_back(at);
    }
    bool is_inside = inside.at(at);
    for (auto step = way.rbegin(); step != way.rend(); ++step) {
      is_inside = inside[*step] = is_inside || is_top(*step);
      if (is_inside) trees.insert(*step);
    }
  }
  return trees;
}

DirectoryId PlaceWriter::FindDirectory(std::string_view path) const {
  const std::string key(path);
  const auto known = directories_.find(key);
  if (known != directories_.end()) return known->second;
  const DirectoryId directory = Places::FindDirectory(path);
  if (directories_.size() >= kRemembered) directories_.clear();
  if (directory != 0) directories_.emplace(key, directory);
  return directory;
}

void PlaceWriter::Write(DirectoryId directory, const Entry& entry) {
  const std::string key = EntryKey(directory, entry.name);
  std::string value;
  if (entry.document != 0 || entry.directory != 0) {
    AppendShortNumber(value, entry.document);
    AppendShortNumber(value, entry.directory);
    if (IsHashed(key)) value += entry.name;
  }
  writer_.Set(key, value);
}

DirectoryId PlaceWriter::MakeNumber() {
  const std::string value = writer_.Get(kNumberKey);
  std::string_view rest = value;
  const DirectoryId number = (value.empty() ? kRoot : TakeNumber(rest)) + 1;
  std::string next;
  AppendNumber(next, number);
  writer_.Set(kNumberKey, next);
  return number;
}

DirectoryId PlaceWriter::MakeDirectory(std::string_view path) {
  const DirectoryId known = FindDirectory(path);
  if (known != 0) return known;
  DirectoryId directory = kRoot;
  ForEachComponent(path, [&](std::string_view name) {
    Entry entry = Look(directory, name).value_or(Entry{0, 0, std::string(name)});
    if (entry.directory == 0) {
      entry.directory = MakeNumber();
      std::string branch;
      AppendNumber(branch, directory);
      writer_.Set(BranchKey(entry.directory), branch.append(name));
      Write(directory, entry);
    }
    directory = entry.directory;
    return true;
  });
  return directory;
}

Place PlaceWriter::Put(std::string_view path, DocumentId id) {
  const Parts parts = Split(path);
  const DirectoryId directory = MakeDirectory(parts.directory);
  Entry entry = Look(directory, parts.name).value_or(Entry{0, 0, std::string(parts.name)});
  entry.document = id;
  Write(directory, entry);
  return {directory, entry.name};
}

void PlaceWriter::Remove(std::string_view path) {
  const Parts parts = Split(path);
  const DirectoryId directory = FindDirectory(parts.directory);
  const std::optional<Entry> entry = Look(directory, parts.name);
  if (!entry) return;
  Write(directory, Entry{0, entry->directory, entry->name});
  if (entry->directory == 0) Prune(directory);
}

// Takes away directories in which nothing is any more, from the bottom up.
void PlaceWriter::Prune(DirectoryId directory) {
  while (directory != kRoot) {
    bool empty = true;
    ForEachEntry(directory, {}, [&](const Entry&) { return empty = false; });
    if (!empty) return;
    const Branch branch = LookUp(directory);
    const std::optional<Entry> entry = Look(branch.above, branch.name);
    if (!entry || entry->directory != directory) throw DamagedDatabase("a directory is not where it says");
    writer_.Set(BranchKey(directory), {});
    Write(branch.above, Entry{entry->document, 0, branch.name});
    directories_.clear();
    Forget();
    if (entry->document != 0) return;
    directory = branch.above;
  }
}

}  // namespace quarrox::elasticd
