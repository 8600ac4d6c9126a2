// Who may talk to a daemon.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

#include "common/export.h"

namespace quarrox {

// What the kernel decides by who may do what.
struct Identity {
  uid_t user = 0;
  gid_t group = 0;
  std::vector<gid_t> groups = {};  // the supplementary ones
};

// Who has connected to a socket, as they were then; nothing where that cannot be told. Thread-safe.
QUARROX_API std::optional<Identity> IdentityOfPeer(int socket);

// The user with a login name, in all the groups that the name service knows; nothing where there is none. Asks the name
// service, which may take long. Thread-safe.
QUARROX_API std::optional<Identity> FindIdentity(const std::string& name);

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
  uid_t user_;
  gid_t group_;
};

}  // namespace quarrox
