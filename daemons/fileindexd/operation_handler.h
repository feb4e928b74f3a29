// What is done about each kind of pending operation.

#ifndef QUARRY_DAEMONS_FILEINDEXD_OPERATION_HANDLER_H_
#define QUARRY_DAEMONS_FILEINDEXD_OPERATION_HANDLER_H_

#include <set>
#include <string>
#include <utility>
#include <vector>

#include "daemons/fileindexd/reconciler.h"
#include "fileindex/queue/optree.h"

namespace quarry::fileindexd {

// An operation as a pass keeps it.
struct Operation {
  fileindex::FileIndexOP kind = fileindex::OP_NONE;
  std::string path;
  std::string old_path;  // of a rename
};

// An operation only says where to look: what is done follows from what is there now. Therefore an
// operation may be done late, or again, without harm. One thread; throws as the Reconciler does.
class OperationHandler {
 public:
  OperationHandler(const PassTools& tools, const std::string& share_root);

  // Hands what is to be done to the lane.
  void Handle(const Operation& operation);

  // Moves the documents that a rename speaks of, and leaves the comparing to what follows. To be
  // called for all renames of a pass before anything else: a walk that comes first would read anew
  // what only has to be moved.
  void MoveRenamed(const Operation& rename);

  // After the last operation: brings the attributes of the directories that the handled ones have
  // changed, of which no event tells, in line with the disk. A walk over the whole share does so
  // too.
  void RefreshParents();

  // Brings the whole share in line with the disk, documents of no folder included.
  void HandleFullReindex();

  // After HandleFullReindex and a commit: removes what that could not find, if there is anything.
  // Returns whether there was.
  bool RemoveOrphans();

 private:
  void HandlePlace(const Operation& operation, const std::string& path);
  void RefreshDirectory(const std::string& path);
  void HandleIndex(const std::string& path);
  void HandleAttributes(const std::string& path);
  void MoveRenamed(const std::string& new_path, const std::string& old_path);
  void HandleRename(const std::string& new_path, const std::string& old_path);
  std::vector<std::pair<std::string, std::string>> RenameRoots(const std::string& new_path,
                                                               const std::string& old_path) const;
  void MoveDocuments(const std::string& new_path, const std::string& old_path);

  PassTools tools_;
  Reconciler reconciler_;
  const std::string share_root_;
  std::set<std::string> parents_;  // of what was created, deleted or renamed
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_OPERATION_HANDLER_H_
