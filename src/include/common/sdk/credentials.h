// Acting as another user for the span of an operation.
#pragma once

#include <sys/types.h>

#include <string>

#include "common/export.h"

namespace quarrox::sdk {

// Remembers who the process is and is that again at the end of the scope.
//
// The effective user belongs to the whole process: while one thread acts as somebody else, every thread does. Only the
// switch itself is serialised. Use it where no other thread depends on who the process is.
class QUARROX_API SDKCredentials {
 public:
  // Changes nothing yet. Throws Error 503 where the present user has no name.
  SDKCredentials();

  // Acts as a user at once; throws as AsUser. The end of the scope goes to that user by name, and not back to who the
  // process was before: for an administrator to that user instead of root, for all others it changes nothing. This is
  // wanted. Use the other constructor and AsUser where the process is to be itself again.
  explicit SDKCredentials(const std::string& username);

  // Goes to the remembered user if the effective ids are others than at the beginning. A failure is logged, and the
  // process then stays who it is.
  ~SDKCredentials();

  SDKCredentials(const SDKCredentials&) = delete;
  SDKCredentials& operator=(const SDKCredentials&) = delete;

  // Makes a user the effective one, with all groups; an administrator acts as root. May be called more than once.
  // Throws Error 503 where that cannot be; the process is then who it was.
  void AsUser(const std::string& target_username);

 private:
  uid_t euid_;
  gid_t egid_;
  std::string username_;
};

}  // namespace quarrox::sdk
