// What comes of a queue: by the real tree, and by one as one would write it first, against which the real one is held.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

namespace quarrox::support {

struct Folded {
  std::vector<std::string> operations;  // handed out, in order, as an OP is printed
  size_t entries = 0;                   // looked at for it
  size_t lines = 0;
  size_t bad_lines = 0;
  bool operator==(const Folded&) const = default;
};

// The text of a queue through an OPTree.
Folded Fold(const std::string& queue);

// The same by one list of operations that know their paths, every step a look at all of them.
Folded FoldPlainly(const std::string& queue);

}  // namespace quarrox::support
