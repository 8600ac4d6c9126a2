// folder_save [COUNT]: saves the folder list with the folder /docs and without it in turn, COUNT times or until it is
// killed.
#include <cstdlib>

#include "fileindex/folder_mgr.h"

int main(int argc, char** argv) {
  for (long left = argc > 1 ? std::atol(argv[1]) : -1; left != 0; --left) {
    quarrox::fileindex::FolderMgr folders;
    auto docs = std::make_shared<quarrox::fileindex::Folder>("/docs", "", "", "", true, true, true, true, false, false);
    folders.HasFolder("/docs") ? folders.DeleteByShare("docs") : folders.Upsert(docs, docs);
    folders.Save();
  }
}
