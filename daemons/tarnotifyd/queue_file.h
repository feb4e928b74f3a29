// Writing to a queue that other processes write to and take away.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_QUEUE_FILE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_QUEUE_FILE_H_

#include <functional>
#include <string>
#include <vector>

#include "daemons/tarnotifyd/change_source.h"

namespace quarry::notify {

// The changes as lines of a queue, each with its end. Names may be any bytes.
std::string QueueLines(const std::vector<Change>& changes);

// The line that says that events about `directory`, or below it, were lost. Whoever reads it looks
// at everything that the queue is about.
std::string OverflowLine(const std::string& directory);

enum class WriteResult {
  kDone,    // the lines are in the queue, or it ends in an overflow, which includes them
  kBusy,    // somebody else holds the queue's lock
  kFailed,  // nothing was written; errno says why
};

// Takes the queue's lock, opens the queue anew under it, so that no line lands in a snapshot, and
// appends the lines, all of them or none. Creates the queue if it is missing; but one that is
// missing or empty, and by now not `is_wanted`, is removed instead, which is kDone too: whoever
// gave it up would leave it behind for ever. Does not wait for the lock.
WriteResult AppendToQueue(const std::string& queue, const std::string& lines,
                          const std::function<bool()>& is_wanted);

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_QUEUE_FILE_H_
