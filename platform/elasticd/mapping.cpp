#include "mapping.h"

#include <algorithm>
#include <iterator>

#include "common/json.h"
#include "error_code.h"

namespace quarrox::elasticd {
namespace {

// A term tells its field by one byte, of which the upper values have other uses.
constexpr size_t kMostFields = 100;

template <typename Value>
struct Named {
  const char* name;
  Value value;
};

constexpr Named<FieldType> kTypes[] = {{"string", FieldType::kString},
                                       {"text", FieldType::kText},
                                       {"int", FieldType::kInt},
                                       {"double", FieldType::kDouble},
                                       {"bool", FieldType::kBool}};

constexpr Named<Analyzer> kAnalyzers[] = {{"keyword", Analyzer::kKeyword},
                                          {"vexostandard", Analyzer::kStandard},
                                          {"white space", Analyzer::kWhiteSpace},
                                          {"white space escaped", Analyzer::kWhiteSpaceEscaped}};

constexpr Named<bool Field::*> kSwitches[] = {
    {"required", &Field::required}, {"stored", &Field::stored}, {"_all", &Field::in_all}};

constexpr Named<bool Field::*> kPreprocesses[] = {
    {"tolower", &Field::to_lower}, {"ngram", &Field::ngram}, {"list_ancestor", &Field::list_ancestor}};

template <typename Value, size_t kSize>
const Named<Value>* FindNamed(const Named<Value> (&table)[kSize], const std::string& name) {
  const auto* found =
      std::find_if(std::begin(table), std::end(table), [&](const auto& row) { return name == row.name; });
  return found == std::end(table) ? nullptr : found;
}

template <typename Value, size_t kSize>
std::string NamesOf(const Named<Value> (&table)[kSize]) {
  std::string names;
  for (const auto& row : table) names.append(names.empty() ? "\"" : ", \"").append(row.name).append("\"");
  return names;
}

[[noreturn]] void Refuse(const std::string& member, const Json::Value& value, const std::string& wanted) {
  constexpr size_t kShown = 200;
  std::string text = toString(value);
  if (text.size() > kShown) text = text.substr(0, kShown) + "...";
  throw Error(kBadArgument, "mappings: " + member + " is " + text + ", but must be " + wanted);
}

template <typename Value, size_t kSize>
Value Choose(const Named<Value> (&table)[kSize], const std::string& member, const Json::Value& value) {
  const auto* row = value.isString() ? FindNamed(table, value.asString()) : nullptr;
  if (row == nullptr) Refuse(member, value, "one of " + NamesOf(table));
  return row->value;
}

void ReadPreprocess(Field& field, const std::string& member, const Json::Value& value) {
  if (!value.isArray()) Refuse(member, value, "an array of " + NamesOf(kPreprocesses));
  for (const auto& row : kPreprocesses) field.*row.value = false;
  for (const Json::Value& step : value) field.*Choose(kPreprocesses, member, step) = true;
}

// Changes of `field` what `attributes` state. `where` is the member that holds them.
void ReadAttributes(Field& field, const std::string& where, const Json::Value& attributes) {
  if (!attributes.isObject()) Refuse(where, attributes, "an object");
  for (auto it = attributes.begin(); it != attributes.end(); ++it) {
    const std::string attribute = it.name();
    const std::string member = std::string(where).append(".").append(attribute);
    if (attribute == "type") {
      field.type = Choose(kTypes, member, *it);
    } else if (attribute == "analyzer") {
      field.analyzer = Choose(kAnalyzers, member, *it);
    } else if (attribute == "preprocess") {
      ReadPreprocess(field, member, *it);
    } else if (const auto* row = FindNamed(kSwitches, attribute)) {
      if (!it->isBool()) Refuse(member, *it, "true or false");
      field.*row->value = it->asBool();
    } else {
      Refuse(member, *it, "left out: no field has such an attribute");
    }
  }
}

}  // namespace

Mapping::Mapping(const Json::Value& mappings) {
  if (!mappings.isObject()) Refuse("the whole", mappings, "an object");
  const Json::Value& identity = mappings["property_id"];
  if (!identity.isString() || identity.asString().empty()) Refuse("property_id", identity, "the name of a field");
  identity_ = identity.asString();

  default_.number = Field::kUndeclared;
  if (const Json::Value& attributes = mappings["default"]; !attributes.isNull()) {
    ReadAttributes(default_, "default", attributes);
  }

  const Json::Value& properties = mappings["properties"];
  if (properties.isNull()) return;
  if (!properties.isObject()) Refuse("properties", properties, "an object");
  if (properties.size() > kMostFields) {
    throw Error(kBadArgument, "mappings: properties has " + std::to_string(properties.size()) +
                                  " fields, but must have no more than " + std::to_string(kMostFields));
  }
  for (auto it = properties.begin(); it != properties.end(); ++it) {
    Field field = default_;
    field.name = it.name();
    ReadAttributes(field, "properties." + field.name, *it);
    fields_.push_back(std::move(field));
  }
  std::sort(fields_.begin(), fields_.end(), [](const Field& a, const Field& b) { return a.name < b.name; });
  for (unsigned int i = 0; i < fields_.size(); ++i) fields_[i].number = i;
}

const Field* Mapping::Find(std::string_view name) const {
  const auto found = std::lower_bound(fields_.begin(), fields_.end(), name,
                                      [](const Field& field, std::string_view wanted) { return field.name < wanted; });
  return found != fields_.end() && found->name == name ? &*found : nullptr;
}

Field Mapping::Get(const std::string& name) const {
  if (const Field* declared = Find(name)) return *declared;
  Field field = default_;
  field.name = name;
  return field;
}

}  // namespace quarrox::elasticd
