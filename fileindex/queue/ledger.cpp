#include "fileindex/queue/ledger.h"

#include <algorithm>
#include <iterator>
#include <string>

#include "fileindex/queue/large_pages.h"

namespace quarry::fileindex {
namespace {

// Below this, comparing names one by one is faster than hashing.
constexpr std::uint32_t kFewChildren = 4;

const std::string kUnnamed;

bool IsWork(FileIndexOP kind) {
  return kind == OP_INDEX || kind == OP_ATTR || kind == OP_REINDEX;
}

// Appends the shorter to the longer, and leaves the result in `to`.
template <typename T>
void Pour(std::vector<T>& from, std::vector<T>& to) {
  if (to.size() < from.size()) to.swap(from);
  to.insert(to.end(), std::make_move_iterator(from.begin()), std::make_move_iterator(from.end()));
  from.clear();
}

using Records = std::vector<std::shared_ptr<OP>>;

void Append(Records& from, Records& to) {
  to.insert(to.end(), std::make_move_iterator(from.begin()), std::make_move_iterator(from.end()));
  from.clear();
}

void AppendReversed(Records& from, Records& to) {
  to.insert(to.end(), std::make_move_iterator(from.rbegin()), std::make_move_iterator(from.rend()));
  from.clear();
}

// Appends one list to another, each with its front. Only the shorter one's records are touched.
void Join(Records& list, Records& front, Records& later, Records& later_front) {
  if (list.size() + front.size() >= later.size() + later_front.size()) {
    AppendReversed(later_front, list);
    Append(later, list);
    return;
  }
  AppendReversed(list, later_front);
  Append(front, later_front);
  list.swap(later);
  front.swap(later_front);
}

// Appends the records of `later` to those of `set`.
template <typename RecordSet>
void AppendSet(RecordSet& set, RecordSet& later) {
  for (std::size_t kind = 0; kind < set.kinds.size(); ++kind) {
    if (later.kinds[kind].recs.empty()) continue;
    set.kinds[kind].last = set.entered + later.kinds[kind].last;
    Pour(later.kinds[kind].recs, set.kinds[kind].recs);
  }
  set.entered += later.entered;
}

template <typename RecordSet>
bool IsEmpty(const RecordSet& set) {
  return std::all_of(set.kinds.begin(), set.kinds.end(),
                     [](const auto& of_kind) { return of_kind.recs.empty(); });
}

}  // namespace

OPNode::Books& Ledger::BooksOf(OPNode& node) {
  if (!node.books_) node.books_ = std::make_unique<OPNode::Books>();
  return *node.books_;
}

// `children` is open to everybody: what is found there is accounted for late rather than never.
void Ledger::Adopt(OPNode& node) {
  const std::size_t count = node.children.size();
  if (count == (node.books_ ? node.books_->adopted : 0)) return;
  OPNode::Books& books = BooksOf(node);
  if (books.adopted > count) {
    OPNode::Books anew;
    anew.records = std::move(books.records);
    books = std::move(anew);
  }
  while (books.adopted < count) AdoptNext(node, books);
}

void Ledger::AdoptNext(OPNode& node, OPNode::Books& books) {
  Place(node, books);
  if (books.adopted <= kFewChildren) return;
  // Those that were few have not been entered yet.
  const std::uint32_t last = books.adopted - 1;
  for (std::uint32_t at = last == kFewChildren ? 0 : last; at <= last; ++at) {
    EnterName(node, books, at);
  }
}

void Ledger::Place(OPNode& node, OPNode::Books& books) {
  OPNode& child = *node.children[books.adopted];
  child.place_ = books.adopted++;
  child.next_reindexable_ = child.next_movable_ = OPNode::kNone;
  Touch(child);
}

// Of several children of one name the first is found.
void Ledger::EnterName(OPNode& node, OPNode::Books& books, std::uint32_t place) {
  const std::string& name = node.children[place]->name;
  const std::uint32_t hash = NameTable::HashOf(name);
  if (FindEntered(node, name, hash) == OPNode::kNone) books.names.Add(hash, place);
}

std::uint32_t Ledger::FindEntered(const OPNode& node, std::string_view name, std::uint32_t hash) {
  return node.books_->names.Find(hash,
                                 [&](std::uint32_t at) { return node.children[at]->name == name; });
}

std::uint32_t Ledger::Find(const OPNode& node, std::string_view name, std::uint32_t hash) {
  const auto& children = node.children;
  if (children.size() > kFewChildren) return FindEntered(node, name, hash);
  for (std::uint32_t at = 0; at < children.size(); ++at) {
    if (children[at]->name == name) return at;
  }
  return OPNode::kNone;
}

// Whether looking the name up would find it at that place. The hash has led there, so of several
// children of that name it is the one that is entered.
bool Ledger::IsAt(const OPNode& node, std::string_view name, std::uint32_t place) {
  const auto& children = node.children;
  return node.books_ && node.books_->adopted == children.size() && place < children.size() &&
         children[place]->name == name;
}

// Whether a place of PrefetchPlace says that there is no child of that name: it has found no such
// hash, and no child has come since.
bool Ledger::IsBehind(const OPNode& node, std::uint32_t place) {
  return place > kFewChildren && place == node.children.size() && node.books_->adopted == place;
}

const std::shared_ptr<OPNode>& Ledger::Child(OPNode& node, std::string_view name,
                                             std::uint32_t hash, std::uint32_t place, Pool* pool) {
  if (IsAt(node, name, place)) {
    Touch(*node.children[place]);
    return node.children[place];
  }
  return IsBehind(node, place) ? Create(node, name, hash, pool) : Child(node, name, hash, pool);
}

const std::shared_ptr<OPNode>& Ledger::Child(OPNode& node, std::string_view name,
                                             std::uint32_t hash, Pool* pool) {
  Adopt(node);
  const std::uint32_t found = Find(node, name, hash);
  if (found != OPNode::kNone) {
    Touch(*node.children[found]);
    return node.children[found];
  }
  return Create(node, name, hash, pool);
}

// All other children are accounted for.
const std::shared_ptr<OPNode>& Ledger::Create(OPNode& node, std::string_view name,
                                              std::uint32_t hash, Pool* pool) {
  MakeRoom(node.children);
  node.children.push_back(pool != nullptr
                              ? pool->Make<OPNode>(node.shared_from_this(), kUnnamed)
                              : std::make_shared<OPNode>(node.shared_from_this(), kUnnamed));
  node.children.back()->name = std::string(name);  // of its very size: assigned it takes more
  OPNode::Books& books = BooksOf(node);
  if (books.adopted > kFewChildren) {
    books.names.Add(hash, books.adopted);
    Place(node, books);
  } else {
    AdoptNext(node, books);
  }
  return node.children.back();
}

void Ledger::PrefetchDirectory(const OPNode& node) {
  __builtin_prefetch(&node.children);
  __builtin_prefetch(&node.books_);
}

void Ledger::PrefetchBooks(const OPNode& node) {
  __builtin_prefetch(node.books_.get());
}

void Ledger::PrefetchName(const OPNode& node, std::uint32_t hash) {
  if (node.books_) node.books_->names.Prefetch(hash);
}

// A new child comes behind the last one.
std::uint32_t Ledger::PrefetchPlace(const OPNode& node, std::uint32_t hash) {
  const OPNode::Books* const books = node.books_.get();
  if (books == nullptr || books->adopted != node.children.size()) return OPNode::kNone;
  const std::uint32_t place =
      std::min(books->adopted, books->names.Find(hash, [](std::uint32_t) { return true; }));
  __builtin_prefetch(node.children.data() + place);
  return place;
}

const OPNode* Ledger::PrefetchChild(const OPNode& node, std::uint32_t place) {
  if (place >= node.children.size()) return nullptr;
  const OPNode* const child = node.children[place].get();
  __builtin_prefetch(child);
  __builtin_prefetch(&child->ops);
  __builtin_prefetch(&child->place_);
  return child;
}

void Ledger::PrefetchList(const OPNode& node) {
  __builtin_prefetch(node.name.data());
  __builtin_prefetch(node.ops.data());
}

void Ledger::PrefetchRecord(const OPNode& node) {
  if (!node.ops.empty()) __builtin_prefetch(node.ops.front().get());
}

void Ledger::List(OPNode& node) {
  for (OPNode* at = &node; at->parent; at = at->parent.get()) {
    if (IsListed(*at)) return;
    if (!IsInPlace(*at)) return;  // it will be touched when it is adopted
    OPNode::Books& books = *at->parent->books_;
    Prepend(*at, books.first_reindexable, &OPNode::next_reindexable_);
    Prepend(*at, books.first_movable, &OPNode::next_movable_);
  }
}

// Its place is not that of another, though `children` is open to everybody.
bool Ledger::IsInPlace(const OPNode& node) {
  const auto& siblings = node.parent->children;
  return node.place_ < siblings.size() && siblings[node.place_].get() == &node;
}

void Ledger::Prepend(OPNode& node, std::uint32_t& first, Link next) {
  if (node.*next == OPNode::kNone) node.*next = std::exchange(first, node.place_);
}

std::vector<OPNode*> Ledger::TakeList(OPNode& node, std::uint32_t& first, Link next) {
  std::vector<OPNode*> taken;
  std::uint32_t at = std::exchange(first, OPNode::Books::kEnd);
  while (at < node.children.size()) {
    taken.push_back(node.children[at].get());
    at = std::exchange(taken.back()->*next, OPNode::kNone);
  }
  return taken;
}

std::vector<OPNode*> Ledger::TakeReindexable(OPNode& node) {
  Adopt(node);
  if (!node.books_) return {};
  return TakeList(node, node.books_->first_reindexable, &OPNode::next_reindexable_);
}

std::vector<OPNode*> Ledger::TakeMovable(OPNode& node) {
  Adopt(node);
  if (!node.books_) return {};
  std::vector<OPNode*> taken = TakeList(node, node.books_->first_movable, &OPNode::next_movable_);
  std::reverse(taken.begin(), taken.end());
  const auto earlier = [](const OPNode* a, const OPNode* b) { return a->place_ < b->place_; };
  if (!std::is_sorted(taken.begin(), taken.end(), earlier)) {
    std::sort(taken.begin(), taken.end(), earlier);
  }
  return taken;
}

void Ledger::Enter(OPNode::RecordIndex& index, OP* rec) {
  if (rec->op == OP_NONE) return;
  if (rec->op == OP_RENAME) {
    ++index.renames;
    return;
  }
  OPNode::RecordIndex::RecordSet& set = index.about[rec->node.get()];
  OPNode::RecordIndex::OfKind& of_kind = set.Of(rec->op);
  of_kind.recs.push_back(rec);
  of_kind.last = ++set.entered;
}

// All records of a kind have changed alike, or none has.
void Ledger::Refile(OPNode::RecordIndex::RecordSet& set, FileIndexOP kind) {
  OPNode::RecordIndex::OfKind& from = set.Of(kind);
  if (from.recs.empty()) return;
  const FileIndexOP changed = from.recs.front()->op;
  OPNode::RecordIndex::OfKind& to = set.Of(changed);
  if (&to == &from) return;
  if (changed == OP_NONE) {
    from.recs.clear();
    return;
  }
  to.last = to.recs.empty() ? from.last : std::max(to.last, from.last);
  Pour(from.recs, to.recs);
}

OPNode::RecordIndex& Ledger::Sift(OPNode& node, const OP* current) {
  std::unique_ptr<OPNode::RecordIndex>& records = BooksOf(node).records;
  if (!records || records->seen > node.ops.size()) {
    records = std::make_unique<OPNode::RecordIndex>();
  }
  OPNode::RecordIndex& index = *records;
  if (index.unsettled != nullptr && index.unsettled != current) {
    Enter(index, std::exchange(index.unsettled, nullptr));
  }
  for (; index.seen < node.ops.size(); ++index.seen) {
    OP* const rec = node.ops[index.seen].get();
    if (rec == current) {
      index.unsettled = rec;
    } else {
      Enter(index, rec);
    }
  }
  return index;
}

// The same when no event is being folded at this node. Afterwards only what is pending is listed.
OPNode::RecordIndex& Ledger::SiftSettled(OPNode& node) {
  OPNode::RecordIndex& index = Sift(node, nullptr);
  const auto own = index.about.find(&node);
  if (own != index.about.end() && IsEmpty(own->second)) index.about.erase(own);
  return index;
}

FileIndexOP Ledger::TakeWork(OPNode& node) {
  FileIndexOP work = OP_NONE;
  if (IsShort(node)) {
    for (const std::shared_ptr<OP>& rec : node.ops) {
      if (rec->node.get() == &node && IsWork(rec->op)) work = std::exchange(rec->op, OP_NONE);
    }
    return work;
  }
  OPNode::RecordIndex::RecordSet& own = Sift(node, nullptr).about[&node];
  std::size_t last = 0;
  for (const FileIndexOP kind : {OP_INDEX, OP_ATTR, OP_REINDEX}) {
    OPNode::RecordIndex::OfKind& of_kind = own.Of(kind);
    if (of_kind.recs.empty()) continue;
    if (of_kind.last > last) work = kind;
    last = std::max(last, of_kind.last);
    for (OP* rec : of_kind.recs) rec->op = OP_NONE;
    of_kind.recs.clear();
  }
  return work;
}

bool Ledger::HasPending(OPNode& node) {
  if (IsShort(node)) {
    return std::any_of(node.ops.begin(), node.ops.end(),
                       [](const auto& rec) { return rec->op != OP_NONE; });
  }
  const OPNode::RecordIndex& index = SiftSettled(node);
  return index.renames > 0 || !index.about.empty();
}

Ledger::Bundle Ledger::Take(OPNode& node) {
  Bundle bundle;
  if (!IsShort(node)) {
    SiftSettled(node);
    bundle.index = std::move(node.books_->records);
  }
  bundle.ops = std::exchange(node.ops, {});
  if (node.books_) node.books_->records.reset();
  return bundle;
}

// The records of the longer index stay where they are, so that one that is moved to and fro costs
// little.
void Ledger::Merge(OPNode::RecordIndex& index, OPNode::RecordIndex& later) {
  const bool swapped = index.about.size() < later.about.size();
  if (swapped) index.about.swap(later.about);
  for (auto& [node, set] : later.about) {
    const auto [entry, is_new] = index.about.try_emplace(node);
    if (swapped && !is_new) std::swap(entry->second, set);
    AppendSet(entry->second, set);
  }
  index.renames += later.renames;
}

bool Ledger::Receive(OPNode& node, Bundle bundle, const OP* current) {
  if (!bundle.index && IsShort(node)) {
    Append(bundle.ops, node.ops);
    return false;
  }
  OPNode::RecordIndex& index = Sift(node, current);
  if (bundle.index) {
    Merge(index, *bundle.index);
    Join(node.ops, index.front, bundle.ops, bundle.index->front);
  } else {
    for (const auto& rec : bundle.ops) Enter(index, rec.get());
    Append(bundle.ops, node.ops);
  }
  index.seen = node.ops.size();
  return HasFront(node);
}

void Ledger::Settle(OPNode& node) {
  if (!HasFront(node)) return;
  OPNode::RecordIndex& index = *node.books_->records;
  index.seen += index.front.size();
  std::reverse(index.front.begin(), index.front.end());
  Append(node.ops, index.front);
  node.ops = std::exchange(index.front, {});
}

void Ledger::Forget(OPNode& node) {
  Settle(node);
  if (node.books_) node.books_->records.reset();
  Touch(node);
}

void Ledger::PrefetchRelease(const OPNode* node) {
  if (node == nullptr || !node->parent) return;
  const auto& siblings = node->parent->children;
  if (node->place_ < siblings.size()) __builtin_prefetch(&siblings[node->place_]);
}

void Ledger::Release(OPNode& node) {
  node.ops.clear();
  if (node.parent && node.children.empty() && IsInPlace(node)) {
    node.parent->children[node.place_].reset();
  }
}

void Ledger::Dismantle(OPNode& node, std::vector<std::shared_ptr<OPNode>>& orphans) {
  for (std::shared_ptr<OPNode>& child : node.children) {
    if (child) orphans.push_back(std::move(child));
  }
  node.children.clear();
  node.ops.clear();
  node.books_.reset();
}

}  // namespace quarry::fileindex
