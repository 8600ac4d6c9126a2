// The fields of a document as they are kept: what is given back when a document is loaded.
#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include <json/json.h>

#include "database.h"
#include "mapping.h"
#include "places.h"

namespace quarrox::elasticd {

// Fields that follow from a document's identity: the path itself, its directory, its last component, and the
// directories above it. They are not kept but made from the document's place, so that a move changes none of them.
class PathFields {
 public:
  explicit PathFields(const Mapping& mapping);

  // Whether the field follows from the identity.
  bool Has(const std::string& name) const;

  // The one that holds the last component.
  static std::string name_field();

  // The value of such a field.
  Json::Value Value(const std::string& name, const std::string& directory, const std::string& base) const;

  // Those whose terms are not kept with the document either: searches for them look at places.
  const std::vector<std::string>& unindexed() const { return unindexed_; }

  // What stands in the whole path, and what in the path of a directory above it.
  enum class Kind { kNone, kPath, kDirectory, kName, kAncestor };
  Kind KindOf(const std::string& name) const;

 private:
  std::string identity_;
  std::vector<std::string> unindexed_;
};

// The fields of a document, parted as they are kept: long texts lie beside the others, compressed, and are only read
// where they are asked for. Null where there are none or where they were not read.
struct KeptFields {
  Json::Value plain;
  Json::Value texts;
  int64_t indexed = 0;  // when the document was last made as a whole, in seconds since the epoch; 0: not known
};

// What can be asked for as if it were a field, though no document has it: KeptFields::indexed, where it is known; and
// how many bytes of text there are besides the names.
inline constexpr char kIndexedField[] = "@indexed";
inline constexpr char kTextBytesField[] = "@text_bytes";

// Parts the fields, without those that follow from the identity and those that are null.
KeptFields PartFields(Json::Value fields, const PathFields& path_fields);

// Writes both parts; the texts only where `texts` says so.
enum class Texts { kBoth, kLeave };
void SaveFields(Writer& writer, DocumentId id, const KeptFields& fields, Texts texts);
KeptFields LoadFields(const Store& store, DocumentId id, Texts texts);
void DropFields(Writer& writer, DocumentId id);

// Hands out the texts of a document that searches in no particular field look at, until `take` returns false.
void ForEachText(const Store& store, const Mapping& mapping, DocumentId id,
                 const std::function<bool(std::string_view text)>& take);

// What people are handed out of a document: the fields by these names that it has and the mapping stores; every stored
// one where `names` is empty. Null where there is no such document any more.
Json::Value ShowFields(const Store& store, const Mapping& mapping, const PathFields& path_fields, DocumentId id,
                       const std::string& directory, const std::string& base, const std::vector<std::string>& names);

}  // namespace quarrox::elasticd
