// folder_churn SEED COUNT: adds and deletes /docs/SEED and /music/SEED, and folders that all such processes have in
// common, COUNT times and with pauses between. Says of each operation in one line what it was ("add", "delete"), which
// paths it was given, and the code of the Error that it ended with, 0 for none.
#include <unistd.h>

#include <cstdlib>
#include <iostream>
#include <random>

#include "common/error.h"
#include "fileindex/index_mgr.h"

namespace {

using quarrox::fileindex::Folder;

int CodeOf(bool add, const Json::Value& folders, const Json::Value& paths) {
  try {
    add ? quarrox::fileindex::FolderAdd(folders, false) : quarrox::fileindex::FolderDelete(paths);
  } catch (const quarrox::Error& error) {
    return error.code;
  }
  return 0;
}

}  // namespace

int main(int, char** argv) {
  std::mt19937 random(static_cast<unsigned int>(atol(argv[1])));
  for (long left = atol(argv[2]); left > 0; --left) {
    const bool add = random() % 2 == 0;
    Json::Value folders(Json::arrayValue);
    Json::Value paths(Json::arrayValue);
    for (size_t count = 1 + random() % 3; count > 0; --count) {
      const std::string places[] = {"/docs/a", "/music/a", std::string("/docs/") + argv[1],
                                    std::string("/music/") + argv[1]};
      paths.append(places[random() % 4]);
      folders.append(
          Folder(paths[paths.size() - 1].asString(), "", "", "", true, true, true, true, false, false).GetData());
    }
    const int code = CodeOf(add, folders, paths);
    std::cout << (add ? "add" : "delete");
    for (const Json::Value& path : paths) std::cout << " " << path.asString();
    std::cout << " " << code << std::endl;
    usleep(static_cast<useconds_t>(random() % 20000));
  }
}
