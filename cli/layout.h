// The directories that a system needs before its daemons can start.

#ifndef QUARRY_CLI_LAYOUT_H_
#define QUARRY_CLI_LAYOUT_H_

namespace quarry::cli {

// Throws Problem where QUARRY_ROOT is not an absolute path, or so long that the daemons' sockets
// below it would have no address.
void CheckRoot();

// Makes the directories of state, sockets and locks that are missing. Throws Problem.
void EnsureLayout();

}  // namespace quarry::cli

#endif  // QUARRY_CLI_LAYOUT_H_
