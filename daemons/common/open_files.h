// How many files a daemon may have open.

#ifndef QUARRY_DAEMONS_COMMON_OPEN_FILES_H_
#define QUARRY_DAEMONS_COMMON_OPEN_FILES_H_

namespace quarry::daemon {

// Raises the process's usual limit of open files to the highest that it may set for itself. Where
// the system refuses it stays as it is.
void AllowManyFiles();

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_OPEN_FILES_H_
