// status_save [COUNT]: sets the flags of the share docs and takes them away in turn, COUNT times or until it is killed.
#include <cstdlib>

#include "fileindex/status_mgr.h"

int main(int argc, char** argv) {
  for (long left = argc > 1 ? std::atol(argv[1]) : -1; left != 0; --left) {
    quarrox::fileindex::StatusMgr status;
    status.GetShareStatus("docs") == 0 ? status.SetShareStatus("docs", 3) : status.UnsetShareStatus("docs", 3);
  }
}
