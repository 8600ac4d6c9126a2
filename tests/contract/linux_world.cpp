#include "contract/world.h"
#include "support/private_machine.h"

namespace quarrox::contract {

std::string Volume() {
  static support::PrivateMachine etc;
  static const bool entered = geteuid() == 0 && etc.Enter();
  if (entered) std::filesystem::create_directories("/etc/vexo");
  return entered ? etc.scratch() : "";
}

void SetUpWorld(const std::vector<support::FakeShare>& shares) {
  std::ofstream conf("/etc/vexo/shares.conf");
  for (const support::FakeShare& share : shares) {
    const char* const encrypted = share.locked ? "locked" : share.encryption ? "yes" : "no";
    conf << "[" + share.name + "]\npath = " + share.path + "\nrecycle:repository = #recycle\nread only = "
         << share.read_only << "\nvfs objects = " << (share.recycle ? "recycle" : "")
         << "\nhide unreadable = " << share.hide_unreadable << "\nfileindex:encrypted = " << encrypted << "\n";
  }
}

}  // namespace quarrox::contract
