// The command channel to the indexing daemon: tells fileindexd that settings, folders, shares or the pause state
// changed.
//
// A frame is a 4-byte unsigned length in host byte order and then that many bytes, in both directions; the length
// counts the JSON text and one terminating zero byte. Thread-safe: each call has a socket of its own. A peer that goes
// away never raises SIGPIPE in the caller, and a SIGPIPE that is not of these writes reaches whom it is meant for.
#pragma once

#include <string>

#include <json/json.h>

#include "common/export.h"

namespace quarrox::fileindex {

inline constexpr char kDaemonSocketPath[] = "/var/run/fileindexd.sock";

// Sends {"type": command, "data": data} and waits for the daemon's answer, which is dropped: it says only that the
// daemon took the command. Waits about 4 seconds for a daemon that has not made its socket yet.
//
// Throws Error 502 where the daemon cannot be reached or goes away; one that is absent shows as "write failed". A
// daemon that takes longer than a second to accept what is written fails; one that never answers is waited for without
// end.
QUARROX_API void SendCommandToDaemon(const std::string& command, const Json::Value& data);

// Moves exactly `count` bytes, at most 1024 a call of the system. Throws Error 502 with "read failed, reason=TEXT" or
// "write failed, reason=TEXT" where such a call fails, or a signal interrupts it for the 11th time.
//
// BufferRead does not take the end of the stream for an error: it goes on reading, so a peer that closes early leaves
// the caller waiting. This is wanted.
QUARROX_API void BufferRead(int fd, unsigned int count, unsigned char* buf);
QUARROX_API void BufferWrite(int fd, unsigned int count, const unsigned char* buf);

}  // namespace quarrox::fileindex
