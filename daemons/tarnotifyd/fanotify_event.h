// The kernel's records of changes on a file system, taken apart.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_FANOTIFY_EVENT_H_
#define QUARRY_DAEMONS_TARNOTIFYD_FANOTIFY_EVENT_H_

#include <cstdint>
#include <string_view>

namespace quarry::notify {

// An entry of a directory. Both parts point into the buffer that was read.
struct FanotifyEntry {
  std::string_view directory;  // the directory's handle: its type (4 bytes), then its bytes
  std::string_view name;       // "." when the event is about the directory itself
};

// One event. What an event does not bring is empty.
struct FanotifyEvent {
  std::uint64_t mask = 0;    // FAN_* bits: the kernel folds several changes of one entry into one
  std::int32_t process = 0;  // who caused it
  FanotifyEntry entry;       // of a FAN_RENAME the old one
  FanotifyEntry new_entry;   // of a FAN_RENAME
  std::string_view target;   // the handle of what the entry leads to, as in FanotifyEntry
};

enum class FanotifyParsing { kEvent, kEnd, kMalformed };

// Takes the first event off `bytes`, which may hold anything. After kMalformed neither `bytes` nor
// `event` is of use.
FanotifyParsing TakeFanotifyEvent(std::string_view* bytes, FanotifyEvent* event);

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_FANOTIFY_EVENT_H_
