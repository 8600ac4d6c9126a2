// Any text as a request to an engine, whose indexes stay in a directory of its own: one answer that is JSON.
#include <cstdint>
#include <string>

#include "common/json.h"
#include "support/fuzz_engine.h"

namespace {

// Whatever directory a request names, it gets one of the test's own.
void Confine(Json::Value& value, const std::string& directory) {
  if (value.isObject() && value.isMember("path")) value["path"] = directory + "/other";
  if (!value.isObject() && !value.isArray()) return;
  for (Json::Value& member : value) Confine(member, directory);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static quarrox::support::FuzzEngine engine;
  std::string text(reinterpret_cast<const char*>(data), size);
  Json::Value request;
  if (quarrox::fromString(request, text)) {
    Confine(request, engine.directory());
    text = quarrox::toString(request);
  }
  engine.Ask(text);
  return 0;
}
