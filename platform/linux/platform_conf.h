// What the administrator allows the platform to do on this machine: /etc/vexo/platform.conf.
#pragma once

#include <string>

namespace platform {

struct PlatformConf {
  bool manage_samba = false;  // "manage samba": Samba's service may be started, stopped and restarted
};

// Reads the file as it stands now, in the syntax of smb.conf, without sections. Where it does not exist everything has
// its default; what cannot be used in it goes to the system log. Thread-safe.
PlatformConf ReadPlatformConf();

}  // namespace platform
