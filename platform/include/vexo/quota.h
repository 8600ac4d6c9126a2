// Room on a volume.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/* Whether `bytes` more bytes can be written below a path: 1 where they can. 0 where not, with VEXO_ERR_VOLUME_FULL
 * where the file system has no room or VEXO_ERR_QUOTA_EXCEEDED where a quota leaves none; 0 also where that cannot be
 * told (VEXO_ERR_SYSTEM). `uid` says whose quota counts; 0 is the caller's own (effective user and group). Whom the
 * kernel excepts from quotas is never refused for one. `flags` is 0. Thread-safe. */
int VEXOQuotaIsEnough(unsigned int uid, const char* path, unsigned long long bytes, int flags);

#ifdef __cplusplus
}
#endif
