#include "fields.h"

#define XXH_INLINE_ALL
#include <xxhash.h>
#include <zstd.h>

#include <algorithm>
#include <cstring>
#include <memory>

#include "common/json.h"

namespace quarrox::elasticd {
namespace {

// The library's own names for the parts of a path.
constexpr char kDirectoryField[] = "VEXOMDParent";
constexpr char kNameField[] = "VEXOMDFSName";

// Strings from this size on are kept beside the others.
constexpr size_t kLongText = 512;

// The fastest one: the higher ones save a few percent of disk for twice the time and more.
constexpr int kCompressionLevel = 1;

// What the frame of a damaged file may promise at most; requests are shorter.
constexpr unsigned long long kLongestTexts = 512ULL << 20;

std::string Key(DocumentId id, char part) {
  std::string key(1, 'X');
  for (int shift = 24; shift >= 0; shift -= 8) key += static_cast<char>(id >> shift);
  return key += part;
}

std::string FieldsKey(DocumentId id) {
  return Key(id, '0');
}

std::string TextsKey(DocumentId id) {
  return Key(id, '1');
}

struct FreeCompressor {
  void operator()(ZSTD_CCtx* context) const { ZSTD_freeCCtx(context); }
};

// With a checksum, so that a flipped bit is noticed.
ZSTD_CCtx* Compressor() {
  thread_local const std::unique_ptr<ZSTD_CCtx, FreeCompressor> context = [] {
    std::unique_ptr<ZSTD_CCtx, FreeCompressor> made(ZSTD_createCCtx());
    if (!made) throw std::bad_alloc();
    ZSTD_CCtx_setParameter(made.get(), ZSTD_c_compressionLevel, kCompressionLevel);
    ZSTD_CCtx_setParameter(made.get(), ZSTD_c_checksumFlag, 1);
    return made;
  }();
  return context.get();
}

std::string Compress(const std::string& text) {
  std::string result(ZSTD_compressBound(text.size()), '\0');
  const size_t size = ZSTD_compress2(Compressor(), result.data(), result.size(), text.data(), text.size());
  if (ZSTD_isError(size) != 0)
    throw Error(kInputOutput, std::string("a text was not compressed: ") + ZSTD_getErrorName(size));
  result.resize(size);
  return result;
}

std::string Decompress(const std::string& packed) {
  const unsigned long long promised = ZSTD_getFrameContentSize(packed.data(), packed.size());
  if (promised > kLongestTexts) throw DamagedDatabase("a compressed text has no size");
  std::string text(promised, '\0');
  const size_t size = ZSTD_decompress(text.data(), text.size(), packed.data(), packed.size());
  if (size != text.size()) throw DamagedDatabase("a compressed text does not unpack");
  return text;
}

// A hash of the text before it: what is not compressed has no other checksum.
std::string Seal(std::string text) {
  const XXH64_hash_t hash = XXH3_64bits(text.data(), text.size());
  return text.append(reinterpret_cast<const char*>(&hash), sizeof(hash));
}

std::string Unseal(std::string sealed) {
  XXH64_hash_t hash = 0;
  if (sealed.size() < sizeof(hash)) throw DamagedDatabase("the fields of a document are cut short");
  memcpy(&hash, sealed.data() + sealed.size() - sizeof(hash), sizeof(hash));
  sealed.resize(sealed.size() - sizeof(hash));
  if (hash != XXH3_64bits(sealed.data(), sealed.size()))
    throw DamagedDatabase("the fields of a document are not what was written");
  return sealed;
}

// Stands behind the fields of a document: four bytes of a time and this mark, which ends no JSON. Documents that were
// made before times were kept have neither.
constexpr char kTimeMark = '\x01';
constexpr size_t kTimeSize = sizeof(uint32_t) + sizeof(kTimeMark);

std::string PackTime(int64_t time) {
  const auto seconds = static_cast<uint32_t>(time);
  return std::string(reinterpret_cast<const char*>(&seconds), sizeof(seconds)) + kTimeMark;
}

// Cuts it off.
int64_t UnpackTime(std::string& fields) {
  uint32_t seconds = 0;
  if (fields.size() < kTimeSize || fields.back() != kTimeMark) return 0;
  memcpy(&seconds, fields.data() + fields.size() - kTimeSize, sizeof(seconds));
  fields.resize(fields.size() - kTimeSize);
  return seconds;
}

Json::Value Parse(const std::string& text) {
  Json::Value parsed;
  if (!fromString(parsed, text) || !parsed.isObject()) throw DamagedDatabase("the fields of a document do not parse");
  return parsed;
}

// A line of JSON with the length of each text, in order of names, and then the texts as they are: escaping them costs
// more than compressing them. What is no text stands in the line itself.
std::string JoinTexts(const Json::Value& texts) {
  Json::Value lengths(Json::objectValue);
  std::string joined;
  for (auto text = texts.begin(); text != texts.end(); ++text) {
    const char* begin = nullptr;
    const char* end = nullptr;
    if (text->getString(&begin, &end)) {
      lengths[text.name()] = Json::UInt64{static_cast<size_t>(end - begin)};
      joined.append(begin, end);
    } else {
      lengths[text.name()] = *text;
    }
  }
  return toString(lengths) + '\n' + joined;
}

Json::Value PartTexts(const std::string& joined) {
  const size_t line = joined.find('\n');
  if (line == std::string::npos) throw DamagedDatabase("the texts of a document have no beginning");
  Json::Value texts = Parse(joined.substr(0, line));
  size_t at = line + 1;
  for (Json::Value& text : texts) {
    if (!text.isUInt64()) continue;
    const size_t length = text.asUInt64();
    if (length > joined.size() - at) throw DamagedDatabase("the texts of a document are cut short");
    text = Json::Value(joined.data() + at, joined.data() + at + length);
    at += length;
  }
  return texts;
}

bool IsLong(const Json::Value& value) {
  const char* begin = nullptr;
  const char* end = nullptr;
  return value.isArray() || (value.getString(&begin, &end) && static_cast<size_t>(end - begin) >= kLongText);
}

// The name is among the texts, too.
uint64_t TextBytes(const KeptFields& kept, const Mapping& mapping) {
  uint64_t bytes = 0;
  for (const Json::Value* part : {&kept.texts, &kept.plain}) {
    for (auto field = part->begin(); field != part->end(); ++field) {
      const Field known = mapping.Get(field.name());
      const char* begin = nullptr;
      const char* end = nullptr;
      const bool counts = known.type == FieldType::kText && !known.ngram && field->getString(&begin, &end);
      if (counts) bytes += static_cast<uint64_t>(end - begin);
    }
  }
  return bytes;
}

Json::Value ShowAll(const Store& store, const Mapping& mapping, const PathFields& path_fields, DocumentId id,
                    const std::string& directory, const std::string& base) {
  KeptFields kept = LoadFields(store, id, Texts::kBoth);
  if (kept.plain.isNull()) return kept.plain;
  Json::Value shown(Json::objectValue);
  for (Json::Value* part : {&kept.plain, &kept.texts}) {
    for (auto field = part->begin(); field != part->end(); ++field) {
      if (mapping.Get(field.name()).stored) shown[field.name()].swap(*field);
    }
  }
  for (const Field& field : mapping.fields()) {
    if (path_fields.Has(field.name) && field.stored) shown[field.name] = path_fields.Value(field.name, directory, base);
  }
  return shown;
}

}  // namespace

PathFields::PathFields(const Mapping& mapping) : identity_(mapping.identity()) {
  unindexed_ = {identity_, kDirectoryField};
  for (const Field& field : mapping.fields()) {
    if (field.list_ancestor) unindexed_.push_back(field.name);
  }
}

PathFields::Kind PathFields::KindOf(const std::string& name) const {
  if (name == identity_) return Kind::kPath;
  if (name == kDirectoryField) return Kind::kDirectory;
  if (name == kNameField) return Kind::kName;
  return std::find(unindexed_.begin(), unindexed_.end(), name) == unindexed_.end() ? Kind::kNone : Kind::kAncestor;
}

std::string PathFields::name_field() {
  return kNameField;
}

bool PathFields::Has(const std::string& name) const {
  return KindOf(name) != Kind::kNone;
}

Json::Value PathFields::Value(const std::string& name, const std::string& directory, const std::string& base) const {
  const Kind kind = KindOf(name);
  if (kind == Kind::kName) return base;
  if (kind == Kind::kPath) return directory + '/' + base;
  return directory.empty() ? "/" : directory;
}

KeptFields PartFields(Json::Value fields, const PathFields& path_fields) {
  KeptFields parted{Json::Value(Json::objectValue), Json::Value()};
  for (auto field = fields.begin(); field != fields.end(); ++field) {
    const std::string name = field.name();
    if (!path_fields.Has(name) && !field->isNull()) (IsLong(*field) ? parted.texts : parted.plain)[name].swap(*field);
  }
  return parted;
}

void SaveFields(Writer& writer, DocumentId id, const KeptFields& fields, Texts texts) {
  writer.Set(FieldsKey(id), Seal(toString(fields.plain) + (fields.indexed == 0 ? "" : PackTime(fields.indexed))));
  if (texts == Texts::kLeave) return;
  writer.Set(TextsKey(id), fields.texts.empty() ? std::string() : Compress(JoinTexts(fields.texts)));
}

KeptFields LoadFields(const Store& store, DocumentId id, Texts texts) {
  KeptFields fields;
  const std::string plain = store.Get(FieldsKey(id));
  if (plain.empty()) return fields;
  std::string text = Unseal(plain);
  fields.indexed = UnpackTime(text);
  fields.plain = Parse(text);
  const std::string packed = texts == Texts::kBoth ? store.Get(TextsKey(id)) : std::string();
  if (!packed.empty()) fields.texts = PartTexts(Decompress(packed));
  return fields;
}

void ForEachText(const Store& store, const Mapping& mapping, DocumentId id,
                 const std::function<bool(std::string_view text)>& take) {
  const KeptFields kept = LoadFields(store, id, Texts::kBoth);
  const auto take_one = [&](const Json::Value& value) {
    const char* begin = nullptr;
    const char* end = nullptr;
    return !value.getString(&begin, &end) || take({begin, static_cast<size_t>(end - begin)});
  };
  for (const Json::Value* part : {&kept.texts, &kept.plain}) {
    for (auto field = part->begin(); field != part->end(); ++field) {
      const Field known = mapping.Get(field.name());
      if (!known.in_all || known.IsNumber()) continue;
      if (!field->isArray() && !take_one(*field)) return;
      for (auto text = field->begin(); field->isArray() && text != field->end(); ++text) {
        if (!take_one(*text)) return;
      }
    }
  }
}

void DropFields(Writer& writer, DocumentId id) {
  writer.Set(FieldsKey(id), {});
  writer.Set(TextsKey(id), {});
}

Json::Value ShowFields(const Store& store, const Mapping& mapping, const PathFields& path_fields, DocumentId id,
                       const std::string& directory, const std::string& base, const std::vector<std::string>& names) {
  if (names.empty()) return ShowAll(store, mapping, path_fields, id, directory, base);
  Json::Value shown(Json::objectValue);
  KeptFields kept;  // read when they are asked for
  for (const std::string& name : names) {
    if (path_fields.Has(name)) {
      shown[name] = path_fields.Value(name, directory, base);
      continue;
    }
    const bool is_told = name == kIndexedField || name == kTextBytesField;
    if (!is_told && !mapping.Get(name).stored) continue;
    if (kept.plain.isNull()) kept = LoadFields(store, id, Texts::kLeave);
    if (kept.plain.isNull()) return Json::Value();
    if (name == kIndexedField) {
      if (kept.indexed != 0) shown[name] = Json::Int64{kept.indexed};
      continue;
    }
    if (!kept.plain.isMember(name) && kept.texts.isNull()) {
      kept = LoadFields(store, id, Texts::kBoth);
      if (kept.texts.isNull()) kept.texts = Json::Value(Json::objectValue);
    }
    if (name == kTextBytesField) {
      shown[name] = Json::UInt64{TextBytes(kept, mapping)};
      continue;
    }
    const Json::Value& part = kept.plain.isMember(name) ? kept.plain : kept.texts;
    if (part.isMember(name)) shown[name] = part[name];
  }
  return shown;
}

}  // namespace quarrox::elasticd
