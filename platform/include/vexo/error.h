// The platform's last error: a number beside errno, with the place that set it.
//
// Every call of the platform that fails says so by its result and sets this number; a call that succeeds leaves it as
// it was. Each header names the numbers that its calls set. All of it is per thread.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

// 0x2400 and 0x2900 are what callers test for; the others are this platform's own numbering.
enum {
  VEXO_ERR_NONE = 0,
  VEXO_ERR_SYSTEM = 0x0900,            // a system call failed; errno tells why
  VEXO_ERR_BAD_PARAMETER = 0x0D00,     // an argument that the call cannot work with
  VEXO_ERR_BUFFER_TOO_SMALL = 0x0E00,  // the result does not fit into the caller's buffer
  VEXO_ERR_NOT_PERMITTED = 0x0F00,     // the process may not do this
  VEXO_ERR_NO_SUCH_SHARE = 0x1400,     // no share of this name, or no share holds this path
  VEXO_ERR_BAD_CONFIG = 0x1500,        // the platform's configuration cannot be read
  VEXO_ERR_SERVICE = 0x1600,           // there is no service manager, or it refused
  VEXO_ERR_NO_SUCH_USER = 0x1D00,
  VEXO_ERR_NO_SUCH_GROUP = 0x1E00,
  VEXO_ERR_QUOTA_EXCEEDED = 0x2400,  // the user's or group's quota leaves no room
  VEXO_ERR_VOLUME_FULL = 0x2900      // the file system leaves no room
};

/* The number of the calling thread's last failure in a platform call; 0 where none failed yet. */
int VLIBCErrGet(void);

/* Where it was set: the source's file name without directories ("" where none failed yet), and the line. The text
 * lives as long as the process. */
const char* VLIBCErrFileGet(void);
int VLIBCErrLineGet(void);

/* Sets it; for implementations of platform calls. errno is left alone. */
void VLIBCErrSetAt(int error, const char* file, int line);
#define VLIBCErrSet(error) VLIBCErrSetAt((error), __FILE__, __LINE__)

#ifdef __cplusplus
}
#endif
