// A machine in memory behind the seam: shares, users, room and file systems, failure on demand, and a log of the calls.
//
// It is a library that a test program links in the place of the real platform. There is one world; a test starts it
// anew with Reset(). Paths need not exist, except where a call under test looks at the real disk itself. Not
// thread-safe.
#pragma once

#include <sys/types.h>

#include <cerrno>
#include <deque>
#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include <json/json.h>

#include "vexo/error.h"
#include "vexo/filesystem.h"

namespace quarrox::support {

struct FakeShare {
  std::string name;
  std::string path;
  bool recycle = false;
  bool encryption = false;
  bool locked = false;  // says `encryption`, too
  bool read_only = false;
  bool hide_unreadable = false;
  int ftp_privilege = 0;
  std::map<std::string, int> privileges = {};  // by user; others may do nothing
};

struct FakeUser {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;
  std::string home = {};
  bool admin = false;
  std::vector<gid_t> groups = {};
};

class FakePlatform {
 public:
  // The world that every call of the seam sees.
  static FakePlatform& Get();

  // Back to a machine with the user root (an administrator, who the process is), no share, and one local file system.
  void Reset() { *this = {}; }

  // What has the same name is replaced.
  void AddShare(const FakeShare& share) {
    RemoveShare(share.name);
    shares.push_back(share);
    shares.back().encryption |= share.locked;
  }
  void RemoveShare(const std::string& name) {
    std::erase_if(shares, [&](const FakeShare& share) { return share.name == name; });
  }
  void AddUser(const FakeUser& user) {
    std::erase_if(users, [&](const FakeUser& other) { return other.name == user.name; });
    users.push_back(user);
  }

  // What is mounted at a path; below it another type holds. `room` is the error of a write there, VEXO_ERR_NONE for
  // room.
  void Mount(const std::string& path, int type = VEXO_FS_EXT) { mounts[path] = type; }
  void SetRoom(const std::string& path, int error) { rooms[path] = error; }

  // Makes every later call of one function fail, until Heal.
  void Fail(const std::string& function, int error = VEXO_ERR_SYSTEM, int system_error = EIO) {
    faults_[function] = {error, system_error};
  }
  void Heal(const std::string& function) { faults_.erase(function); }

  // Sees each call before it is made, in the thread that makes it; the int that it throws becomes the call's error.
  std::function<void(const std::string& function)> on_call = {};

  // The calls since Reset or ForgetCalls: "VEXOShareGet(docs)", arguments as texts, records by name, results and
  // buffers left out. Calls about the last error are not among them, nor is reading a list.
  const std::vector<std::string>& calls() const { return calls_; }
  size_t CountCalls(const std::string& function) const;
  void ForgetCalls() { calls_.clear(); }

  // Who the process is now; geteuid() and getegid() say the same.
  const FakeUser& effective_user() const { return effective_; }

  void Become(const FakeUser& user) { effective_ = user; }

  // What every call begins with: logs it; throws the last error, with errno set, where it is to fail.
  void Begin(const std::string& function, const std::vector<std::string>& arguments);

  // Monitor configurations by queue path, and what content extraction answers for a path (an absent one throws). A
  // queue's directory is made only where its volume exists on the disk.
  std::map<std::string, Json::Value> monitors = {};
  std::map<std::string, Json::Value> documents = {};
  std::string last_read_failure = "cannot be read";

  // The SMB service's search switch, and what VLIBShareConfigCheck finds wrong.
  bool spotlight = false;
  std::vector<std::string> share_problems = {};

  // The texts that the search engine was sent, and those that it answers, in this order; without one it answers
  // {"success":true}. A connection fails through Fail of "DomainSockConnection::Connect", "SockConnection::Send" or
  // "...::Recv".
  std::vector<std::string> engine_requests = {};
  std::deque<std::string> engine_answers = {};

  // What the methods above have made; paths without a slash at the end.
  std::vector<FakeShare> shares = {};
  std::vector<FakeUser> users = {{.name = "root", .home = "/root", .admin = true}};
  std::map<std::string, int> mounts = {{"/", VEXO_FS_EXT}};
  std::map<std::string, int> rooms = {{"/", VEXO_ERR_NONE}};

 private:
  FakeUser effective_ = users.front();
  std::map<std::string, std::pair<int, int>> faults_ = {};  // by function: the last error and errno
  std::vector<std::string> calls_ = {};
};

}  // namespace quarrox::support
