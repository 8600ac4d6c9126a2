// Services of the machine.
//
// Results: 0 where the service manager took the request, -1 where there is none or it refused (VEXO_ERR_SERVICE), and
// where the name or kind is not known (VEXO_ERR_BAD_PARAMETER). Thread-safe.
#pragma once

#ifndef TRUE
#define TRUE 1
#define FALSE 0
#endif

#ifdef __cplusplus
extern "C" {
#endif

enum { VLIB_SERVICECTL_UPSTART = 1 };  // the kind of a service that the service manager runs itself

/* Restarts a service by its platform name: "samba". */
int VLIBServiceRestart(const char* name);

/* Starts a service by its platform name; nothing to do where it runs. `wait` (TRUE or FALSE): answer when it runs, not
 * when the request was taken, and after 30 s at most. "vexocontentextractd" needs no process here and always succeeds.
 */
int VLIBServiceStart(const char* name, int wait);

/* Starts and stops a package's job by its name: "pkg-Quarrox-fileindexd". */
int VLIBServicectlStart(const char* name, int kind);
int VLIBServicectlStop(const char* name, int kind);

#ifdef __cplusplus
}
#endif
