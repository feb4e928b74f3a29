#include "daemons/tarnotifyd/change_fold.h"

#include <algorithm>

#include "fileindex/queue/event.h"

namespace quarry::notify {
namespace {

using namespace fileindex;

// Whether who acts on lines of the kinds `written`, which nobody has read yet, need not be told of
// `kind` too: the file is read after both.
bool Covers(std::uint32_t written, std::uint32_t kind) {
  if ((written & (EVENT_CREATE | EVENT_MODIFY)) != 0) return true;
  return (written & kind) == kind;
}

}  // namespace

void ChangeFold::Add(const Change& change, Clock::time_point now) {
  switch (change.kind) {
    case EVENT_MODIFY:
    case EVENT_ATTR:
      return AddTouch(change, now);
    case EVENT_CREATE:
      return AddCreation(change, now);
    case EVENT_RENAME:
      // What is held back of the old path still has it when it is let out.
      ForEachAt(change.path_old, change.is_dir, [&](auto entry) { LetOut(entry, now); });
      Forget(change.path_old, change.is_dir);
      break;
    default:
      break;
  }
  Forget(change.path, change.is_dir);
  ready_.push_back(change);
}

void ChangeFold::AddTouch(const Change& change, Clock::time_point now) {
  const auto entry = entries_.find(change.path);
  if (entry == entries_.end()) return Pass(change, now);
  Entry& known = entry->second;
  if (known.batch == batch_ && Covers(known.written, change.kind)) return;
  const auto due = known.last + (change.in_progress ? kBusyPause : kPause);
  if (now >= due && known.held == 0) return Pass(change, now);
  if (known.held == 0 || due < known.due->first) Schedule(entry, std::max(due, now));
  known.held |= change.kind;
  if (change.kind == EVENT_MODIFY) known.busy = change.in_progress;
}

void ChangeFold::AddCreation(const Change& change, Clock::time_point now) {
  const auto entry = entries_.find(change.path);
  if (entry != entries_.end()) {
    if (entry->second.batch == batch_ && (entry->second.written & EVENT_CREATE) != 0) return;
    entry->second.held = 0;
  }
  Pass(change, now);
}

// Lets it out at once, and remembers that.
void ChangeFold::Pass(const Change& change, Clock::time_point now) {
  ready_.push_back(change);
  if (entries_.size() >= kMaxPaths && entries_.count(change.path) == 0) return;
  const auto [entry, is_new] = entries_.try_emplace(change.path);
  Entry& known = entry->second;
  if (is_new) known.due = agenda_.end();
  known.written = change.kind | (known.batch == batch_ ? known.written : 0);
  known.batch = batch_;
  known.last = now;
  known.is_dir = change.is_dir;
  known.busy = change.in_progress;
  Schedule(entry, now + (change.in_progress ? kBusyPause : kPause));
}

// New content includes new attributes.
void ChangeFold::LetOut(Entries::iterator entry, Clock::time_point now) {
  Entry& known = entry->second;
  if (known.held == 0) return;
  const std::uint32_t kind = (known.held & EVENT_MODIFY) != 0 ? EVENT_MODIFY : EVENT_ATTR;
  known.held = 0;
  Pass(Change{kind, known.is_dir, known.busy, entry->first, ""}, now);
}

void ChangeFold::Release(Clock::time_point now) {
  while (!agenda_.empty() && agenda_.begin()->first <= now) {
    const auto entry = agenda_.begin()->second;
    if (entry->second.held != 0) {
      LetOut(entry, now);
    } else {
      Drop(entry);
    }
  }
}

void ChangeFold::ReleaseAll() {
  const auto now = Clock::time_point::max() - kBusyPause;
  for (auto entry = entries_.begin(); entry != entries_.end(); ++entry) LetOut(entry, now);
}

std::optional<Clock::time_point> ChangeFold::NextRelease() const {
  if (agenda_.empty()) return std::nullopt;
  return agenda_.begin()->first;
}

std::vector<Change> ChangeFold::Take() {
  ++batch_;
  return std::exchange(ready_, {});
}

void ChangeFold::Clear() {
  ready_.clear();
  agenda_.clear();
  entries_.clear();
}

void ChangeFold::Schedule(Entries::iterator entry, Clock::time_point due) {
  Agenda::iterator& place = entry->second.due;
  if (place != agenda_.end()) agenda_.erase(place);
  place = agenda_.emplace(due, entry);
}

void ChangeFold::ForEachAt(const std::string& path, bool and_below,
                           const std::function<void(Entries::iterator)>& action) {
  const auto self = entries_.find(path);
  if (self != entries_.end()) action(self);
  if (!and_below) return;
  const std::string prefix = path + "/";
  for (auto entry = entries_.lower_bound(prefix);
       entry != entries_.end() && entry->first.compare(0, prefix.size(), prefix) == 0;) {
    const auto current = entry++;
    action(current);
  }
}

void ChangeFold::Forget(const std::string& path, bool and_below) {
  ForEachAt(path, and_below, [this](auto entry) { Drop(entry); });
}

void ChangeFold::Drop(Entries::iterator entry) {
  if (entry->second.due != agenda_.end()) agenda_.erase(entry->second.due);
  entries_.erase(entry);
}

}  // namespace quarry::notify
