#include "daemons/fileindexd/operation_handler.h"

#include "common/file_util.h"
#include "daemons/common/log.h"
#include "daemons/fileindexd/stamps.h"

namespace quarry::fileindexd {

using fileindex::OP_ATTR;
using fileindex::OP_DELETE;
using fileindex::OP_FULL_REINDEX;
using fileindex::OP_INDEX;
using fileindex::OP_NONE;
using fileindex::OP_REINDEX;
using fileindex::OP_RENAME;
using fileindex::OP_UPDATE_CFG;

namespace {

bool IsOfKind(const std::optional<Document>& document, PlaceKind kind) {
  return document && document->is_dir == (kind == PlaceKind::kDirectory);
}

// Whether a file's document was made of the file that is there now, and not, as when a pass is done
// again, of one that has taken its old place since. A directory's is good in any case: what lies
// below it is compared afterwards.
bool IsSameFile(const Document& document, const Place& place) {
  return document.is_dir || document.content_stamp.empty() ||
         SameInode(document.attribute_stamp, place.attribute_stamp);
}

}  // namespace

OperationHandler::OperationHandler(const PassTools& tools, const std::string& share_root)
    : tools_(tools), reconciler_(tools), share_root_(share_root) {}

void OperationHandler::Handle(const Operation& operation) {
  if (operation.kind == OP_FULL_REINDEX) return HandleFullReindex();
  const std::string path = Canonical(operation.path);
  if (path.empty()) {
    daemon::LogWarning("Ignoring an operation on a place that cannot be: " + operation.path);
    return;
  }
  HandlePlace(operation, path);
  if (operation.kind == OP_ATTR) return;
  parents_.insert(Dirname(path));
  if (!operation.old_path.empty()) parents_.insert(Dirname(Canonical(operation.old_path)));
}

void OperationHandler::HandlePlace(const Operation& operation, const std::string& path) {
  switch (operation.kind) {
    case OP_DELETE:
    case OP_INDEX:
      return HandleIndex(path);
    case OP_ATTR:
      return HandleAttributes(path);
    case OP_RENAME:
      return HandleRename(path, Canonical(operation.old_path));
    case OP_UPDATE_CFG:
    case OP_REINDEX:
      return reconciler_.Reconcile(path);
    case OP_FULL_REINDEX:
    case OP_NONE:
      return;
  }
}

void OperationHandler::RefreshParents() {
  for (const std::string& path : parents_) {
    tools_.gate.Pass();
    RefreshDirectory(path);
  }
  parents_.clear();
}

void OperationHandler::RefreshDirectory(const std::string& path) {
  const Finding finding = tools_.survey.Examine(path);
  if (finding.verdict != Verdict::kWanted || finding.place.kind != PlaceKind::kDirectory) return;
  tools_.lane.Settle(path);
  tools_.aside.Try(path, [&] {
    const std::optional<Document> document = tools_.index.Find(path);
    // One that is not there yet comes with an event of its own.
    if (!IsOfKind(document, PlaceKind::kDirectory)) return;
    reconciler_.Bring(path, finding.place, document);
  });
}

// Whether the line spoke of a deletion or of a change: what is there now is indexed, what is not
// there is removed.
void OperationHandler::HandleIndex(const std::string& path) {
  const Finding finding = tools_.survey.Examine(path);
  if (finding.verdict == Verdict::kWanted && finding.place.kind == PlaceKind::kFile) {
    tools_.writer.Upsert(path, tools_.survey.WantsContent(path, finding.place));
  } else {
    reconciler_.Reconcile(path);
  }
}

void OperationHandler::HandleAttributes(const std::string& path) {
  const Finding finding = tools_.survey.Examine(path);
  if (finding.verdict != Verdict::kWanted) return reconciler_.Reconcile(path);
  tools_.lane.Settle(path);
  tools_.aside.Try(path, [&] {
    if (IsOfKind(tools_.index.Find(path), finding.place.kind)) {
      tools_.writer.SetAttributes(path);
    } else {
      reconciler_.Reconcile(path);
    }
  });
}

void OperationHandler::MoveRenamed(const Operation& rename) {
  const std::string path = Canonical(rename.path);
  if (!path.empty()) MoveRenamed(path, Canonical(rename.old_path));
}

void OperationHandler::MoveRenamed(const std::string& new_path, const std::string& old_path) {
  const bool aside = old_path.empty() || tools_.survey.rules()->TouchesPaused(old_path) ||
                     tools_.survey.rules()->TouchesPaused(new_path);
  if (!aside && !PathsMeet(new_path, old_path)) {
    for (const auto& roots : RenameRoots(new_path, old_path)) {
      const std::string& to = roots.first;
      const std::string& from = roots.second;
      tools_.aside.Try(from + " -> " + to, [&] { MoveDocuments(to, from); });
    }
  }
}

void OperationHandler::HandleRename(const std::string& new_path, const std::string& old_path) {
  MoveRenamed(new_path, old_path);
  // Moving documents is only a short cut. What was missing at the old place, or has to change
  // because of the new one, is found by comparing.
  if (!old_path.empty()) reconciler_.Reconcile(old_path);
  reconciler_.Reconcile(new_path);
}

// The places below which documents can be moved as they are: the new place itself, or, for a share
// that was renamed and is not indexed as a whole, each of its folders.
std::vector<std::pair<std::string, std::string>> OperationHandler::RenameRoots(
    const std::string& new_path, const std::string& old_path) const {
  const Survey::Rules rules = tools_.survey.rules();
  if (rules->Governing(new_path) != nullptr) return {{new_path, old_path}};
  std::vector<std::pair<std::string, std::string>> roots;
  std::string last;
  for (const FolderRule* folder : rules->FoldersBelow(new_path)) {
    if (!last.empty() && PathsMeet(last, folder->full_path)) continue;
    last = folder->full_path;
    roots.emplace_back(last, old_path + last.substr(new_path.size()));
  }
  return roots;
}

void OperationHandler::MoveDocuments(const std::string& new_path, const std::string& old_path) {
  tools_.gate.Pass();
  const Finding finding = tools_.survey.Examine(new_path);
  if (finding.verdict != Verdict::kWanted) return;
  tools_.lane.Drain();
  const std::optional<Document> document = tools_.index.Find(old_path);
  if (!IsOfKind(document, finding.place.kind) || !IsSameFile(*document, finding.place)) return;
  tools_.writer.Rename(new_path, old_path);
  const bool same_kind = GetFileExtension(new_path, true) == GetFileExtension(old_path, true);
  if (finding.place.kind == PlaceKind::kFile && !same_kind) {
    // How a file is read depends on its extension.
    tools_.writer.Upsert(new_path, tools_.survey.WantsContent(new_path, finding.place));
  }
}

void OperationHandler::HandleFullReindex() {
  reconciler_.ReconcileAll(share_root_);
}

bool OperationHandler::RemoveOrphans() {
  // Documents of paused folders are counted, too, but were not walked over.
  if (tools_.index.Count() <= reconciler_.WantedCount()) return false;
  const std::uint64_t removed = reconciler_.SweepOrphans();
  if (removed == 0) return false;
  daemon::LogWarning("Removed " + std::to_string(removed) + " documents from the index of " +
                     share_root_ + " that no directory led to");
  return true;
}

}  // namespace quarry::fileindexd
