#include "tree_count.h"

#include <dirent.h>
#include <sys/stat.h>

#include <memory>
#include <utility>
#include <vector>

#include "common/file.h"

namespace quarrox::fileindexd {

uint64_t CountTree(const fileindex::IndexScope& scope, const std::string& directory,
                   const OperationHandler::CheckPoint& check_point) {
  uint64_t count = 0;
  std::vector<std::string> pending = {directory};
  while (!pending.empty()) {
    check_point();
    const std::string path = std::move(pending.back());
    pending.pop_back();
    if (scope.IsPaused(path)) continue;
    ++count;
    const std::unique_ptr<DIR, int (*)(DIR*)> open_directory(opendir(path.c_str()), closedir);
    if (!open_directory) continue;
    while (const dirent* entry = readdir(open_directory.get())) {
      const std::string name = entry->d_name;
      if (name == "." || name == ".." ||
          !fileindex::IndexScope::AcceptsEntry(name, static_cast<mode_t>(DTTOIF(entry->d_type))))
        continue;
      if (IsDirentDir(*entry, path)) {
        pending.emplace_back(path).append("/").append(name);
      } else {
        ++count;
      }
    }
  }
  return count;
}

}  // namespace quarrox::fileindexd
