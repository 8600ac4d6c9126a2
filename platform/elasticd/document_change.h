// What a partial change makes of a document.
#pragma once

#include <json/json.h>

#include "fields.h"

namespace quarrox::elasticd {

// The fields of a document that change, as they are and as they will be, and all that are to be kept then.
struct FieldChange {
  Json::Value before = Json::Value(Json::objectValue);
  Json::Value after = Json::Value(Json::objectValue);
  KeptFields kept;
  Texts texts = Texts::kLeave;  // whether the texts are among what is to be written
};

// Applies the given fields to those of the document, null taking one away. `before_base` and `after_base` are its last
// path components.
FieldChange ChangeFields(const Store& store, DocumentId id, const PathFields& path_fields, const Json::Value& given,
                         const std::string& before_base, const std::string& after_base);

}  // namespace quarrox::elasticd
