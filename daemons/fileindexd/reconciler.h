// Making the index agree with the disk.

#ifndef QUARRY_DAEMONS_FILEINDEXD_RECONCILER_H_
#define QUARRY_DAEMONS_FILEINDEXD_RECONCILER_H_

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>
#include <vector>

#include "daemons/fileindexd/document_writer.h"
#include "daemons/fileindexd/gate.h"
#include "daemons/fileindexd/index.h"
#include "daemons/fileindexd/progress.h"
#include "daemons/fileindexd/survey.h"

namespace quarry::fileindexd {

// What one pass works with. All of it outlives what is made from it.
struct PassTools {
  Index& index;
  const Survey& survey;
  DocumentWriter& writer;
  TaskLane& lane;
  Gate& gate;
  Progress& progress;
};

// Walks places and changes only the documents that differ from what is there. Does not recurse;
// holds one directory at a time and the names of the directories still to come. One thread. Throws
// Error, and Interrupted when the worker is to stop; rests while it is to pause.
class Reconciler {
 public:
  explicit Reconciler(const PassTools& tools) : tools_(tools) {}

  // Brings the documents at and below the place in line with the disk and with the folder list. The
  // changes are handed to the lane, and are complete when it is drained.
  void Reconcile(const std::string& path);

  // The whole share: every folder, and what lies in none.
  void ReconcileAll(const std::string& share_root);

  // One place, without what lies below it. `document` is what the index has there.
  void Bring(const std::string& path, const Place& place, const std::optional<Document>& document);

  // Removes documents that no directory leads to. Asks for all paths at once.
  void SweepOrphans(const std::string& share_root);

  // Places that were found wanted since this object was made.
  std::uint64_t WantedCount() const { return wanted_; }

 private:
  struct Stop {
    std::string path;
    bool compared;  // its own document has been brought in line
  };
  using Documents = std::unordered_map<std::string, Document>;

  void Push(const std::string& path, bool compared);
  void Run();
  void VisitPlace(const std::string& path);
  void VisitDirectory(const std::string& dir);
  void VisitEntry(const std::string& path, const Place& place, Documents& documents);
  Documents TakeChildren(const std::string& dir);
  void Drop(const std::string& path);
  void DropAroundFolders(const std::string& path);

  PassTools tools_;
  std::vector<Stop> stops_;
  std::set<std::string> walked_folders_;
  std::uint64_t wanted_ = 0;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_RECONCILER_H_
