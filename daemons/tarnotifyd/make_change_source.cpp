#include "daemons/tarnotifyd/make_change_source.h"

#include "common/error.h"
#include "daemons/common/log.h"
#if __has_include("daemons/tarnotifyd/fanotify_source.h")
#include "daemons/tarnotifyd/fanotify_source.h"
#endif
#include "daemons/tarnotifyd/inotify_source.h"

namespace quarry::notify {
namespace {

std::unique_ptr<ChangeSource> MakeInotify() {
  auto source = std::make_unique<InotifySource>();
  daemon::LogInfo("Changes come from inotify");
  return source;
}

std::unique_ptr<ChangeSource> MakeFanotify() {
#if __has_include("daemons/tarnotifyd/fanotify_source.h")
  auto source = std::make_unique<FanotifySource>();
  daemon::LogInfo("Changes come from fanotify");
  return source;
#else
  throw Error(kErrorSystem, "Not built");
#endif
}

}  // namespace

std::unique_ptr<ChangeSource> MakeChangeSource(SourceKind kind) {
  if (kind == SourceKind::kInotify) return MakeInotify();
  if (kind == SourceKind::kFanotify) return MakeFanotify();
  try {
    return MakeFanotify();
  } catch (const Error& error) {
    daemon::LogInfo("fanotify is not to be had: " + error.reason());
    return MakeInotify();
  }
}

}  // namespace quarry::notify
