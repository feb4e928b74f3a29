#include "daemons/tarnotifyd/make_change_source.h"

#include <utility>

#include "common/error.h"
#include "daemons/common/log.h"
#include "daemons/tarnotifyd/combined_source.h"
#include "daemons/tarnotifyd/fanotify_source.h"
#include "daemons/tarnotifyd/inotify_source.h"

namespace quarry::notify {
namespace {

std::unique_ptr<ChangeSource> MakeInotify() {
  auto source = std::make_unique<InotifySource>();
  daemon::LogInfo("Changes come from inotify");
  return source;
}

std::unique_ptr<ChangeSource> MakeFanotify() {
  auto fanotify = std::make_unique<FanotifySource>();
  const FanotifySource& file_systems = *fanotify;
  auto source =
      std::make_unique<CombinedSource>(std::move(fanotify), std::make_unique<InotifySource>(),
                                       [&file_systems] { return file_systems.Unwatchable(); });
  daemon::LogInfo("Changes come from fanotify, and from inotify where a file system lacks it");
  return source;
}

}  // namespace

std::unique_ptr<ChangeSource> MakeChangeSource(SourceKind kind) {
  if (kind == SourceKind::kInotify) return MakeInotify();
  if (kind == SourceKind::kFanotify) return MakeFanotify();
  try {
    return MakeFanotify();
  } catch (const Error& error) {
    daemon::LogInfo(error.reason());
    return MakeInotify();
  }
}

}  // namespace quarry::notify
