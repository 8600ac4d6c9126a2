#include "readable.h"

#include <charconv>
#include <cstdio>
#include <string_view>
#include <utility>
#include <vector>

#include "error_code.h"

namespace quarrox::elasticd {
namespace {

constexpr char kPrivilegeField[] = "VEXOMDPrivilege";  // the mode in octal digits
constexpr char kOwnerField[] = "VEXOMDOwnerUserID";
constexpr char kGroupField[] = "VEXOMDOwnerGroupID";
constexpr char kSizeField[] = "VEXOMDFSSize";
constexpr char kChangedField[] = "VEXOMDFSContentChangeDate";
constexpr char kIsDirectoryField[] = "VEXOMDIsDir";

// A million looks take some seconds. Searches of others in the same index wait meanwhile.
constexpr std::chrono::seconds kLongest(10);

// An access list shows its mask in the mode's bits for the group: where these let nobody read, neither does the list.
constexpr unsigned int kOthersMayRead = S_IRGRP | S_IROTH;

Field Needed(const Mapping& mapping, const char* name) {
  const Field* field = mapping.Find(name);
  if (field == nullptr) {
    throw Error(kBadArgument, std::string("The index does not keep ") + name + ", which tells who may read a file");
  }
  return *field;
}

}  // namespace

ReadableOnly::ReadableOnly(const Reader& reader, const Places& places, const Mapping& mapping, const Identity& user)
    : reader_(reader),
      places_(places),
      privilege_(Needed(mapping, kPrivilegeField)),
      owner_(Needed(mapping, kOwnerField)),
      group_(Needed(mapping, kGroupField)),
      size_(Needed(mapping, kSizeField)),
      changed_(Needed(mapping, kChangedField)),
      is_directory_(Needed(mapping, kIsDirectoryField)),
      user_(user.user),
      view_(user),
      end_(std::chrono::steady_clock::now() + kLongest) {}

// What other checks look at counts, and too many end a search early, which is told: so they look at what is readable
// only, wherever they stand. So do beginnings.
void ReadableOnly::RestrictParts(Query& query) {
  std::vector<Query*> left = {&query};
  while (!left.empty()) {
    Query& part = *left.back();
    left.pop_back();
    if (part.kind == Query::kCheck) {
      part.check = [this, then = std::move(part.check)](DocumentId id) { return WasReadable(id) && then(id); };
    }
    if (part.kind == Query::kBeginning) Expand(part);
    for (Query& inner : part.parts) left.push_back(&inner);
  }
}

// The first of the terms that readable documents have.
void ReadableOnly::Expand(Query& beginning) {
  Query terms{Query::kSame};
  reader_.ForEachTerm(beginning.term, [&](const std::string& term) {
    bool is_known = false;
    reader_.ForEachWith(term, [&](DocumentId id) { return !(is_known = WasReadable(id)); });
    if (!is_known) return true;
    cut_ = cut_ || terms.parts.size() == Reader::kMostBeginnings || left_ == 0;
    if (terms.parts.size() == Reader::kMostBeginnings || left_ == 0) return false;
    terms.parts.push_back(Query::Term(term));
    --left_;
    return true;
  });
  beginning = std::move(terms);
}

Query ReadableOnly::Restrict(Query query) {
  looked_.clear();
  left_ = Reader::kMostInQuery;
  cut_ = false;
  RestrictParts(query);
  Query look{Query::kCheck};
  look.check = [this](DocumentId id) { return WasReadable(id); };
  std::vector<Query> parts;
  parts.push_back(std::move(look));
  parts.push_back(Query::Of(Query::kFilter, {MayBeRead()}));
  parts.push_back(std::move(query));
  return Query::Of(Query::kAnd, std::move(parts));
}

// By the modes that documents have, of which there are few. This lets through too much and never too little, and saves
// looks at what is nobody's but its owner's.
Query ReadableOnly::MayBeRead() const {
  const std::string prefix = PrefixOf(privilege_);
  std::vector<Query> open;
  std::vector<Query> of_owner;
  reader_.ForEachTerm(prefix, [&](const std::string& term) {
    const std::string_view digits = std::string_view(term).substr(prefix.size());
    unsigned int mode = 0;
    std::from_chars(digits.data(), digits.data() + digits.size(), mode, 8);
    if ((mode & kOthersMayRead) != 0) {
      open.push_back(Query::Term(term));
    } else if ((mode & S_IRUSR) != 0) {
      of_owner.push_back(Query::Term(term));
    }
    return true;
  });
  open.push_back(Query::Of(Query::kAnd, {Query::Term(ExactTerm(owner_, std::to_string(user_))),
                                         Query::Of(Query::kOr, std::move(of_owner))}));
  return Query::Of(Query::kOr, std::move(open));
}

bool ReadableOnly::WasReadable(DocumentId id) {
  const auto known = looked_.find(id);
  if (known != looked_.end()) return known->second;
  return looked_[id] = IsReadable(id);
}

bool ReadableOnly::IsReadable(DocumentId id) {
  if (std::chrono::steady_clock::now() > end_) {
    throw Error(kBadQuery, "The search fits too much to look at in " + std::to_string(kLongest.count()) +
                               " seconds; more letters or words make it shorter");
  }
  const std::string packed = reader_.Place(id);
  if (packed.empty()) return false;
  const Place place = UnpackPlace(packed);
  const std::string directory = places_.DirectoryPath(place.directory);
  if (!MayEnter(place.directory, directory)) return false;
  const std::optional<struct stat> info = view_.Look(directory + '/' + place.name);
  return info && IsKnownAs(id, *info);
}

// Directories that are closed to a user often have many documents.
bool ReadableOnly::MayEnter(DirectoryId directory, const std::string& path) {
  const auto [known, is_new] = entered_.try_emplace(directory, false);
  if (is_new) known->second = view_.MayEnter(path);
  return known->second;
}

// A directory has no words but its name, and its size and time change with everything in it.
bool ReadableOnly::IsKnownAs(DocumentId id, const struct stat& info) const {
  if (!reader_.Has(id, ExactTerm(owner_, std::to_string(info.st_uid)))) return false;
  const bool is_directory = reader_.Number(id, is_directory_.number) == 1;
  if (is_directory != S_ISDIR(info.st_mode)) return false;
  if (is_directory) return true;
  char mode[8];
  snprintf(mode, sizeof(mode), "%03o", info.st_mode & 07777U);
  if (!reader_.Has(id, ExactTerm(privilege_, mode))) return false;
  if (!reader_.Has(id, ExactTerm(group_, std::to_string(info.st_gid)))) return false;
  return reader_.Number(id, size_.number) == static_cast<double>(info.st_size) &&
         reader_.Number(id, changed_.number) == static_cast<double>(info.st_mtim.tv_sec);
}

}  // namespace quarrox::elasticd
