// Folding the changes of one queue, so that a busy file does not fill it.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_CHANGE_FOLD_H_
#define QUARRY_DAEMONS_TARNOTIFYD_CHANGE_FOLD_H_

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "daemons/tarnotifyd/change_source.h"

namespace quarry::notify {

using Clock = std::chrono::steady_clock;

// Once a path has had a line, content and attribute changes of it are held back: for
// kBusyPause while its writer keeps it open, else for kPause. The last one is never lost. What
// comes and goes (creations, deletions, renames) passes at once, behind whatever was held back and
// concerns the same files. One thread.
class ChangeFold {
 public:
  static constexpr std::chrono::milliseconds kPause{500};
  static constexpr std::chrono::milliseconds kBusyPause{5'000};
  // Paths that are remembered at a time; changes of others pass unfolded.
  static constexpr std::size_t kMaxPaths = std::size_t{1} << 16;

  void Add(const Change& change, Clock::time_point now);

  // Lets out what was held back long enough by now, or all of it.
  void Release(Clock::time_point now);
  void ReleaseAll();

  // When Release() has something to do; nothing while no path is remembered.
  std::optional<Clock::time_point> NextRelease() const;

  // The changes that are let out and not yet taken, in order.
  std::size_t Ready() const { return ready_.size(); }
  std::vector<Change> Take();

  // Forgets everything.
  void Clear();

 private:
  struct Entry;
  using Entries = std::map<std::string, Entry, std::less<>>;
  using Agenda = std::multimap<Clock::time_point, Entries::iterator>;

  struct Entry {
    Clock::time_point last;     // when its last line was let out
    std::uint64_t batch = 0;    // in which batch that was, and
    std::uint32_t written = 0;  // what that batch says of the path
    std::uint32_t held = 0;     // what is held back
    bool is_dir = false;
    bool busy = false;     // its writer has not closed it
    Agenda::iterator due;  // when what is held is let out, or the entry is dropped
  };

  void AddTouch(const Change& change, Clock::time_point now);
  void AddCreation(const Change& change, Clock::time_point now);
  void Pass(const Change& change, Clock::time_point now);
  void LetOut(Entries::iterator entry, Clock::time_point now);
  void Schedule(Entries::iterator entry, Clock::time_point due);
  void ForEachAt(const std::string& path, bool and_below,
                 const std::function<void(Entries::iterator)>& action);
  void Forget(const std::string& path, bool and_below);
  void Drop(Entries::iterator entry);

  std::vector<Change> ready_;
  std::uint64_t batch_ = 1;
  Entries entries_;
  Agenda agenda_;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_CHANGE_FOLD_H_
