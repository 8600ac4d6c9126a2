// Words that are written almost like another one.
#pragma once

#include <array>
#include <string>
#include <vector>

#include "database.h"

namespace quarrox::elasticd {

// The words among a reader's suggestions that become `word` by one change of a letter, and by two: one letter more,
// less or another one, or two that change places. Looks at all of them. Two changes of a word of four letters make
// anything of it, so there is only one. Throws what the reader throws.
std::array<std::vector<std::string>, 2> FindNear(const Reader& reader, const std::string& word);

}  // namespace quarrox::elasticd
