// The schema of an index: what kind of value each field holds, and how it is searched.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include <json/json.h>

namespace quarrox::elasticd {

enum class FieldType { kString, kText, kInt, kDouble, kBool };

enum class Analyzer {
  kKeyword,           // the whole value is one term
  kStandard,          // "vexostandard": words folded for case and accents, CJK as n-grams
  kWhiteSpace,        // what stands between white space, as it is
  kWhiteSpaceEscaped  // the same, where a backslash makes the next byte part of the word
};

struct Field {
  std::string name;
  FieldType type = FieldType::kString;
  Analyzer analyzer = Analyzer::kStandard;
  bool required = false;
  bool stored = true;
  bool in_all = true;          // its words are found by searches in no particular field
  bool to_lower = false;       // before analysis: fold case and accents
  bool ngram = false;          // after analysis: every three letters of a word are a term
  bool list_ancestor = false;  // the value is a directory, and each directory above it is a term, too
  unsigned int number = 0;     // of the field in its mapping, in order of names; kUndeclared for others

  static constexpr unsigned int kUndeclared = ~0U;

  bool IsNumber() const { return type == FieldType::kInt || type == FieldType::kDouble || type == FieldType::kBool; }
};

// Immutable after it was made, so any thread may use it.
class Mapping {
 public:
  // Reads {"property_id", "default", "properties"}: the name of the identity, the attributes of fields that state none,
  // and what each declared field states otherwise. Throws Error 612 that says which member is wrong; not logged.
  explicit Mapping(const Json::Value& mappings);

  // The field by that name; one that is not declared has the default attributes and no number.
  Field Get(const std::string& name) const;

  // The declared field by that name; null where there is none.
  const Field* Find(std::string_view name) const;

  // The declared fields, in order of names.
  const std::vector<Field>& fields() const { return fields_; }

  // The field whose value is a document's identity.
  const std::string& identity() const { return identity_; }

 private:
  std::vector<Field> fields_;
  Field default_;
  std::string identity_;
};

}  // namespace quarrox::elasticd
