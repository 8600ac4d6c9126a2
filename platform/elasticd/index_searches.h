// What an index keeps for its searches.
#pragma once

#include <string>

#include "index.h"

namespace quarrox::elasticd {

struct Searches {
  explicit Searches(const std::string& directory) : reader(directory), places(reader) {}

  void Refresh() {
    reader.Refresh();
    places.Forget();
  }

  Reader reader;
  Places places;
};

// Appends a value to an array that is being written.
void AppendElement(Answer& answer, bool& first, const Json::Value& value);

}  // namespace quarrox::elasticd
