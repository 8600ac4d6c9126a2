#include "query.h"

#include <iterator>

namespace quarrox::elasticd {

std::vector<std::function<bool(DocumentId)>> Query::TakeChecks() {
  std::vector<std::function<bool(DocumentId)>> checks;
  std::vector<Query*> left = {this};
  while (!left.empty()) {
    Query& query = *left.back();
    left.pop_back();
    if (query.kind == kAnd) {
      for (Query& part : query.parts) {
        if (part.kind == kCheck) checks.push_back(std::move(part.check));
      }
      std::erase_if(query.parts, [](const Query& part) { return part.kind == kCheck; });
      for (Query& part : query.parts) left.push_back(&part);
    } else if ((query.kind == kAndNot || query.kind == kAndPerhaps) && !query.parts.empty()) {
      left.push_back(&query.parts.front());
    }
  }
  return checks;
}

}  // namespace quarrox::elasticd
