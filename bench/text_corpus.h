// A directory of real texts, as this machine has them: sources, documentation, scripts.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace quarrox::bench {

struct TextCorpus {
  std::vector<std::string> paths;  // in the order in which they were made
  uint64_t bytes = 0;
};

// Fills `directory`, which is made, with so many files of UTF-8 text without zero bytes, each of 1 byte to 4 MiB. They
// keep their names and what stands above them, packed ones are unpacked. Where this machine has fewer, they are taken
// again below another directory with a line added, so that no two are alike. The same machine gives the same files.
TextCorpus MakeTextCorpus(const std::string& directory, size_t files);

}  // namespace quarrox::bench
