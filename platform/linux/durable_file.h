// Replacing small files whole.

#ifndef QUARRY_PLATFORM_LINUX_DURABLE_FILE_H_
#define QUARRY_PLATFORM_LINUX_DURABLE_FILE_H_

#include <sys/types.h>

#include <cstddef>
#include <string>

namespace quarry::platform {

// Replaces the file by `text`, mode 0644: readers see the old or the new text whole, also after a
// power failure. Returns false, with errno set, on failure; the old file is untouched then, unless
// it is only the directory's new state that could not be written to the disk.
bool WriteFileDurably(const std::string& path, const std::string& text);

// Reads a regular file of at most `max_bytes`. Returns false, with errno set, when there is none,
// it is something else (EINVAL) or longer (EFBIG).
bool ReadWholeFile(const std::string& path, std::size_t max_bytes, std::string* text);

// Makes the directory and those above it that are missing, durably; the last one with `mode`, if it
// was not there. Returns false, with errno set, on failure.
bool MakeDirectories(const std::string& path, mode_t mode);

// Makes changes of names in the directory survive a power failure. False, with errno set, on
// failure.
bool SyncDirectory(const std::string& path);

// The text before the last "/", "/" for a name directly below it.
std::string ParentDirectory(const std::string& path);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_DURABLE_FILE_H_
