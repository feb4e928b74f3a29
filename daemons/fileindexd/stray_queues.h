// Queues that nobody works off.

#ifndef QUARRY_DAEMONS_FILEINDEXD_STRAY_QUEUES_H_
#define QUARRY_DAEMONS_FILEINDEXD_STRAY_QUEUES_H_

namespace quarry::fileindexd {

// Removes what was queued for shares that have no indexed folder: it would grow for ever, and a
// share that gets a folder is compared as a whole anyway. A queue that somebody has locked, or
// whose share is just being moved, is left for the next time. Does not block. Throws Error when the
// folder list cannot be loaded.
void RemoveStrayQueues();

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_STRAY_QUEUES_H_
