// status_save [once]: sets the flags of the share docs and takes them away in turn, until it is killed.
#include "fileindex/status_mgr.h"

int main(int argc, char**) {
  do {
    quarrox::fileindex::StatusMgr status;
    status.GetShareStatus("docs") == 0 ? status.SetShareStatus("docs", 3) : status.UnsetShareStatus("docs", 3);
  } while (argc == 1);
}
