// Events that the library queues itself, and notifications for administrators.

#ifndef QUARRY_FILEINDEX_UTIL_CUSTOM_EVENT_H_
#define QUARRY_FILEINDEX_UTIL_CUSTOM_EVENT_H_

#include <json/json.h>

#include <string>

#include "common/export.h"

namespace quarry::fileindex {

// Appends an event (fileindex/queue/event.h has the kinds) about `full_path` to the queue of the
// share that holds it. `old_path` is the former full path of a rename, else empty; `data` is the
// event's payload. Nothing is written when a reindex of the path, or of a directory above it, is
// waiting already, nor, silently, when the queue file cannot be opened for writing.
//
// Throws Error 502 when no share holds the path, before anything is done. After any later failure
// the error is logged and thrown on, and the share is marked as needing a reindex: Error 120 for a
// NUL byte in `old_path`, 800 when the share cannot be looked up, 502 when the queue has no path,
// cannot be read or cannot take the whole line, 506 when it cannot be locked, and 906 or 120 when a
// line that waits in it is malformed. Blocks while the queue's lock file is taken, for up to about
// a minute. May be called from several threads at once.
QUARRY_EXPORT void AddCustomEvent(int event, const std::string& full_path,
                                  const std::string& old_path, const Json::Value& data);

// Notifies the administrators that there is no space left for the index, and waits until that is
// done. Returns what running the platform's notification tool returned, negative when it could not
// be run. May be called from any thread.
QUARRY_EXPORT int SendHelmNotify();

// The same, that the search engine lacks memory.
QUARRY_EXPORT int NotifyLackOfMemory();

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_UTIL_CUSTOM_EVENT_H_
