// Who may talk to a daemon.
#pragma once

#include <sys/types.h>

#include "common/export.h"

namespace quarrox {

// The rights of those who connect. The name service is asked once, when the object is made: a slow one must not hold up
// the clients. Thread-safe.
class QUARROX_API PeerRights {
 public:
  PeerRights();

  // Root, the daemon's own user, and the service user and the members of its group.
  bool MayCommand(int socket) const;

  // The service's group, -1 where the machine has none.
  gid_t group() const { return group_; }

 private:
  bool IsInGroup(int socket) const;

  uid_t user_;
  gid_t group_;
};

}  // namespace quarrox
