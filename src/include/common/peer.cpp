#include "common/peer.h"

#include <grp.h>
#include <pwd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <vector>

namespace quarrox {
namespace {

constexpr char kServiceName[] = "Quarrox";
constexpr auto kNoUser = static_cast<uid_t>(-1);
constexpr auto kNoGroup = static_cast<gid_t>(-1);

// Asks with a buffer that grows until the entry fits; null where there is no such entry.
template <typename Entry, typename Ask>
Entry* Find(Ask ask, Entry& entry, std::vector<char>& buffer) {
  constexpr size_t kLargest = size_t{16} << 20;
  for (size_t size = 1024; size <= kLargest; size *= 2) {
    buffer.resize(size);
    Entry* found = nullptr;
    const int error = ask(kServiceName, &entry, buffer.data(), size, &found);
    if (error != ERANGE) return error == 0 ? found : nullptr;
  }
  return nullptr;
}

}  // namespace

PeerRights::PeerRights() {
  std::vector<char> buffer;
  passwd user;
  struct group members;
  user_ = Find(getpwnam_r, user, buffer) != nullptr ? user.pw_uid : kNoUser;
  group_ = Find(getgrnam_r, members, buffer) != nullptr ? members.gr_gid : kNoGroup;
}

bool PeerRights::IsInGroup(int socket) const {
  std::vector<gid_t> groups(64);
  auto size = static_cast<socklen_t>(groups.size() * sizeof(gid_t));
  int result = getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &size);
  if (result != 0 && errno == ERANGE) {  // `size` is now what is needed
    groups.resize(size / sizeof(gid_t));
    result = getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &size);
  }
  if (result != 0) return false;
  groups.resize(size / sizeof(gid_t));
  return std::find(groups.begin(), groups.end(), group_) != groups.end();
}

bool PeerRights::MayCommand(int socket) const {
  ucred peer;
  socklen_t size = sizeof(peer);
  if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) return false;
  if (peer.uid == 0 || peer.uid == geteuid()) return true;
  if (user_ != kNoUser && peer.uid == user_) return true;
  return group_ != kNoGroup && (peer.gid == group_ || IsInGroup(socket));
}

}  // namespace quarrox
