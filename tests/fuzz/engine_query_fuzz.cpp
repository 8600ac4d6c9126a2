// Any query, over an index that holds a little of everything: an answer or a clear error.
#include <cstdint>
#include <cstdlib>
#include <string>

#include "common/json.h"
#include "support/fuzz_engine.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using quarrox::support::FuzzEngine;
  static FuzzEngine engine;
  const std::string text(reinterpret_cast<const char*>(data), size);
  Json::Value qsl;
  qsl["query_string"]["query"] = text;
  engine.Search(qsl);
  if (quarrox::fromString(qsl, text)) engine.Search(qsl);
  return 0;
}
