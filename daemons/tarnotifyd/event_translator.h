// From the kernel's events of one file system to changes below watched directories.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_EVENT_TRANSLATOR_H_
#define QUARRY_DAEMONS_TARNOTIFYD_EVENT_TRANSLATOR_H_

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnotifyd/change_source.h"
#include "daemons/tarnotifyd/directory_tree.h"
#include "daemons/tarnotifyd/fanotify_event.h"

namespace quarry::notify {

// The kernel folds what happened to one entry into one event, in the place of the first; even a
// rename that is undone and done again is told only twice. So an event names places to look at, and
// a rename both of its places. One thread.
class EventTranslator {
 public:
  // `tree` must outlive the translator.
  explicit EventTranslator(DirectoryTree& tree) : tree_(tree) {}

  // Tells what a buffer of events means. Bytes that are no events put every watched directory of
  // the tree in doubt, as does a queue that was full.
  void Translate(std::string_view events, ChangeSink& sink);

  // Tells what waits for an event that may not come. To be called every second or so: a kernel that
  // does not know renames tells of two halves, and what is written through a handle, as for a
  // client of an NFS server, has no place.
  void Finish(ChangeSink& sink);

  // How many calls of Finish() at least lie between two doubts because of files whose place could
  // not be found: one may be written to for hours.
  static constexpr int kDoubtPause = 30;
  // Files without a place that are kept apart.
  static constexpr std::size_t kMaxUnplaced = 1024;
  // Processes that are known to have moved something.
  static constexpr std::size_t kMaxMovers = 64;

 private:
  // The first half of a move, until the second is seen.
  struct Departure {
    std::string directory;
    std::string name;
    std::int32_t process = 0;
    bool is_dir = false;
  };
  struct Move {
    FanotifyEntry from;
    FanotifyEntry to;
    std::string_view target;
    bool is_dir = false;
  };

  void Translate(const FanotifyEvent& event, ChangeSink& sink);
  bool IsOfReplaced(const FanotifyEvent& event);
  bool TakeMove(const FanotifyEvent& event, ChangeSink& sink);
  void TellMove(const Move& move, ChangeSink& sink);
  void TellDeparture(ChangeSink& sink);
  void TellEntry(const FanotifyEvent& event, ChangeSink& sink);
  void KeepUnplaced(const FanotifyEvent& event);
  void ForgetLinkCount(const FanotifyEvent& event);
  bool HasToWait(const std::string& file, std::uint64_t mask);
  void PlaceFiles(ChangeSink& sink);
  void NoteDirectory(const FanotifyEvent& event, ChangeSink& sink);
  void DoubtMovedRoots(const FanotifyEntry& entry, ChangeSink& sink);
  std::vector<std::string> PathsOf(const FanotifyEntry& entry, ChangeSink& sink);
  void DoubtAll(ChangeSink& sink);

  DirectoryTree& tree_;
  std::optional<Departure> departure_;
  std::set<std::int32_t> movers_;                  // processes whose latest event was a move
  std::map<std::string, std::uint64_t> unplaced_;  // handles of files, and what happened to them
  std::set<std::string> waiting_;  // those of them that have waited for an explanation
  bool is_doubtful_ = false;       // there are files that have no place
  int pause_ = 0;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_EVENT_TRANSLATOR_H_
