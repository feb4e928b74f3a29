#include "daemons/fileindexd/reconciler.h"

#include <algorithm>
#include <cstddef>
#include <utility>

#include "daemons/fileindexd/stamps.h"

namespace quarry::fileindexd {
namespace {

// Documents that are asked for at a time.
constexpr std::size_t kPage = 5000;

// The documents directly in a directory, in ascending order of paths, a page at a time.
class ChildCursor {
 public:
  // Of a `fresh` one there are none, and nobody is asked.
  ChildCursor(Index& index, const std::string& dir, bool fresh) : index_(index), dir_(dir) {
    if (!fresh) Load("");
  }

  // The next document, or null at the end.
  const Document* Get() const { return next_ < page_.size() ? &page_[next_] : nullptr; }

  // Gives it away and goes on.
  Document Take() {
    Document taken = std::move(page_[next_++]);
    if (next_ == page_.size() && page_.size() == kPage) Load(taken.path);
    return taken;
  }

 private:
  void Load(const std::string& after) {
    page_ = index_.Children(dir_, after, kPage);
    next_ = 0;
  }

  Index& index_;
  const std::string dir_;
  std::vector<Document> page_;
  std::size_t next_ = 0;
};

}  // namespace

void Reconciler::Push(const Stop& stop) {
  stops_.push_back(stop);
  tools_.progress.AddWaiting(stop.path);
}

void Reconciler::Reconcile(const std::string& path) {
  visited_folders_.clear();
  Walk(path);
}

void Reconciler::Walk(const std::string& path) {
  Push({path, false, false});
  Run();
}

void Reconciler::ReconcileAll(const std::string& share_root) {
  visited_folders_.clear();
  wanted_ = 0;
  Walk(share_root);
  // A walk does not come by a folder when something on the way to it is unwanted.
  for (const FolderRule* folder : tools_.survey.rules()->FoldersBelow(share_root)) {
    if (visited_folders_.count(folder->full_path) == 0) Walk(folder->full_path);
  }
}

void Reconciler::Run() {
  while (!stops_.empty()) {
    tools_.gate.Pass();
    const Stop stop = std::move(stops_.back());
    stops_.pop_back();
    tools_.progress.Begin(stop.path);
    tools_.aside.Try(stop.path + "/", [&] { Visit(stop); });
    tools_.progress.TakeWaiting(stop.path);
  }
}

void Reconciler::Visit(const Stop& stop) {
  if (stop.compared) {
    VisitDirectory(stop);
  } else {
    VisitPlace(stop.path);
  }
}

// Whether it is a folder's own place to which another way led already.
bool Reconciler::WasVisited(const std::string& path) {
  return tools_.survey.rules()->At(path) != nullptr && !visited_folders_.insert(path).second;
}

void Reconciler::VisitPlace(const std::string& path) {
  if (WasVisited(path)) return;
  const Finding finding = tools_.survey.Examine(path);
  switch (finding.verdict) {
    case Verdict::kWanted:
      tools_.lane.Settle(path);
      ++wanted_;
      Bring(path, finding.place, tools_.index.Find(path));
      if (finding.place.kind == PlaceKind::kDirectory) Push({path, true, IsFresh(path)});
      return;
    case Verdict::kUnwanted:
      return Drop(path);
    case Verdict::kDoubtful:
      return CountDoubt(path);
    case Verdict::kAside:
      return;
  }
}

// Where a whole tree is new, as at a first index, its directories need not be asked for one by one.
bool Reconciler::IsFresh(const std::string& dir) {
  return tools_.index.PathsBelow(dir, "", 1).empty();
}

void Reconciler::VisitDirectory(const Stop& stop) {
  const std::string& dir = stop.path;
  std::vector<std::string> names;
  if (tools_.survey.files().List(dir, names) != PlaceKind::kDirectory) {
    // It has changed since it was seen. If it is a directory again, another event tells of it.
    if (tools_.survey.Examine(dir).verdict == Verdict::kUnwanted) return Drop(dir);
    tools_.progress.Failed(dir, dir + ": the directory cannot be read");
    return;
  }
  std::sort(names.begin(), names.end());
  // What is still being done below the directory would make the answers out of date.
  if (!stop.fresh) tools_.lane.SettleBelow(dir);
  ChildCursor documents(tools_.index, dir, stop.fresh);
  for (const std::string& name : names) {
    tools_.gate.Pass();
    const std::string path = dir + "/" + name;
    while (documents.Get() && documents.Get()->path < path) DropVanished(documents.Take().path);
    if (documents.Get() && documents.Get()->path == path) {
      VisitEntry(path, documents.Take(), stop.fresh);
    } else {
      VisitEntry(path, std::nullopt, stop.fresh);
    }
  }
  while (documents.Get()) DropVanished(documents.Take().path);
}

void Reconciler::DropVanished(const std::string& path) {
  tools_.gate.Pass();
  if (!tools_.survey.IsAside(path)) Drop(path);
}

void Reconciler::VisitEntry(const std::string& path, const std::optional<Document>& document,
                            bool fresh) {
  if (WasVisited(path)) return;
  const Finding finding = tools_.survey.ExamineEntry(path);
  switch (finding.verdict) {
    case Verdict::kWanted:
      ++wanted_;
      Bring(path, finding.place, document);
      if (finding.place.kind == PlaceKind::kDirectory) Push({path, true, fresh});
      return;
    case Verdict::kUnwanted:
      // A folder below it has to be found though there is no way through.
      if (document || tools_.survey.rules()->HasFolderBelow(path)) Drop(path);
      return;
    case Verdict::kDoubtful:
      return CountDoubt(path);
    case Verdict::kAside:
      return;
  }
}

void Reconciler::CountDoubt(const std::string& path) {
  tools_.progress.Failed(path, path + ": what is there cannot be told");
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
  for (const FolderRule* folder : tools_.survey.rules()->FoldersBelow(path)) {
    const std::string child =
        folder->full_path.substr(0, folder->full_path.find('/', path.size() + 1));
    if (stops_.empty() || stops_.back().path != child) Push({child, false, false});
  }
  tools_.lane.Settle(path);
  for (ChildCursor documents(tools_.index, path, false); documents.Get();) {
    const std::string child = documents.Take().path;
    if (!tools_.survey.rules()->HasFolderBelow(child) && !tools_.survey.rules()->At(child)) {
      DropVanished(child);
    }
  }
  tools_.writer.Remove(path);
}

std::uint64_t Reconciler::SweepOrphans() {
  std::uint64_t removed = 0;
  std::string after;
  for (;;) {
    const std::vector<std::string> paths = tools_.index.PathsBelow("", after, kPage);
    for (const std::string& path : paths) {
      tools_.gate.Pass();
      if (tools_.survey.Examine(path).verdict != Verdict::kUnwanted) continue;
      tools_.writer.Remove(path);
      ++removed;
    }
    if (paths.size() < kPage) return removed;
    after = paths.back();
  }
}

}  // namespace quarry::fileindexd
