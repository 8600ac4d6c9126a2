// Who may find a file: whoever may open it for reading, which takes the right to enter each directory on the way.
#pragma once

#include <string>
#include <vector>

namespace quarrox::ctl {

// In people's words, from owner, group, mode and access control list: "everybody", "alice, members of staff", "nobody
// but root". Root is meant each time.
struct Readers {
  struct Step {
    std::string directory;
    std::string who;
  };
  std::string who = {};          // may read what is at the path; empty where that cannot be told
  std::vector<Step> steps = {};  // the directories on the way that not just these or everybody may enter, from the top
};

Readers ReadersOf(const std::string& path);

// All in one sentence.
std::string Describe(const Readers& readers);

// What the kernel says to one user. All texts are empty where it lets them read the file.
struct Access {
  std::string refused_by = {};  // the first directory that the user may not enter, or the file
  std::string reason = {};
  std::string remedy = {};  // a command for the shell
};

// Throws Error 503 where there is no such user, or the process may not ask in their name.
Access AccessAs(const std::string& user, const std::string& path);

}  // namespace quarrox::ctl
