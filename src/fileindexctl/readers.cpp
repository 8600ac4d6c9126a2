#include "readers.h"

#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <sys/acl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <iterator>
#include <memory>
#include <utility>
#include <vector>

#include <acl/libacl.h>

#include "common/error.h"
#include "common/file.h"
#include "common/unique_fd.h"
#include "output.h"

namespace quarrox::ctl {
namespace {

constexpr char kEverybody[] = "everybody";
constexpr char kNobody[] = "nobody but root";

std::string UserName(uid_t id) {
  const passwd* user = getpwuid(id);
  return user != nullptr ? user->pw_name : "the user with the number " + std::to_string(id);
}

std::string GroupName(gid_t id) {
  const group* found = getgrgid(id);
  return found != nullptr ? found->gr_name : "the group with the number " + std::to_string(id);
}

void Append(std::string& list, const std::string& item) {
  list.append(list.empty() ? "" : ", ").append(item);
}

// Whom an entry of an access control list is about; empty for root, for all others, and for what is no entry of theirs.
std::string NameOf(acl_entry_t entry, acl_tag_t tag, const struct stat& info) {
  if (tag == ACL_USER_OBJ) return info.st_uid == 0 ? "" : UserName(info.st_uid);
  if (tag == ACL_GROUP_OBJ) return "members of " + GroupName(info.st_gid);
  if (tag != ACL_USER && tag != ACL_GROUP) return {};
  const std::unique_ptr<void, int (*)(void*)> id(acl_get_qualifier(entry), acl_free);
  if (id == nullptr) return {};
  if (tag == ACL_GROUP) return "members of " + GroupName(*static_cast<const gid_t*>(id.get()));
  const uid_t user = *static_cast<const uid_t*>(id.get());
  return user == 0 ? "" : UserName(user);
}

// Who has a right on what is open. Where a file has no list, or its file system knows none, libacl makes one of the
// mode. What the mask lets through shows as the mode's bits for the group; where that is nothing the kernel does not
// look at the list, and who is named there counts among the others.
std::string WhoHas(int fd, acl_perm_t right, const struct stat& info) {
  const std::string place = "/proc/self/fd/" + std::to_string(fd);
  const std::unique_ptr<void, int (*)(void*)> acl(acl_get_file(place.c_str(), ACL_TYPE_ACCESS), acl_free);
  if (acl == nullptr) return {};
  auto* list = static_cast<acl_t>(acl.get());
  const bool is_masked = acl_extended_file(place.c_str()) == 1 && (info.st_mode & (right << 3)) == 0;
  const bool is_off = is_masked && (info.st_mode & 0070) == 0;
  std::string granted;
  std::string refused;
  std::string refused_users;  // who may be members of a group that is let in, and are not let in with it
  bool others = false;
  acl_entry_t entry;
  for (int which = ACL_FIRST_ENTRY; acl_get_entry(list, which, &entry) == 1; which = ACL_NEXT_ENTRY) {
    acl_tag_t tag = ACL_UNDEFINED_TAG;
    acl_permset_t rights = nullptr;
    acl_get_tag_type(entry, &tag);
    acl_get_permset(entry, &rights);
    bool has = acl_get_perm(rights, right) == 1;
    if (tag == ACL_OTHER) others = has;
    const bool is_named = tag == ACL_USER || tag == ACL_GROUP;
    if (is_off && is_named) continue;
    if (is_masked && (is_named || tag == ACL_GROUP_OBJ)) has = false;
    const std::string name = NameOf(entry, tag, info);
    if (name.empty()) continue;
    Append(has ? granted : refused, name);
    if (!has && (tag == ACL_USER_OBJ || tag == ACL_USER)) Append(refused_users, name);
  }
  if (others) return kEverybody + (refused.empty() ? "" : " but " + refused);
  if (granted.empty()) return kNobody;
  const bool is_of_groups = granted.find("members of ") != std::string::npos;
  return is_of_groups && !refused_users.empty() ? granted + ", but not " + refused_users : granted;
}

struct Refused {
  int error = 0;
  size_t length = 0;  // of the path, up to what refuses
};

// Opens a path as this process may, one component after the other, to its end or to what refuses.
Refused TryToRead(const std::string& path) {
  UniqueFd at(open("/", O_PATH | O_DIRECTORY | O_CLOEXEC));
  for (size_t begin = 1;;) {
    const size_t end = std::min(path.find('/', begin), path.size());
    const std::string name = path.substr(begin, end - begin);
    struct stat info;
    if (fstatat(at.get(), name.c_str(), &info, AT_SYMLINK_NOFOLLOW) != 0)
      return {errno, std::max<size_t>(begin - 1, 1)};
    if (end == path.size()) {
      // A device or a pipe would notice that it is opened.
      const bool is_plain = S_ISREG(info.st_mode) || S_ISDIR(info.st_mode);
      const UniqueFd fd(is_plain ? openat(at.get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC) : -1);
      const bool may = is_plain ? bool{fd} : faccessat(at.get(), name.c_str(), R_OK, AT_EACCESS) == 0;
      return {may ? 0 : errno, end};
    }
    at = UniqueFd(openat(at.get(), name.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!at) return {errno, end};
    begin = end + 1;
  }
}

// In a process of its own, which does not come back.
[[noreturn]] void TryAs(const passwd& user, const std::string& path, int answer_to) {
  Refused refused;
  const bool is_user = geteuid() == user.pw_uid || (initgroups(user.pw_name, user.pw_gid) == 0 &&
                                                    setgid(user.pw_gid) == 0 && setuid(user.pw_uid) == 0);
  if (is_user) refused = TryToRead(path);
  const bool told = is_user && write(answer_to, &refused, sizeof(refused)) == sizeof(refused);
  _exit(told ? 0 : 1);
}

Refused AskKernel(const passwd& user, const std::string& path) {
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) throw Error(kErrSystem, std::string("pipe failed, reason=") + strerror(errno));
  const UniqueFd from(ends[0]);
  UniqueFd to(ends[1]);
  const pid_t child = fork();
  if (child < 0) throw Error(kErrSystem, std::string("fork failed, reason=") + strerror(errno));
  if (child == 0) TryAs(user, path, to.get());
  to = UniqueFd();
  Refused refused;
  const bool told = read(from.get(), &refused, sizeof(refused)) == sizeof(refused);
  waitpid(child, nullptr, 0);
  if (!told) throw Error(kErrCredentials, "this process may not act as " + std::string(user.pw_name));
  return refused;
}

// The letters of the rights that a user's own entry in an access control list gives already, and of one more.
std::string WithOwnRights(uid_t user, const std::string& path, char right) {
  std::string letters(1, right);
  const std::unique_ptr<void, int (*)(void*)> acl(acl_get_file(path.c_str(), ACL_TYPE_ACCESS), acl_free);
  acl_entry_t entry;
  for (int which = ACL_FIRST_ENTRY; acl && acl_get_entry(static_cast<acl_t>(acl.get()), which, &entry) == 1;
       which = ACL_NEXT_ENTRY) {
    acl_tag_t tag = ACL_UNDEFINED_TAG;
    acl_permset_t rights = nullptr;
    acl_get_tag_type(entry, &tag);
    acl_get_permset(entry, &rights);
    if (tag != ACL_USER) continue;
    const std::unique_ptr<void, int (*)(void*)> id(acl_get_qualifier(entry), acl_free);
    if (id == nullptr || *static_cast<const uid_t*>(id.get()) != user) continue;
    for (const auto& [letter, bit] : {std::pair{'r', ACL_READ}, {'w', ACL_WRITE}, {'x', ACL_EXECUTE}}) {
      if (letter != right && acl_get_perm(rights, static_cast<acl_perm_t>(bit)) == 1) letters += letter;
    }
  }
  return letters;
}

// What gives the user the right, and nobody else if the tool for that is there. The mask of a list stays as it is: a
// new one would let through what it holds back of others.
std::string RemedyFor(const passwd& user, const std::string& path, const struct stat& info, char right) {
  const std::string as_well = std::string("+") + right;
  if (info.st_uid == user.pw_uid) return ShellLine({"chmod", "u" + as_well, path});
  const bool has_list = acl_extended_file(path.c_str()) == 1;
  const mode_t of_mask = right == 'x' ? S_IXGRP : S_IRGRP;
  if (has_list && (info.st_mode & of_mask) == 0) {
    return "its mask holds its access list back; say who is to have what: " + ShellLine({"getfacl", path});
  }
  if (IsFileExist("/usr/bin/setfacl")) {
    const std::string entry = "u:" + std::string(user.pw_name) + ':' + WithOwnRights(user.pw_uid, path, right);
    return ShellLine(has_list ? std::vector<std::string>{"setfacl", "-n", "-m", entry, path}
                              : std::vector<std::string>{"setfacl", "-m", entry, path});
  }
  gid_t groups[1024];
  int count = std::size(groups);
  getgrouplist(user.pw_name, user.pw_gid, groups, &count);
  const bool is_in =
      std::find(groups, groups + std::clamp(count, 0, 1024), info.st_gid) != groups + std::clamp(count, 0, 1024);
  return ShellLine({"chmod", (is_in ? "g" : "o") + as_well, path});
}

}  // namespace

Readers ReadersOf(const std::string& path) {
  Readers readers;
  std::vector<Readers::Step> steps;
  UniqueFd at(open("/", O_PATH | O_CLOEXEC));
  for (size_t begin = 1; at;) {
    struct stat info;
    if (fstat(at.get(), &info) != 0) return {};
    if (begin > path.size()) {
      readers.who = WhoHas(at.get(), ACL_READ, info);
      break;
    }
    steps.push_back({path.substr(0, std::max<size_t>(begin - 1, 1)), WhoHas(at.get(), ACL_EXECUTE, info)});
    const size_t end = std::min(path.find('/', begin), path.size());
    at = UniqueFd(openat(at.get(), path.substr(begin, end - begin).c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
    begin = end + 1;
  }
  for (Readers::Step& step : steps) {
    if (step.who == kNobody) readers.who = kNobody;
    if (!step.who.empty() && step.who != kEverybody && step.who != readers.who)
      readers.steps.push_back(std::move(step));
  }
  return readers;
}

std::string Describe(const Readers& readers) {
  if (readers.who.empty()) return "cannot be told";
  std::string text = readers.who;
  if (readers.who == kNobody) return text;
  for (const Readers::Step& step : readers.steps) {
    const bool is_open = step.who.starts_with(kEverybody);
    text += (&step == &readers.steps.front() ? "; but " : ", and ") + step.directory + " lets in " +
            (is_open ? "" : "only ") + step.who;
  }
  return text;
}

Access AccessAs(const std::string& name, const std::string& path) {
  const passwd* found = getpwnam(name.c_str());
  if (found == nullptr) throw Error(kErrCredentials, "there is no user " + name);
  const std::string user_name = found->pw_name;  // the record is overwritten by the next look-up
  passwd user = *found;
  user.pw_name = const_cast<char*>(user_name.c_str());
  const Refused refused = AskKernel(user, path);
  if (refused.error == 0) return {};
  Access access;
  access.refused_by = path.substr(0, refused.length);
  struct stat info;
  if (refused.error != EACCES || lstat(access.refused_by.c_str(), &info) != 0) {
    access.reason = access.refused_by + ": " + strerror(refused.error);
    access.remedy = "check the path";
    return access;
  }
  const bool is_on_the_way = refused.length < path.size();
  char mode[8];
  snprintf(mode, sizeof(mode), "%04o", info.st_mode & 07777U);
  access.reason = std::string("may not ") + (is_on_the_way ? "enter " : "read ") + access.refused_by +
                  ", which belongs to " + UserName(info.st_uid) + " and the group " + GroupName(info.st_gid) +
                  ", with the mode " + mode;
  access.remedy = RemedyFor(user, access.refused_by, info, is_on_the_way ? 'x' : 'r');
  return access;
}

}  // namespace quarrox::ctl
