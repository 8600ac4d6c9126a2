// folder_churn SEED SECONDS: adds and deletes /docs/SEED and /music/SEED, and folders that all such processes have in
// common, for so long and with pauses between. Says of each operation in one line when it began and ended, in
// nanoseconds, what it was ("add", "delete"), which paths it was given, and the code of the Error that it ended with, 0
// for none.
#include <unistd.h>

#include <chrono>
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

int64_t Now() {
  return std::chrono::nanoseconds(std::chrono::steady_clock::now().time_since_epoch()).count();
}

}  // namespace

int main(int, char** argv) {
  std::mt19937 random(static_cast<unsigned int>(atol(argv[1])));
  for (const int64_t end = Now() + atol(argv[2]) * 1000000000; Now() < end;) {
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
    const int64_t start = Now();
    const int code = CodeOf(add, folders, paths);
    std::cout << start << " " << Now() << (add ? " add" : " delete");
    for (const Json::Value& path : paths) std::cout << " " << path.asString();
    std::cout << " " << code << std::endl;
    usleep(static_cast<useconds_t>(random() % 20000));
  }
}
