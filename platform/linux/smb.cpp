#include "vexo/smb.h"

#include <cerrno>

#include "common/json.h"
#include "linux/make_directory.h"
#include "vexo/error.h"

namespace {

// The switch is a note of our own, "1" or "0" on a line, which is a whole JSON text as well.
constexpr char kDirectory[] = "/var/lib/vexo";
constexpr char kNote[] = "/var/lib/vexo/smb_search";

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
  return note.asInt();
}

int VEXOSMBSetSpotlight(int enable) {
  if (!platform::MakeDirectory(kDirectory, 0755)) return Fail(errno);
  if (!quarrox::toFile(enable != 0 ? 1 : 0, kNote)) return Fail(errno);
  return 0;
}
