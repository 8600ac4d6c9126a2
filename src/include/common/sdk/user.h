// A user and the place of their home.
#pragma once

#include <string>

#include "common/export.h"

namespace quarrox::sdk {

// A plain value; one object is used by one thread.
class QUARROX_API User {
 public:
  // Nobody: not valid, and without a home.
  User() = default;

  // The user with this login name, which is looked up when the home is asked for; an empty name is nobody.
  explicit User(const std::string& name);

  bool IsValid() const { return valid_; }
  const std::string& GetName() const { return name_; }

  // The home directory, asked for once; empty for nobody. Throws Error 502 where it cannot be found.
  std::string GetHomePath() const;

 private:
  std::string name_;
  mutable std::string home_;
  bool valid_ = false;
};

}  // namespace quarrox::sdk
