#include "document_change.h"

namespace quarrox::elasticd {
namespace {

// The texts take part only where one of them is given, or a field that is not among the others.
bool ConcernsTexts(const KeptFields& kept, const KeptFields& given, const Json::Value& all) {
  if (!given.texts.empty()) return true;
  for (auto field = all.begin(); field != all.end(); ++field) {
    if (field->isNull() && !kept.plain.isMember(field.name())) return true;
  }
  for (auto field = given.plain.begin(); field != given.plain.end(); ++field) {
    if (!kept.plain.isMember(field.name())) return true;
  }
  return false;
}

Json::Value Find(const KeptFields& kept, const std::string& name) {
  if (kept.plain.isMember(name)) return kept.plain[name];
  return kept.texts.isObject() && kept.texts.isMember(name) ? kept.texts[name] : Json::Value();
}

}  // namespace

FieldChange ChangeFields(const Store& store, DocumentId id, const PathFields& path_fields, const Json::Value& given,
                         const std::string& before_base, const std::string& after_base) {
  FieldChange change;
  const KeptFields parted = PartFields(given, path_fields);
  change.kept = LoadFields(store, id, Texts::kLeave);
  if (change.kept.plain.isNull()) throw DamagedDatabase("a document has no fields");
  if (ConcernsTexts(change.kept, parted, given)) {
    change.kept = LoadFields(store, id, Texts::kBoth);
    change.texts = Texts::kBoth;
  }
  if (before_base != after_base) {
    const std::string name = path_fields.name_field();
    change.before[name] = before_base;
    change.after[name] = after_base;
  }
  for (auto field = given.begin(); field != given.end(); ++field) {
    const std::string name = field.name();
    if (path_fields.Has(name)) continue;
    const Json::Value before = Find(change.kept, name);
    if (before == *field) continue;
    change.before[name] = before;
    change.after[name] = *field;
    change.kept.plain.removeMember(name);
    if (change.kept.texts.isObject()) change.kept.texts.removeMember(name);
    if (parted.plain.isMember(name)) change.kept.plain[name] = *field;
    if (parted.texts.isObject() && parted.texts.isMember(name)) change.kept.texts[name] = *field;
  }
  return change;
}

}  // namespace quarrox::elasticd
