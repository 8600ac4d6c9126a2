#include "common/peer.h"

#include <grp.h>
#include <pwd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <optional>
#include <utility>
#include <vector>

namespace quarrox {
namespace {

constexpr char kServiceName[] = "Quarrox";
constexpr auto kNoUser = static_cast<uid_t>(-1);
constexpr auto kNoGroup = static_cast<gid_t>(-1);

// Asks with a buffer that grows until the entry fits; null where there is no such entry.
template <typename Entry, typename Ask>
Entry* Find(const char* name, Ask ask, Entry& entry, std::vector<char>& buffer) {
  constexpr size_t kLargest = size_t{16} << 20;
  for (size_t size = 1024; size <= kLargest; size *= 2) {
    buffer.resize(size);
    Entry* found = nullptr;
    const int error = ask(name, &entry, buffer.data(), size, &found);
    if (error != ERANGE) return error == 0 ? found : nullptr;
  }
  return nullptr;
}

}  // namespace

std::optional<Identity> IdentityOfPeer(int socket) {
  ucred peer;
  socklen_t size = sizeof(peer);
  if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) return std::nullopt;
  std::vector<gid_t> groups(64);
  size = static_cast<socklen_t>(groups.size() * sizeof(gid_t));
  int result = getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &size);
  if (result != 0 && errno == ERANGE) {  // `size` is now what is needed
    groups.resize(size / sizeof(gid_t));
    result = getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &size);
  }
  if (result != 0) return std::nullopt;
  groups.resize(size / sizeof(gid_t));
  return Identity{peer.uid, peer.gid, std::move(groups)};
}

std::optional<Identity> FindIdentity(const std::string& name) {
  std::vector<char> buffer;
  passwd user;
  if (Find(name.c_str(), getpwnam_r, user, buffer) == nullptr) return std::nullopt;
  std::vector<gid_t> groups(64);
  int count = static_cast<int>(groups.size());
  while (getgrouplist(name.c_str(), user.pw_gid, groups.data(), &count) < 0) {
    groups.resize(std::max(groups.size() * 2, static_cast<size_t>(count)));  // it may grow while it is asked for
    count = static_cast<int>(groups.size());
  }
  groups.resize(static_cast<size_t>(count));
  return Identity{user.pw_uid, user.pw_gid, std::move(groups)};
}

PeerRights::PeerRights() {
  std::vector<char> buffer;
  passwd user;
  struct group members;
  user_ = Find(kServiceName, getpwnam_r, user, buffer) != nullptr ? user.pw_uid : kNoUser;
  group_ = Find(kServiceName, getgrnam_r, members, buffer) != nullptr ? members.gr_gid : kNoGroup;
}

bool PeerRights::MayCommand(int socket) const {
  const std::optional<Identity> peer = IdentityOfPeer(socket);
  if (!peer) return false;
  if (peer->user == 0 || peer->user == geteuid()) return true;
  if (user_ != kNoUser && peer->user == user_) return true;
  const auto& groups = peer->groups;
  return group_ != kNoGroup &&
         (peer->group == group_ || std::find(groups.begin(), groups.end(), group_) != groups.end());
}

}  // namespace quarrox
