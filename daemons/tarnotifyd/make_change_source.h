// Choosing where changes come from.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_MAKE_CHANGE_SOURCE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_MAKE_CHANGE_SOURCE_H_

#include <memory>

#include "daemons/tarnotifyd/change_source.h"

namespace quarry::notify {

enum class SourceKind {
  kAuto,  // fanotify where the kernel and the rights are there for it, else inotify
  kInotify,
  kFanotify,
};

// Logs which one it is, and why not the better one. Throws Error 502 when it cannot be had.
std::unique_ptr<ChangeSource> MakeChangeSource(SourceKind kind);

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_MAKE_CHANGE_SOURCE_H_
