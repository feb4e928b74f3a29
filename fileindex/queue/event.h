// One line of a share's event queue.
//
// A queue is a text file: one JSON object per line, lines ended by "\n", read from start to end.
// Keys: "event" (unsigned, a bit set of EventKind), "path" (string), and optionally "is_dir"
// (bool), "path_old" (string) and "data" (any value). Other keys are ignored.

#ifndef QUARRY_FILEINDEX_QUEUE_EVENT_H_
#define QUARRY_FILEINDEX_QUEUE_EVENT_H_

#include <json/json.h>

#include <cstdint>
#include <string>

#include "common/export.h"

namespace quarry {
namespace fileindex {

enum EventKind : std::uint32_t {
  EVENT_MODIFY = 0x00000002,      // file content changed
  EVENT_ATTR = 0x00000004,        // owner, mode or times changed
  EVENT_CREATE = 0x00000040,      // created
  EVENT_DELETE = 0x00000080,      // deleted
  EVENT_RENAME = 0x00000100,      // moved from "path_old" to "path"
  EVENT_OVERFLOW = 0x00000200,    // the monitor lost events: the queue is not to be trusted
  EVENT_REINDEX = 0x00010000,     // reindex the path and everything below it
  EVENT_UPDATE_CFG = 0x00020000,  // a folder's configuration changed as "data" says
};

// A parsed line. Owns what it holds; safe to read from several threads.
struct QUARRY_EXPORT Event {
  // Parses one line, given without its newline; any bytes and any length may come. Throws Error 906
  // when it is not JSON, Error 120 when a key is missing or of the wrong type.
  explicit Event(const std::string& event_raw);
  ~Event();

  std::uint32_t op = 0;  // a bit set of EventKind; unknown bits are kept
  bool is_dir = false;   // the path names a directory
  std::string path;      // full path; for a rename, the new one
  std::string path_old;  // for a rename, the old full path
  Json::Value data;      // null when the line has none
};

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_FILEINDEX_QUEUE_EVENT_H_
