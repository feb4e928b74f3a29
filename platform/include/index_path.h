// Where a share's event queue and search index are kept.
//
// Each writes a NUL-terminated text into a buffer of `size` bytes and returns 0, or a negative
// number when the argument is no absolute path of a share (or no name) or the buffer is too small.
// Nothing is created or looked up. All may be called from any thread.

#ifndef QUARRY_PLATFORM_INCLUDE_INDEX_PATH_H_
#define QUARRY_PLATFORM_INCLUDE_INDEX_PATH_H_

#include <cstddef>

#include "common/export.h"

extern "C" {

// The event queue file of the share whose full path is `share_path`.
QUARRY_EXPORT int FILEIDXQueuePathCompose(const char* share_path, char* buffer, size_t size);

// The directory of the search index of the share whose full path is `share_path`.
QUARRY_EXPORT int FILEIDXDBPathCompose(const char* share_path, char* buffer, size_t size);

// The name of the search index of the share called `share_name`.
QUARRY_EXPORT int FILEIDXGetIndexID(const char* share_name, char* buffer, size_t size);

}  // extern "C"

#endif  // QUARRY_PLATFORM_INCLUDE_INDEX_PATH_H_
