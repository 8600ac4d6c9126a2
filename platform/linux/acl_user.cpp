#include <sys/acl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <vector>

#include <acl/libacl.h>

#include "linux/accounts.h"
#include "linux/failure.h"
#include "vexo/share.h"

// What the kernel would grant, computed without becoming the user. Only the share's own directory is looked at: rights
// on the directories above it do not count, because file services reach a share without walking down to it as the user.
namespace {

constexpr unsigned int kRead = 4, kWrite = 2, kExecute = 1;

struct Entry {
  acl_tag_t tag;
  id_t id;  // of a named user or group
  unsigned int rights;
};

using Acl = std::vector<Entry>;

Entry ToEntry(acl_entry_t from) {
  Entry entry = {ACL_UNDEFINED_TAG, 0, 0};
  acl_get_tag_type(from, &entry.tag);
  acl_permset_t rights;
  acl_get_permset(from, &rights);
  entry.rights = (acl_get_perm(rights, ACL_READ) == 1 ? kRead : 0) |
                 (acl_get_perm(rights, ACL_WRITE) == 1 ? kWrite : 0) |
                 (acl_get_perm(rights, ACL_EXECUTE) == 1 ? kExecute : 0);
  if (entry.tag == ACL_USER || entry.tag == ACL_GROUP) {
    const std::unique_ptr<void, int (*)(void*)> id(acl_get_qualifier(from), acl_free);
    if (id != nullptr) entry.id = *static_cast<const id_t*>(id.get());
  }
  return entry;
}

// Leaves to each entry what the mask lets it have. A mask that lets nothing through shows as group bits of 0 in the
// mode, and then the kernel does not look at the list at all, only at the mode: who is named in it counts among the
// others.
void ApplyMask(Acl* acl) {
  const auto mask = std::find_if(acl->begin(), acl->end(), [](const Entry& entry) { return entry.tag == ACL_MASK; });
  if (mask == acl->end()) return;
  const unsigned int allowed = mask->rights;
  for (Entry& entry : *acl) {
    if (entry.tag == ACL_USER || entry.tag == ACL_GROUP || entry.tag == ACL_GROUP_OBJ) entry.rights &= allowed;
  }
  if (allowed != 0) return;
  std::erase_if(*acl, [](const Entry& entry) { return entry.tag == ACL_USER || entry.tag == ACL_GROUP; });
}

// Where a file has no list, or its file system knows none, libacl makes one of the mode bits.
bool ReadAcl(const char* path, Acl* entries) {
  const std::unique_ptr<void, int (*)(void*)> acl(acl_get_file(path, ACL_TYPE_ACCESS), acl_free);
  if (acl == nullptr) return false;
  auto* list = static_cast<acl_t>(acl.get());
  acl_entry_t entry;
  for (int which = ACL_FIRST_ENTRY; acl_get_entry(list, which, &entry) == 1; which = ACL_NEXT_ENTRY) {
    entries->push_back(ToEntry(entry));
  }
  ApplyMask(entries);
  return true;
}

struct Asker {
  platform::Account account;
  std::vector<gid_t> groups;
  bool owns_file = false;
  gid_t file_group = 0;

  bool IsIn(gid_t group) const { return std::find(groups.begin(), groups.end(), group) != groups.end(); }
};

// How near an entry is to the asker: the kind that is nearest decides alone, and a nearer one that grants less refuses.
enum class Match { kOwner, kNamedUser, kGroup, kOther, kNone };

Match MatchOf(const Entry& entry, const Asker& asker) {
  switch (entry.tag) {
    case ACL_USER_OBJ:
      return asker.owns_file ? Match::kOwner : Match::kNone;
    case ACL_USER:
      return entry.id == asker.account.uid ? Match::kNamedUser : Match::kNone;
    case ACL_GROUP_OBJ:
      return asker.IsIn(asker.file_group) ? Match::kGroup : Match::kNone;
    case ACL_GROUP:
      return asker.IsIn(entry.id) ? Match::kGroup : Match::kNone;
    case ACL_OTHER:
      return Match::kOther;
    default:
      return Match::kNone;
  }
}

// acl(5): of several groups one must grant all that is wanted.
bool Grants(const Acl& acl, const Asker& asker, unsigned int wanted) {
  Match nearest = Match::kNone;
  for (const Entry& entry : acl) nearest = std::min(nearest, MatchOf(entry, asker));
  return nearest != Match::kNone && std::any_of(acl.begin(), acl.end(), [&](const Entry& entry) {
           return MatchOf(entry, asker) == nearest && (entry.rights & wanted) == wanted;
         });
}

}  // namespace

int VEXOShareUserPrivCalc(const char* user, const VEXO_SHARE* share) {
  int read_only = 0;
  if (VLIBShareIsReadOnlyGet(share, &read_only) != 0) return -1;
  Asker asker;
  if (!platform::FindAccount(user, &asker.account)) return -1;
  struct stat info;
  Acl acl;
  if (stat(share->szPath, &info) != 0 || !ReadAcl(share->szPath, &acl)) return VEXO_FAILURE(VEXO_ERR_SYSTEM);
  asker.groups = platform::GroupsOf(asker.account);
  asker.owns_file = info.st_uid == asker.account.uid;
  asker.file_group = info.st_gid;

  const bool is_root = asker.account.uid == 0;
  if (!is_root && !Grants(acl, asker, kRead | kExecute)) return VEXO_SHARE_PRIV_NONE;
  const bool writes = is_root || Grants(acl, asker, kRead | kWrite | kExecute);
  return writes && read_only == 0 ? VEXO_SHARE_PRIV_READ_WRITE : VEXO_SHARE_PRIV_READ;
}
