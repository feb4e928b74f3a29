// Where changes of the file system come from: the kernel's interfaces behind one face.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_CHANGE_SOURCE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_CHANGE_SOURCE_H_

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace quarry::notify {

// One change, in the kinds of a queue's line: exactly one of EVENT_MODIFY, EVENT_ATTR,
// EVENT_CREATE, EVENT_DELETE and EVENT_RENAME of fileindex/queue/event.h. A move that comes from
// outside of what is watched is a creation, one that leads outside a deletion.
struct Change {
  std::uint32_t kind = 0;
  bool is_dir = false;
  // Of EVENT_MODIFY: the writer has not closed the file, so more is likely to come.
  bool in_progress = false;
  std::string path;      // full path, any bytes
  std::string path_old;  // of a rename
};

// Takes what a source saw, in the order in which it happened.
class ChangeSink {
 public:
  virtual ~ChangeSink() = default;

  virtual void OnChange(const Change& change) = 0;

  // Changes at or below `directory` may have been missed up to now. "/" stands for everywhere.
  virtual void OnDoubt(const std::string& directory) = 0;
};

// How a source does at the moment.
struct SourceReport {
  std::string kind;              // "fanotify" or "inotify", the better one where both are at work
  std::size_t file_systems = 0;  // that are watched whole
  std::size_t directories = 0;   // that are watched one by one
  // Directories that SetDirectories() gave, in or at which something cannot be watched, and why.
  std::map<std::string, std::string> unwatched;
};

// Single-threaded: all calls come from one thread.
class ChangeSource {
 public:
  virtual ~ChangeSource() = default;

  // Readable when Read() has something to tell.
  virtual int Descriptor() const = 0;

  // Watches these directories, whole, in place of the earlier ones: full paths without a "/" at the
  // end, some perhaps below others. `ignore` names need not be watched at any depth. Every
  // directory that was not among the earlier ones is told to the sink as doubtful, by
  // itself or with one above it, once it is watched, now or by a later Read() or Refresh(); one
  // that was stays watched without a gap.
  virtual void SetDirectories(const std::vector<std::string>& directories,
                              const std::vector<std::string>& ignore, ChangeSink& sink) = 0;

  // Tells the sink what has happened, a bounded number of changes at a time. Does not block.
  virtual void Read(ChangeSink& sink) = 0;

  // Looks again at directories that could not be watched, or whose file system came back. To be
  // called every second or so.
  virtual void Refresh(ChangeSink& sink) = 0;

  // Adds to the report what is this source's.
  virtual void Report(SourceReport* report) const = 0;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_CHANGE_SOURCE_H_
