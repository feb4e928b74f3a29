// The process that parses.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_H_

#include <string>
#include <vector>

#include "daemons/tarncontentextractd/extractor.h"

namespace quarry::extract {

// The descriptor on which a worker finds its channel, and the exit codes that it has.
inline constexpr int kWorkerChannel = 3;
inline constexpr int kExitOk = 0;
inline constexpr int kExitNotClosed = 3;
inline constexpr int kExitOutOfMemory = 4;

// Parses one file. Whatever a parser throws means that the file could not be read further; only
// running out of memory, after which nothing can be relied on, ends the process.
std::vector<Field> ParseFile(const Registry& registry, Source& source);

// Tells the daemon that this worker is ready, or what is wrong with it. Returns whether the worker
// may go on.
bool Announce(int channel, const std::string& problem);

// Answers requests until the daemon closes the channel. A file that takes longer than `seconds`
// ends the process by SIGALRM, also when the daemon is no longer there to end it.
void ServeFiles(const Registry& registry, int channel, int seconds);

// A worker's whole life: gives up all rights, makes sure of it, tries its parsers, and serves.
// Returns the exit code.
int RunWorker(const Registry& registry, int channel);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_H_
