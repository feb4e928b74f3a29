// The channel to the index daemon, and whole buffers through a descriptor.

#ifndef QUARRY_COMM_COMMUNICATION_H_
#define QUARRY_COMM_COMMUNICATION_H_

#include <json/json.h>

#include <string>

#include "common/export.h"

namespace quarry::fileindex {

// Sends {"type": command, "data": data} to the index daemon and waits until it has answered; the
// answer itself is discarded. Throws Error 502 on failure: no daemon, or one that takes nothing for
// a second. Blocks for up to about 5 seconds while the daemon's socket is missing, and without
// limit for the answer. May be called from several threads at once.
QUARRY_EXPORT void SendCommandToDaemon(const std::string& command, const Json::Value& data);

// Reads exactly `len` bytes into `buf`, whose owner is the caller. Blocks until all have arrived:
// the end of a stream does not end the wait. Throws Error 502 when reading fails, and when a signal
// interrupts it for the eleventh time.
QUARRY_EXPORT void BufferRead(int fd, unsigned int len, unsigned char* buf);

// Writes exactly `len` bytes of `buf`, and blocks until the descriptor has taken them. Throws Error
// 502 when writing fails, and when a signal interrupts it for the eleventh time. A reader that is
// gone is such a failure and raises no SIGPIPE, whatever kind of descriptor it is.
QUARRY_EXPORT void BufferWrite(int fd, unsigned int len, const unsigned char* buf);

}  // namespace quarry::fileindex

#endif  // QUARRY_COMM_COMMUNICATION_H_
