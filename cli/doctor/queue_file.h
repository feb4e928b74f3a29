// The lines of a queue, or of its snapshot, that are no events.

#ifndef QUARRY_CLI_DOCTOR_QUEUE_FILE_H_
#define QUARRY_CLI_DOCTOR_QUEUE_FILE_H_

#include <cstdint>
#include <string>

namespace quarry::cli {

// How many lines are no events. Takes no lock: a last line without an end may just be being written
// and does not count. 0 where there is no file. Throws Problem when it cannot be read or is none.
std::uint64_t CountBadLines(const std::string& path);

// Takes the lines that are no events out, under the file's lock, and has the share at `share_path`,
// a full path, looked at anew, because nobody knows what they said. All other lines stay, byte for
// byte; at every moment the file is the old or the new one. Returns how many lines went. May block
// for half a minute. Throws Problem.
std::uint64_t RemoveBadLines(const std::string& path, const std::string& share_path);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_DOCTOR_QUEUE_FILE_H_
