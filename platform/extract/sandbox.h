// What keeps a process that reads hostile files from doing anything else.
#pragma once

#include <json/json.h>

namespace platform::extract {

// From here on this process, and all that it starts, reads what it has open and what a program needs to run, and starts
// programs below /usr: it writes nothing but /dev/null, opens no socket, looks into no other process, gets no
// privileges, is nobody where it was root, and takes a bounded amount of memory. Each layer that the kernel does not
// have is left out. Returns those that hold:
//   landlock    the version of the kernel's interface, 0 where there is none
//   seccomp, user, limits      bool
// Called once, by a process with one thread.
Json::Value EnterSandbox();

// Its parts. False, or 0, where one does not hold.
int EnterLandlock();
bool EnterSeccomp();

// Ends this process when it takes so many more seconds of processor time, from now on.
void LimitTime(unsigned int seconds);

// Resident memory, and the address space, in bytes.
struct Memory {
  size_t space = 0;
  size_t resident = 0;
};
Memory MemoryNow();

}  // namespace platform::extract
