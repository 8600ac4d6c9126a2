// JSON is read and written like jsoncpp does, whatever the text and whatever the value.
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "common/json.h"
#include "common/json_reader.h"
#include "support/json_reference.h"

namespace {

using quarrox::support::WriteByJsonCpp;

void CheckWriting(const Json::Value& value) {
  if (quarrox::toString(value) != WriteByJsonCpp(value)) abort();
}

// Values that no text gives: any bytes as a string, any bits as a number, elements that were never assigned.
Json::Value MakeValue(const std::string& bytes) {
  uint64_t bits = 0;
  memcpy(&bits, bytes.data(), std::min(bytes.size(), sizeof(bits)));
  double real;
  memcpy(&real, &bits, sizeof(real));
  Json::Value array(Json::arrayValue);
  array[static_cast<Json::ArrayIndex>(bits % 8)] = real;
  array[8U][bytes] = bytes;
  array[9U] = Json::UInt64{bits};
  array[11U] = static_cast<Json::Int64>(bits);
  return array;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  Json::Value ours;
  Json::Value theirs;
  const bool accepted = quarrox::fromString(ours, text);
  if (accepted != quarrox::ReadJsonByRules(theirs, text)) abort();
  if (accepted) {
    // A zero equals one of the other sign, but is written otherwise.
    if (ours != theirs || WriteByJsonCpp(ours) != WriteByJsonCpp(theirs)) abort();
    CheckWriting(ours);
  }
  CheckWriting(MakeValue(text));
  return 0;
}
