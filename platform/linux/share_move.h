// Taking along what belongs to a share that gets another name or place: its record, the lines that
// wait in its queue, what is registered with the change monitor. Its files are the caller's to move
// before, its index and its documents the search engine's and the index daemon's afterwards.

#ifndef QUARRY_PLATFORM_LINUX_SHARE_MOVE_H_
#define QUARRY_PLATFORM_LINUX_SHARE_MOVE_H_

#include <string>

#include "common/export.h"

namespace quarry::platform {

// Moves the share to the full path `new_path`, an existing directory whose last component becomes
// the share's name. The new queue holds the old snapshot's and queue's lines. Nobody may be working
// on the old snapshot.
//
// The share's record is replaced in one instant, behind the preparations: when the process is
// killed before it, calling this again begins anew, and when it is killed after it the record says
// "moved_from" and CleanUpShareMove does the rest. Until EndShareMove the share is known to nobody
// but processes that ask for it with ShowMovingShares: somebody who found its new place before its
// index and its documents are there would index it anew. Throws as ReplaceSharePath, and Error 502
// when the queue or a registration cannot be written, 506 when the queue cannot be locked.
QUARRY_EXPORT void MoveShare(const std::string& name, const std::string& new_path);

// Whether this process wants to know shares that are on their way (TARNShareGet,
// TARNShareNamePathGet); at first it does not. Any thread.
QUARRY_EXPORT void ShowMovingShares(bool show);

// Removes queue and registrations of the place that the share was moved from. May be repeated.
// Throws Error 502 when something cannot be removed.
QUARRY_EXPORT void CleanUpShareMove(const std::string& old_path);

// Has the change monitor watch `new_path` in place of `old_path`, a directory of the share at the
// full path `share_path`, wherever that or a place below it is registered. Throws Error 502.
QUARRY_EXPORT void MoveWatches(const std::string& share_path, const std::string& old_path,
                               const std::string& new_path);

// Removes the queue of the share at `share_path`, the snapshot included. Throws Error 502.
QUARRY_EXPORT void RemoveQueue(const std::string& share_path);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_SHARE_MOVE_H_
