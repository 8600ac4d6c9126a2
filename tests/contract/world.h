// The machine that the contract is tested on: one in memory or this one, by what is linked.
#pragma once

#include "support/fake_platform/fake_platform.h"

namespace quarrox::contract {

// A directory on the disk for the shares' directories; empty where the machine cannot be set up.
std::string Volume();

// Sets it up anew with these shares, their recycle bins in "#recycle". There is a user "nobody", /proc and /dev/pts are
// mounted, and no share has room for 2^62 bytes: ask "vault".
void SetUpWorld(const std::vector<support::FakeShare>& shares);

}  // namespace quarrox::contract
