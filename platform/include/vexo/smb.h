// The search switch of the SMB service: whether clients may search shares through the index.
//
// Not thread-safe: callers hold a lock of their own around reading and changing it.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/* 1 where it is on, 0 where it is off or was never set, -1 (VEXO_ERR_SYSTEM and errno) where that cannot be told. */
int VEXOSMBIsEnableSpotlight(void);

/* Switches it on (1) or off (0); it takes effect when the SMB service is restarted. 0, or -1 (VEXO_ERR_SYSTEM and
 * errno) with the switch as it was. */
int VEXOSMBSetSpotlight(int enable);

#ifdef __cplusplus
}
#endif
