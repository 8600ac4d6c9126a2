// Recycle bins.
//
// Not thread-safe: callers hold the process-wide platform mutex.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

// Whose homes VEXORecycleUserHomePathIsExist looks at, by the directory that knows the user. A platform that cannot
// tell the directories apart takes any of them for all.
enum { VEXO_USERS_LOCAL = 1, VEXO_USERS_DOMAIN = 2, VEXO_USERS_LDAP = 8 };

/* 1 where the path is, or lies in, the recycle bin of the share that holds it and that share has its recycle bin on; 0
 * where not; -1 where no share holds the path (VEXO_ERR_NO_SUCH_SHARE). The path need not exist. */
int VEXOShareIsShareRecycle(const char* full_path);

/* 1 where the path is, or lies in, a recycle bin directly inside a user's home below the share "homes", and that bin
 * exists; 0 where not; -1 where there is no share "homes" (VEXO_ERR_NO_SUCH_SHARE). `users` is a sum of VEXO_USERS_*.
 */
int VEXORecycleUserHomePathIsExist(const char* full_path, int users);

#ifdef __cplusplus
}
#endif
