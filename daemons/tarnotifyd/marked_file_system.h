// One file system whose changes the kernel tells.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_MARKED_FILE_SYSTEM_H_
#define QUARRY_DAEMONS_TARNOTIFYD_MARKED_FILE_SYSTEM_H_

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <string>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarnotifyd/directory_handle.h"
#include "daemons/tarnotifyd/directory_tree.h"
#include "daemons/tarnotifyd/event_translator.h"

namespace quarry::notify {

// What this kernel can tell of a move.
enum class MoveReports {
  kRenames,  // both places in one event, and which directory it was
  kHalves,   // a departure, then an arrival
};

// What this process may use: throws Error 502, "Cannot use fanotify: ...", where it may not mark
// file systems or may not open what their events name.
MoveReports ProbeFanotify();

// Each file system has a queue of its own in the kernel, so that one that is full puts no other one
// in doubt, and handles of one are never taken for those of another. The queue is bounded
// (/proc/sys/fs/fanotify/max_queued_events): for one that is not the kernel would take any amount
// of memory, and hold up whoever writes to the file system rather than lose an event, when this
// process stands still. What is lost instead is found by a rescan. One thread.
class MarkedFileSystem {
 public:
  // Marks the file system of the open directory `directory`, which may be of O_PATH. Throws Error
  // 502 when the file system, or this process, cannot do that.
  MarkedFileSystem(int directory, MoveReports reports);
  MarkedFileSystem(const MarkedFileSystem&) = delete;
  MarkedFileSystem& operator=(const MarkedFileSystem&) = delete;

  int Descriptor() const { return fd_.get(); }
  dev_t device() const { return device_; }
  // Whether the kernel still has the mark, which it drops when the file system is unmounted. Where
  // the kernel does not show its marks, it has.
  bool IsMarked() const;

  DirectoryTree& tree() { return tree_; }
  // Throws Error 502, and has added nothing, when this process cannot find directories here.
  void AddRoot(const std::string& handle, const std::string& path);
  void RemoveRoot(const std::string& path);
  bool IsUnused() const { return tree_.Roots().empty(); }

  // Tells what a bounded number of events mean. They are fetched faster than they are told, so that
  // the kernel's queue is filled only by those who make more than this holds.
  void Read(ChangeSink& sink);
  // See EventTranslator::Finish().
  void Finish(ChangeSink& sink);

 private:
  // Whole events, as many as were delivered at once.
  using Delivery = std::vector<char>;

  bool ShowsMark() const;
  void TellAll(ChangeSink& sink);
  void Guarded(const std::function<void()>& action);
  void Fetch(std::deque<Delivery>* deliveries, std::size_t* allowance, ChangeSink& sink);

  const dev_t device_;
  UniqueFd fd_;
  MountedDirectories directories_;
  DirectoryTree tree_;
  EventTranslator translator_;
  Delivery buffer_;
  const bool shows_marks_;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_MARKED_FILE_SYSTEM_H_
