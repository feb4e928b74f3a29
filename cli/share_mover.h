// Renaming and moving shares, with all that hangs on them.

#ifndef QUARRY_CLI_SHARE_MOVER_H_
#define QUARRY_CLI_SHARE_MOVER_H_

#include "cli/share_plan.h"

namespace quarry::cli {

// Brings the directory to its new place, unless somebody has done so already. With `copied` its
// files are at the new place, and those at the old one stay. Throws Problem with nothing changed,
// also when the new place is on another file system: files are never copied.
void MoveDirectory(const SharePlan& plan, bool copied);

// Does all that the plan says: stops the share's worker, moves its directory, its record, its
// queue and what the change monitor has of it, then its index and its documents, and lets the
// worker go on. The caller holds a FolderLock.
//
// When the process is killed anywhere, the same command ends what it has begun: until the share's
// record is replaced there is only a directory that has moved, and from then on nobody else knows
// the share. Throws Problem or Error.
void MoveShare(const SharePlan& plan, bool copied);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_SHARE_MOVER_H_
