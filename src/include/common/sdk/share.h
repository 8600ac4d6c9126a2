// One share of the machine, and the questions that the system asks about it.
#pragma once

#include <map>
#include <set>
#include <string>
#include <vector>

#include "common/export.h"
#include "common/mutex_lock.h"

struct VEXO_SHARE;  // the platform's record

namespace quarrox::sdk {

// The one mutex under which every call into the platform's share and user libraries is made, which are not thread-safe,
// and every switch of the effective user. It is the same object for all callers. Not recursive.
QUARROX_API Mutex& SDKMutex();

// Opens a share and owns its record; lives for one operation. What it answers from a cache stays as it was first asked:
// a change of the share is seen by a new object only.
//
// Each failing call of the platform is logged and thrown as Error 502 unless its comment says otherwise. Objects may be
// used from several threads at once, one object by one thread.
class QUARROX_API SDKShare {
 public:
  // Throws Error 800 with the name where there is no such share.
  explicit SDKShare(const std::string& share_name);
  ~SDKShare();
  SDKShare(const SDKShare&) = delete;
  SDKShare& operator=(const SDKShare&) = delete;

  // The names of all shares. Throws Error 121 where they cannot be listed.
  static std::set<std::string> Enum();

  // What is wrong in the machine's configuration of shares, for people: which file and line, what, and what to do.
  // Throws Error 121 where it cannot be looked at.
  static std::vector<std::string> ConfigProblems();

  const std::string& GetName() const { return name_; }
  std::string GetPath() const;       // the share's directory on its volume
  std::string GetDBName() const;     // the identifier of its index; cached
  std::string GetDBPath() const;     // the directory of its index; cached
  std::string GetQueuePath() const;  // the file that its events are written into; cached

  bool IsEnableRecycleBin() const;
  bool IsEncryption() const;  // encrypted on disk, locked or not
  bool IsLocked() const;      // encrypted, and its files cannot be read now
  bool IsReadOnly() const;

  // False for a share that is locked or read-only.
  bool CanBeIndexed() const;

  // Whether 100 MiB can still be written. False only where the volume or a quota is known to be full: where that cannot
  // be told, there is room. Never throws.
  bool IsSpaceEnough() const;

  // False also where that cannot be told. Never throws.
  bool IsHideUnReadable() const;

  // What an FTP service restricts in the share, in the platform's numbering; 0 is nothing.
  int GetFTPPrivilege() const;

  // What a user may do in the share, in the platform's numbering; negative where that cannot be told. Cached by user.
  int GetPrivilege(const std::string& user) const;

 private:
  VEXO_SHARE* share_info_ = nullptr;
  std::string name_;
  mutable std::map<std::string, int> privileges_;
  mutable std::string queue_path_;
  mutable std::string db_path_;
  mutable std::string db_name_;
};

}  // namespace quarrox::sdk
