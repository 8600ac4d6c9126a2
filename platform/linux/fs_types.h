// Which type of file system is which: the names that the kernel gives them, and the numbers that callers know.
//
// Pure functions. Thread-safe.
#pragma once

#include <string_view>

namespace platform {

// The VEXO_FS_* number of a type as the mount table names it ("ext4", "fuse.sshfs").
int FsTypeByName(std::string_view name);

// The same from statfs's f_type, for file systems whose name is not to be had. Less exact: all of FUSE is one f_type.
int FsTypeByMagic(unsigned long magic);

}  // namespace platform
