#include "vexo/smb.h"

#include <unistd.h>

#include <cerrno>
#include <string>

#include "common/json.h"
#include "linux/make_directory.h"
#include "linux/platform_conf.h"
#include "vexo/error.h"

namespace {

// The switch is a note of our own, "1" or "0" on a line, which is a whole JSON text as well.
constexpr char kDirectory[] = "/var/lib/vexo";
constexpr char kNote[] = "/var/lib/vexo/smb_search";

// What Samba is told, where it is managed and its configuration includes this file.
constexpr char kInclude[] = "/var/lib/vexo/smb_search.conf";

int Fail(int error) {
  errno = error;
  VLIBCErrSet(VEXO_ERR_SYSTEM);
  return -1;
}

}  // namespace

int VEXOSMBIsEnableSpotlight(void) {
  Json::Value note;
  errno = 0;
  if (!quarrox::fromFile(note, kNote)) {
    if (errno == ENOENT) return 0;
    return Fail(errno != 0 ? errno : EBADMSG);
  }
  if (note != 0 && note != 1) return Fail(EBADMSG);
  // Samba may be managed only since a moment ago; then it was told nothing yet.
  const bool untold = note == 1 && platform::ReadPlatformConf().manage_samba && access(kInclude, F_OK) != 0;
  return untold ? 0 : note.asInt();
}

int VEXOSMBSetSpotlight(int enable) {
  if (!platform::MakeDirectory(kDirectory, 0755)) return Fail(errno);
  if (platform::ReadPlatformConf().manage_samba) {
    const std::string text = std::string("# Written by fileindex.\nspotlight = ") + (enable != 0 ? "yes" : "no") + "\n";
    if (!quarrox::ReplaceFile(kInclude, text)) return Fail(errno);
  }
  if (!quarrox::toFile(enable != 0 ? 1 : 0, kNote)) return Fail(errno);
  return 0;
}
