#include "contract/world.h"
#include "support/temp_dir.h"

namespace quarrox::contract {

std::string Volume() {
  static const support::TempDir dir;
  return dir.path();
}

void SetUpWorld(const std::vector<support::FakeShare>& shares) {
  support::FakePlatform& world = support::FakePlatform::Get();
  world.Reset();
  for (const support::FakeShare& share : shares) world.AddShare(share);
  world.AddUser({"nobody", 65534, 65534, "/nonexistent"});
  for (const char* path : {"/proc", "/dev/pts"}) world.Mount(path, VEXO_FS_PSEUDO);
  world.SetRoom(Volume() + "/vault", VEXO_ERR_VOLUME_FULL);
}

}  // namespace quarrox::contract
