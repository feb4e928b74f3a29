#include "daemons/fileindexd/reconciler.h"

#include <set>
#include <utility>

namespace quarry::fileindexd {
namespace {

// The device's number, which comes first, may be another one after each start of the machine; the
// rest tells well enough whether it is the same file in the same state.
bool SameAttributes(const std::string& a, const std::string& b) {
  const std::size_t rest_a = a.find(':');
  const std::size_t rest_b = b.find(':');
  if (rest_a == std::string::npos || rest_b == std::string::npos) return false;
  return a.compare(rest_a, std::string::npos, b, rest_b, std::string::npos) == 0;
}

}  // namespace

void Reconciler::Push(const std::string& path, bool compared) {
  stops_.push_back({path, compared});
  tools_.progress.AddWaiting(path);
}

void Reconciler::Reconcile(const std::string& path) {
  Push(path, false);
  Run();
}

void Reconciler::ReconcileAll(const std::string& share_root) {
  walked_folders_.clear();
  Reconcile(share_root);
  // A walk does not come by a folder when something on the way to it is unwanted.
  for (const FolderRule* folder : tools_.survey.rules()->FoldersBelow(share_root)) {
    if (walked_folders_.count(folder->full_path) == 0) Reconcile(folder->full_path);
  }
}

void Reconciler::Run() {
  while (!stops_.empty()) {
    tools_.gate.Pass();
    const Stop stop = std::move(stops_.back());
    stops_.pop_back();
    tools_.progress.Begin(stop.path);
    if (stop.compared) {
      VisitDirectory(stop.path);
    } else {
      VisitPlace(stop.path);
    }
    tools_.progress.TakeWaiting(stop.path);
  }
}

void Reconciler::VisitPlace(const std::string& path) {
  const Finding finding = tools_.survey.Examine(path);
  switch (finding.verdict) {
    case Verdict::kWanted:
      tools_.lane.Settle(path);
      ++wanted_;
      Bring(path, finding.place, tools_.index.Find(path));
      if (finding.place.kind == PlaceKind::kDirectory) Push(path, true);
      return;
    case Verdict::kUnwanted:
      return Drop(path);
    case Verdict::kDoubtful:
      tools_.progress.Failed(path, path + ": what is there cannot be told");
      return;
    case Verdict::kAside:
      return;
  }
}

Reconciler::Documents Reconciler::TakeChildren(const std::string& dir) {
  // What is still being done below the directory would make the answer out of date.
  tools_.lane.Settle(dir);
  Documents documents;
  for (Document& document : tools_.index.Children(dir)) {
    const std::string path = document.path;
    documents.emplace(path, std::move(document));
  }
  return documents;
}

void Reconciler::VisitDirectory(const std::string& dir) {
  std::vector<Entry> entries;
  const PlaceKind kind = tools_.survey.files().List(dir, entries);
  if (kind != PlaceKind::kDirectory) {
    // It has changed since it was seen; if it is a directory again, leave it to the event of that.
    const Verdict verdict = tools_.survey.Examine(dir).verdict;
    if (verdict == Verdict::kUnwanted) return Drop(dir);
    tools_.progress.Failed(dir, dir + ": the directory cannot be read");
    return;
  }
  if (tools_.survey.rules()->At(dir) != nullptr) walked_folders_.insert(dir);
  Documents documents = TakeChildren(dir);
  for (const Entry& entry : entries) {
    tools_.gate.Pass();
    VisitEntry(dir + "/" + entry.name, entry.place, documents);
  }
  for (const auto& [path, document] : documents) {
    if (!tools_.survey.IsAside(path)) Drop(path);
  }
}

// Takes the entry's document out of `documents` unless it is to be dropped.
void Reconciler::VisitEntry(const std::string& path, const Place& place, Documents& documents) {
  const Finding finding = tools_.survey.Judge(path, place);
  if (finding.verdict == Verdict::kUnwanted) {
    // A folder below it has to be found though there is no way through.
    if (documents.count(path) == 0 && tools_.survey.rules()->HasFolderBelow(path)) Drop(path);
    return;
  }
  std::optional<Document> document;
  if (auto node = documents.extract(path)) document = std::move(node.mapped());
  if (finding.verdict == Verdict::kDoubtful) {
    tools_.progress.Failed(path, path + ": what is there cannot be told");
  }
  if (finding.verdict != Verdict::kWanted) return;
  ++wanted_;
  Bring(path, finding.place, document);
  if (finding.place.kind == PlaceKind::kDirectory) Push(path, true);
}

void Reconciler::Bring(const std::string& path, const Place& place,
                       const std::optional<Document>& document) {
  const bool wants_content = tools_.survey.WantsContent(path, place);
  if (document && document->is_dir && place.kind == PlaceKind::kFile) {
    tools_.writer.ReplaceDirectory(path, wants_content);
    return;
  }
  const std::string stamp = wants_content ? place.content_stamp : std::string();
  if (!document || document->is_dir != (place.kind == PlaceKind::kDirectory) ||
      document->content_stamp != stamp) {
    tools_.writer.Upsert(path, wants_content);
  } else if (!SameAttributes(document->attribute_stamp, place.attribute_stamp)) {
    tools_.writer.SetAttributes(path);
  }
}

void Reconciler::Drop(const std::string& path) {
  if (tools_.survey.rules()->HasFolderBelow(path)) {
    DropAroundFolders(path);
  } else {
    tools_.writer.RemoveTree(path);
  }
}

// The document itself goes, and all below it that does not belong to a folder there.
void Reconciler::DropAroundFolders(const std::string& path) {
  std::set<std::string> below;
  for (const auto& [child, document] : TakeChildren(path)) below.insert(child);
  for (const FolderRule* folder : tools_.survey.rules()->FoldersBelow(path)) {
    below.insert(folder->full_path.substr(0, folder->full_path.find('/', path.size() + 1)));
  }
  tools_.writer.Remove(path);
  for (const std::string& child : below) Push(child, false);
}

void Reconciler::SweepOrphans(const std::string& share_root) {
  for (const std::string& path : tools_.index.PathsBelow(share_root)) {
    tools_.gate.Pass();
    if (tools_.survey.Examine(path).verdict == Verdict::kUnwanted) tools_.writer.Remove(path);
  }
}

}  // namespace quarry::fileindexd
