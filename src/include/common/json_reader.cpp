#include "common/json_reader.h"

#include <charconv>
#include <cstdint>
#include <cstring>
#include <memory>
#include <system_error>
#include <utility>
#include <vector>

#ifdef __SSE2__
#define RAPIDJSON_SSE2
#endif
#include <rapidjson/reader.h>

namespace quarrox {
namespace {

// Deeper nesting is left to jsoncpp, which draws its own line at 1000.
constexpr size_t kPlainDepth = 500;

// Below this no string or key is longer than jsoncpp's values can hold.
constexpr size_t kPlainSize = size_t{1} << 30;

// The parser looks at whole aligned blocks of 16 bytes, also at the one that holds the end.
constexpr size_t kBlock = 16;

Json::CharReaderBuilder MakeReaderBuilder() {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["strictRoot"] = false;
  builder["rejectDupKeys"] = false;
  return builder;
}

// Makes a value of the parser's events. Members of maps stay where they are, so pointers to them are good while more
// are added.
class ValueBuilder {
 public:
  explicit ValueBuilder(Json::Value& root) : slot_(&root) { containers_.reserve(16); }

  // What the parser calls.
  bool Null() { return Put(Json::Value()); }
  bool Bool(bool value) { return Put(Json::Value(value)); }
  bool String(const char* text, unsigned int size, bool) { return Put(Json::Value(text, text + size)); }
  bool StartObject() { return Open(Json::objectValue); }
  bool StartArray() { return Open(Json::arrayValue); }
  bool EndObject(unsigned int) { return Close(); }
  bool EndArray(unsigned int) { return Close(); }
  bool Key(const char* text, unsigned int size, bool) {
    slot_ = containers_.back()->demand(text, text + size);
    return true;
  }

  // A whole number is signed where that holds it, else unsigned, else a double like those with a fraction or exponent.
  bool RawNumber(const char* text, unsigned int size, bool) {
    const char* const end = text + size;
    int64_t whole = 0;
    if (IsAll(std::from_chars(text, end, whole), end)) return Put(Json::Value(Json::Int64{whole}));
    uint64_t large = 0;
    if (IsAll(std::from_chars(text, end, large), end)) return Put(Json::Value(Json::UInt64{large}));
    double real = 0;
    return IsAll(std::from_chars(text, end, real), end) && Put(Json::Value(real));
  }

  // Numbers come as text.
  bool Int(int) { return false; }
  bool Uint(unsigned int) { return false; }
  bool Int64(int64_t) { return false; }
  bool Uint64(uint64_t) { return false; }
  bool Double(double) { return false; }

 private:
  static bool IsAll(const std::from_chars_result& result, const char* end) {
    return result.ec == std::errc() && result.ptr == end;
  }

  // The value of the key that came before, or else one more element.
  Json::Value& Place(Json::Value&& value) {
    if (slot_ == nullptr) return containers_.back()->append(std::move(value));
    Json::Value& place = *std::exchange(slot_, nullptr);
    place = std::move(value);
    return place;
  }

  bool Put(Json::Value&& value) {
    Place(std::move(value));
    return true;
  }

  bool Open(Json::ValueType type) {
    if (containers_.size() == kPlainDepth) return false;
    containers_.push_back(&Place(Json::Value(type)));
    return true;
  }

  bool Close() {
    containers_.pop_back();
    return true;
  }

  std::vector<Json::Value*> containers_;  // that are open, the outermost first
  Json::Value* slot_;                     // where the next value goes, null for the end of an array
};

}  // namespace

bool ReadPlainJson(Json::Value& value, const std::string& text) {
  if (text.size() > kPlainSize) return false;
  const std::unique_ptr<char[]> copy(new char[text.size() + 2 * kBlock]);  // strings are unescaped where they stand
  memcpy(copy.get(), text.data(), text.size());
  memset(copy.get() + text.size(), 0, 2 * kBlock);
  rapidjson::InsituStringStream stream(copy.get());
  Json::Value read;
  ValueBuilder builder(read);
  // The parser's loop without recursion counts pointers from null. Its recursion ends where the builder says so.
  constexpr unsigned int kFlags = rapidjson::kParseInsituFlag | rapidjson::kParseNumbersAsStringsFlag;
  rapidjson::Reader reader;
  if (reader.Parse<kFlags>(stream, builder).IsError()) return false;
  if (stream.Tell() != text.size()) return false;  // a zero byte is no end
  value.swap(read);
  return true;
}

bool ReadJsonByRules(Json::Value& value, const std::string& text) {
  if (text.find('\0') != std::string::npos) return false;  // jsoncpp takes it for the end of the text
  static const Json::CharReaderBuilder builder = MakeReaderBuilder();
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  try {
    return reader->parse(text.data(), text.data() + text.size(), &value, nullptr);
  } catch (const Json::Exception&) {
    return false;  // nested past the limit
  }
}

}  // namespace quarrox
