// The shares of this machine, as they are configured now.
//
// They stand in /etc/vexo/shares.conf, in the share syntax of smb.conf; where that file does not exist and Samba is
// installed, they are Samba's own, as `testparm -s` prints them.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

namespace platform {

enum : unsigned int {
  kShareRecycle = 1U << 0,
  kShareEncryption = 1U << 1,
  kShareLocked = 1U << 2,
  kShareReadOnly = 1U << 3,
  kShareHideUnreadable = 1U << 4
};

struct Share {
  std::string name;
  std::string path;     // absolute and canonical as a text
  std::string recycle;  // the recycle bin's place below the share, where it has one
  unsigned int status = 0;
};

// An immutable list: whoever holds it may use it from any thread. Finding costs the depth of the path, not the number
// of shares.
class ShareList {
 public:
  // No two shares have one name or one path.
  ShareList(std::vector<Share> shares, std::vector<std::string> problems);
  ShareList(const ShareList&) = delete;
  ShareList& operator=(const ShareList&) = delete;

  const std::vector<Share>& shares() const { return shares_; }

  // What is wrong in the configuration: file, line, what, and what to do.
  const std::vector<std::string>& problems() const { return problems_; }

  // Null where there is none.
  const Share* FindByName(std::string_view name) const;

  // The innermost share that holds a path, by whole components of the text; null where there is none.
  const Share* FindByPath(std::string_view path) const;

  // Whether a path is a share's own directory, or a directory that holds one.
  bool IsShareDirectory(std::string_view path) const;
  bool IsVolume(std::string_view path) const;

 private:
  std::vector<Share> shares_;
  std::vector<std::string> problems_;
  // Keys are texts of shares_.
  std::unordered_map<std::string_view, const Share*> by_name_;
  std::unordered_map<std::string_view, const Share*> by_path_;
  std::unordered_set<std::string_view> volumes_;
  size_t longest_path_ = 0;
};

// Makes a list of a configuration's text; what is wrong leaves single shares out and is told as a problem of `file`.
// With `samba` the text is what Samba's testparm prints: Samba's defaults hold, and no lines are named, as they are not
// the file's. Looks at each share's directory.
std::shared_ptr<const ShareList> ParseShares(std::string_view text, const std::string& file, bool samba);

// The list now, read again when a file that it comes from has changed. Null, with VEXO_ERR_BAD_CONFIG and errno, where
// it cannot be read, *failure then says which file and what to do; a machine without any configuration has an empty
// one. Thread-safe.
std::shared_ptr<const ShareList> Shares(std::string* failure = nullptr);

}  // namespace platform
