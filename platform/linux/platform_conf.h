// What the administrator allows the platform to do on this machine: /etc/vexo/platform.conf.
#pragma once

#include <string>

namespace platform {

struct PlatformConf {
  bool manage_samba = false;      // "manage samba": Samba's service may be restarted, and what it includes be written
  std::string notice_mail;        // "notice mail": the address that notices are sent to
  std::string notice_command;     // "notice command": the program that is run for each notice
  unsigned int notice_time = 10;  // "notice time limit": seconds until a mail or a command is given up
};

// Reads the file as it stands now, in the syntax of smb.conf, without sections. Where it does not exist everything has
// its default; what cannot be used in it goes to the system log. Thread-safe.
PlatformConf ReadPlatformConf();

}  // namespace platform
