#include "daemons/tarnotifyd/event_translator.h"

#include <sys/fanotify.h>

#include <algorithm>
#include <cstddef>
#include <utility>

#include "fileindex/queue/event.h"

namespace quarry::notify {
namespace {

constexpr std::uint64_t kAppeared = FAN_CREATE | FAN_MOVED_TO;
constexpr std::uint64_t kVanished = FAN_DELETE | FAN_MOVED_FROM;
constexpr std::uint64_t kMoves = FAN_RENAME | FAN_MOVED_TO;
constexpr std::uint64_t kWritten = FAN_MODIFY | FAN_CLOSE_WRITE;

bool IsDirectory(const FanotifyEvent& event) {
  return (event.mask & FAN_ONDIR) != 0;
}

// Whether `event` says `kind` and nothing else.
bool IsOnly(const FanotifyEvent& event, std::uint64_t kind) {
  return (event.mask & ~std::uint64_t{FAN_ONDIR}) == kind;
}

Change MakeChange(std::uint32_t kind, bool is_dir, const std::string& path) {
  Change change;
  change.kind = kind;
  change.is_dir = is_dir;
  change.path = path;
  return change;
}

// What there is to say about one entry, in an order that could have led to what is there now.
std::vector<Change> ChangesOf(std::uint64_t mask, const std::string& path) {
  const bool is_dir = (mask & FAN_ONDIR) != 0;
  std::vector<Change> changes;
  if ((mask & kAppeared) != 0) {
    changes.push_back(MakeChange(fileindex::EVENT_CREATE, is_dir, path));
  } else if ((mask & kWritten) != 0 && (mask & kVanished) == 0) {
    changes.push_back(MakeChange(fileindex::EVENT_MODIFY, is_dir, path));
    changes.back().in_progress = (mask & FAN_CLOSE_WRITE) == 0;
  } else if ((mask & FAN_ATTRIB) != 0 && (mask & kVanished) == 0) {
    changes.push_back(MakeChange(fileindex::EVENT_ATTR, is_dir, path));
  }
  if ((mask & kVanished) != 0) {
    changes.push_back(MakeChange(fileindex::EVENT_DELETE, is_dir, path));
  }
  return changes;
}

}  // namespace

void EventTranslator::Translate(std::string_view events, ChangeSink& sink) {
  FanotifyEvent event;
  for (;;) {
    switch (TakeFanotifyEvent(&events, &event)) {
      case FanotifyParsing::kEvent:
        Translate(event, sink);
        break;
      case FanotifyParsing::kMalformed:
        tree_.Forget();
        DoubtAll(sink);
        return;
      case FanotifyParsing::kEnd:
        return;
    }
  }
}

void EventTranslator::Translate(const FanotifyEvent& event, ChangeSink& sink) {
  if ((event.mask & FAN_Q_OVERFLOW) != 0) {
    TellDeparture(sink);
    // A rename may be among what was lost.
    tree_.Forget();
    DoubtAll(sink);
  } else if (IsOfReplaced(event)) {
    // Nobody finds it under the name that it has lost.
  } else if (!TakeMove(event, sink)) {
    TellEntry(event, sink);
  }
}

// Whether the event says no more than that the file in whose place the same process has just moved
// another one has a name less.
bool EventTranslator::IsOfReplaced(const FanotifyEvent& event) {
  const bool has_moved = movers_.erase(event.process) > 0;
  if ((event.mask & kMoves) != 0 && movers_.size() < kMaxMovers) movers_.insert(event.process);
  return has_moved && event.entry.directory.empty() && IsOnly(event, FAN_ATTRIB);
}

// Whether the event is a move, or half of one that may still become whole.
bool EventTranslator::TakeMove(const FanotifyEvent& event, ChangeSink& sink) {
  if ((event.mask & FAN_RENAME) != 0) {
    TellMove({event.entry, event.new_entry, event.target, IsDirectory(event)}, sink);
    return true;
  }
  if (departure_ && IsOnly(event, FAN_MOVED_TO) && departure_->process == event.process &&
      departure_->is_dir == IsDirectory(event)) {
    const Departure from = *std::move(departure_);
    departure_.reset();
    TellMove({{from.directory, from.name}, event.entry, event.target, from.is_dir}, sink);
    return true;
  }
  TellDeparture(sink);
  if (!IsOnly(event, FAN_MOVED_FROM)) return false;
  departure_ = Departure{std::string(event.entry.directory), std::string(event.entry.name),
                         event.process, IsDirectory(event)};
  return true;
}

void EventTranslator::Finish(ChangeSink& sink) {
  TellDeparture(sink);
  PlaceFiles(sink);
}

void EventTranslator::TellDeparture(ChangeSink& sink) {
  if (!departure_) return;
  const Departure from = *std::move(departure_);
  departure_.reset();
  FanotifyEvent event;
  event.mask = FAN_MOVED_FROM | (from.is_dir ? FAN_ONDIR : 0);
  event.entry = {from.directory, from.name};
  TellEntry(event, sink);
}

void EventTranslator::TellMove(const Move& move, ChangeSink& sink) {
  const std::vector<std::string> from = PathsOf(move.from, sink);
  if (move.is_dir) tree_.Removed(move.target);
  const std::vector<std::string> to = PathsOf(move.to, sink);
  // What lies below was perhaps found to be out of reach as long as it was outside.
  if (move.is_dir && from.empty() && !to.empty()) tree_.Forget();
  if (move.is_dir) DoubtMovedRoots(move.from, sink);
  if (move.is_dir) DoubtMovedRoots(move.to, sink);
  // A place that is watched under several paths has as many before and after.
  const std::size_t both = std::min(from.size(), to.size());
  for (std::size_t i = 0; i < both; ++i) {
    Change change = MakeChange(fileindex::EVENT_RENAME, move.is_dir, to[i]);
    change.path_old = from[i];
    sink.OnChange(change);
  }
  for (std::size_t i = both; i < from.size(); ++i) {
    sink.OnChange(MakeChange(fileindex::EVENT_DELETE, move.is_dir, from[i]));
  }
  for (std::size_t i = both; i < to.size(); ++i) {
    sink.OnChange(MakeChange(fileindex::EVENT_CREATE, move.is_dir, to[i]));
  }
}

void EventTranslator::TellEntry(const FanotifyEvent& event, ChangeSink& sink) {
  if (event.entry.directory.empty()) return KeepUnplaced(event);
  if ((event.mask & (FAN_CREATE | FAN_DELETE)) != 0) ForgetLinkCount(event);
  if (IsDirectory(event)) NoteDirectory(event, sink);
  for (const std::string& path : PathsOf(event.entry, sink)) {
    for (const Change& change : ChangesOf(event.mask, path)) sink.OnChange(change);
  }
}

// The event is about a file that was not reached through a directory, or not through one that still
// has it.
void EventTranslator::KeepUnplaced(const FanotifyEvent& event) {
  if (event.target.empty() || (event.mask & (kWritten | FAN_ATTRIB)) == 0) return;
  if (unplaced_.size() < kMaxUnplaced) {
    unplaced_[std::string(event.target)] |= event.mask;
  } else {
    is_doubtful_ = true;
  }
}

// Before a deletion, or another name, is told there is an event which says of the file as such that
// it has a name less or more. This is what was meant.
void EventTranslator::ForgetLinkCount(const FanotifyEvent& event) {
  const auto file = unplaced_.find(std::string(event.target));
  if (file != unplaced_.end() && (file->second & kWritten) == 0) unplaced_.erase(file);
}

// Of what is not explained yet: the event that does it may still be on its way.
bool EventTranslator::HasToWait(const std::string& file, std::uint64_t mask) {
  return (mask & kWritten) == 0 && waiting_.erase(file) == 0;
}

void EventTranslator::PlaceFiles(ChangeSink& sink) {
  std::map<std::string, std::uint64_t> kept;
  std::vector<std::string> paths;
  for (const auto& [file, mask] : unplaced_) {
    if (HasToWait(file, mask)) {
      kept[file] = mask;
      continue;
    }
    if (!tree_.PathsOfFile(file, &paths)) is_doubtful_ = true;
    for (const std::string& path : paths) {
      for (const Change& change : ChangesOf(mask, path)) sink.OnChange(change);
    }
  }
  waiting_.clear();
  for (const auto& [file, mask] : kept) waiting_.insert(file);
  unplaced_ = std::move(kept);
  if (pause_ > 0) --pause_;
  if (!is_doubtful_ || pause_ > 0) return;
  is_doubtful_ = false;
  pause_ = kDoubtPause;
  DoubtAll(sink);
}

void EventTranslator::NoteDirectory(const FanotifyEvent& event, ChangeSink& sink) {
  if ((event.mask & (FAN_MOVED_FROM | FAN_MOVED_TO)) != 0) {
    tree_.Forget();  // which directory it was is not said
    DoubtMovedRoots(event.entry, sink);
  } else if ((event.mask & FAN_DELETE) != 0) {
    tree_.Removed(event.target);
  } else if ((event.mask & FAN_CREATE) != 0 && !event.target.empty()) {
    tree_.Placed(event.target, event.entry.directory, event.entry.name);
  }
}

// Whoever has looked at a watched directory while it was away has found nothing there, and it may
// be back before anybody notices that it was away.
void EventTranslator::DoubtMovedRoots(const FanotifyEntry& entry, ChangeSink& sink) {
  for (const std::string& root : tree_.RootsAt(entry.directory, entry.name)) sink.OnDoubt(root);
}

std::vector<std::string> EventTranslator::PathsOf(const FanotifyEntry& entry, ChangeSink& sink) {
  std::vector<std::string> paths;
  if (!tree_.PathsOf(entry.directory, entry.name, &paths)) DoubtAll(sink);
  return paths;
}

void EventTranslator::DoubtAll(ChangeSink& sink) {
  for (const std::string& root : tree_.Roots()) sink.OnDoubt(root);
}

}  // namespace quarry::notify
