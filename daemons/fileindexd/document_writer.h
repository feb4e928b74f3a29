// Changing documents, several at a time, and coping with files that cannot be read.

#ifndef QUARRY_DAEMONS_FILEINDEXD_DOCUMENT_WRITER_H_
#define QUARRY_DAEMONS_FILEINDEXD_DOCUMENT_WRITER_H_

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "common/error.h"
#include "daemons/fileindexd/file_system.h"
#include "daemons/fileindexd/index.h"
#include "daemons/fileindexd/progress.h"
#include "daemons/fileindexd/set_aside.h"
#include "daemons/fileindexd/task_lane.h"

namespace quarry::fileindexd {

// Each member hands one change to the lane and returns; it may block until the lane has room and
// throws what an earlier change failed with. A change that fails because of its own file is counted
// and logged, any other failure ends the lane. What is set aside is left out. Documents that are to
// be made anew at the same time are made together; where that fails for one it is tried by itself.
// One thread calls.
class DocumentWriter {
 public:
  // Throws Error when it is doubtful that what is missing was deleted: the whole share is gone.
  using RemovalGuard = std::function<void()>;

  // What is given must outlive the writer, and the lane must be drained or ended before it.
  DocumentWriter(Index& index, FileSystem& files, TaskLane& lane, Progress& progress,
                 SetAside& aside, RemovalGuard may_remove);

  // The place's document is made anew, its content with `need_meta`. A place that has vanished
  // meanwhile loses its document.
  void Upsert(const std::string& path, bool need_meta);
  // The same where the index takes the place for a directory with documents below it.
  void ReplaceDirectory(const std::string& path, bool need_meta);
  // The place's document gets its attributes anew.
  void SetAttributes(const std::string& path);
  // The document of the place alone, or of all that lies below it too. Asks the guard first.
  void Remove(const std::string& path);
  void RemoveTree(const std::string& path);
  // Moves documents with nothing else in work; what was at the new place is removed before.
  void Rename(const std::string& new_path, const std::string& old_path);

 private:
  void Submit(const std::string& path, const std::string& name, std::function<void()> change);
  std::function<void()> Task(const std::string& path, const std::string& name,
                             std::function<void()> change);
  std::vector<bool> UpsertTogether(const std::vector<Wish>& wishes);
  void UpsertNow(const std::string& path, bool need_meta);
  void SetAttributesNow(const std::string& path);
  void RemoveTreeNow(const std::string& path);
  std::optional<Error> Attempt(const std::string& path, const std::function<void()>& change);
  void RequireOwnFault(const Error& error);
  bool IsGone(const std::string& path);
  void CountFailure(const std::string& path, const Error& error);

  Index& index_;
  FileSystem& files_;
  TaskLane& lane_;
  Progress& progress_;
  SetAside& aside_;
  RemovalGuard may_remove_;
  const TaskLane::Joint upsert_together_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_DOCUMENT_WRITER_H_
