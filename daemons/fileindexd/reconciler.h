// Making the index agree with the disk.

#ifndef QUARRY_DAEMONS_FILEINDEXD_RECONCILER_H_
#define QUARRY_DAEMONS_FILEINDEXD_RECONCILER_H_

#include <cstdint>
#include <optional>
#include <set>
#include <string>
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
  SetAside& aside;
};

// Walks places and changes only the documents that differ from what is there. Does not recurse;
// holds the names in one directory at a time and those of the directories still to come. One
// thread. Throws Error, and Interrupted when the worker is to stop; rests while it is to pause.
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

  // Removes documents that no directory leads to, wherever they claim to be, and returns how many.
  // Asks for all documents.
  std::uint64_t SweepOrphans();

  // Places that the last ReconcileAll() found wanted.
  std::uint64_t WantedCount() const { return wanted_; }

 private:
  struct Stop {
    std::string path;
    bool compared;  // its own document has been brought in line
    bool fresh;     // the index had nothing below it
  };

  void Walk(const std::string& path);
  void Push(const Stop& stop);
  void Run();
  void Visit(const Stop& stop);
  bool WasVisited(const std::string& path);
  void VisitPlace(const std::string& path);
  bool IsFresh(const std::string& dir);
  void VisitDirectory(const Stop& stop);
  void VisitEntry(const std::string& path, const std::optional<Document>& document, bool fresh);
  void CountDoubt(const std::string& path);
  void DropVanished(const std::string& path);
  void Drop(const std::string& path);
  void DropAroundFolders(const std::string& path);

  PassTools tools_;
  std::vector<Stop> stops_;
  std::set<std::string> visited_folders_;
  std::uint64_t wanted_ = 0;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_RECONCILER_H_
