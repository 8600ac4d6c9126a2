// The platform's last error.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

enum {
  VEXO_ERR_NONE = 0,
  VEXO_ERR_NO_SUCH_USER = 0x1D00,
  VEXO_ERR_SYSTEM = 0x0900 /* a system call failed; errno tells why */
};

/* The number of the calling thread's last failure in a platform call; 0 where none failed yet. */
int VLIBCErrGet(void);

/* Sets it; for implementations of platform calls. */
void VLIBCErrSet(int error);

#ifdef __cplusplus
}
#endif
