// Running another program.
//
// The program gets the arguments after its own path, up to a final NULL; no shell takes part. Thread-safe.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

// How VLIBCExecl runs a program; 0xBB, which callers pass, is all but DETACH and NEW_SESSION.
enum {
  VLIBC_EXEC_NO_STDIN = 0x01,  // standard input, output and error are /dev/null
  VLIBC_EXEC_NO_STDOUT = 0x02,
  VLIBC_EXEC_DETACH = 0x04,  // do not wait for the program; 0 once it was started
  VLIBC_EXEC_NO_STDERR = 0x08,
  VLIBC_EXEC_CLOSE_FDS = 0x10,      // no other open file is passed on
  VLIBC_EXEC_RESET_SIGNALS = 0x20,  // no signal is ignored or blocked in it
  VLIBC_EXEC_NEW_SESSION = 0x40,    // it leads a session of its own
  VLIBC_EXEC_AS_EFFECTIVE = 0x80    // it runs as the caller's effective user also where it would look at the real one
};

/* Runs a program and waits for it, everything inherited but open files and signals. Its exit status 0 to 255, 128 plus
 * the number of the signal that ended it, or -1 where it could not be started (VEXO_ERR_SYSTEM and errno). */
int VLIBCExec(const char* path, ... /* const char* arguments, NULL */);

/* The same with VLIBC_EXEC_* flags. */
int VLIBCExecl(const char* path, int flags, ... /* const char* arguments, NULL */);

#ifdef __cplusplus
}
#endif
