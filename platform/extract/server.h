// Reads files for another process, one after the other.
#pragma once

#include <functional>
#include <string>

#include <json/json.h>

#include "extract/formats.h"

namespace platform::extract {

// How a file is looked into: what it is, and what reads that.
struct Ways {
  std::function<std::string(const Source&)> type_of;
  std::function<Extractor(const std::string& type)> extractor_of;
};

// A process that read so many files has earned its rest: libraries leak.
inline constexpr int kMostFiles = 10000;

// By the formats that are known; what none of them is may be text.
Extractor ReaderOf(const std::string& type);

// This process ends when the one ends that has started it. Before the sandbox.
int OpenParent();
void EndWith(int parent);

// Answers on a socket until its other end is closed, or the process has done enough for one. `features` is what keeps
// the process in. Never throws for what a file makes of it.
void Serve(int socket, const Json::Value& features, const Ways& ways, int most_files = kMostFiles);

}  // namespace platform::extract
