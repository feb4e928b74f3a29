#include "fileindex/queue/optree.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <string_view>
#include <utility>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/queue/event_line.h"
#include "fileindex/queue/large_pages.h"
#include "fileindex/queue/ledger.h"
#include "fileindex/queue/look_ahead.h"
#include "fileindex/queue/pool.h"
#include "fileindex/queue/queue_reader.h"
#include "fileindex/queue/relocation.h"

namespace quarry::fileindex {
namespace {

// What a new record does when it meets a pending one at the same node.
enum Rule : std::uint8_t {
  Keep,   // nothing: both stand
  Drop,   // the new one is dropped
  Take,   // the pending one becomes what the new one is, in its own place; the new one is dropped
  Merge,  // the pending one takes the new one's switches in; the new one is dropped
};

}  // namespace

struct RuleRow {
  FileIndexOP kind;             // of the new record
  std::array<Rule, 8> meeting;  // by the kind of the pending one
};

namespace {

// clang-format off
//                                                NONE  DELETE INDEX ATTR  UPD.  REN.  REINDEX FULL
constexpr RuleRow kDelete    = {OP_DELETE,      {{Keep, Drop,  Take, Take, Keep,  Keep, Keep,   Keep}}};
constexpr RuleRow kCreate    = {OP_INDEX,       {{Keep, Take,  Drop, Take, Drop,  Keep, Drop,   Keep}}};
constexpr RuleRow kModify    = {OP_INDEX,       {{Keep, Drop,  Drop, Take, Drop,  Keep, Drop,   Keep}}};
constexpr RuleRow kAttr      = {OP_ATTR,        {{Keep, Drop,  Drop, Drop, Drop,  Keep, Drop,   Keep}}};
constexpr RuleRow kUpdateCfg = {OP_UPDATE_CFG,  {{Keep, Drop,  Take, Take, Merge, Keep, Drop,   Keep}}};
constexpr RuleRow kReindex   = {OP_REINDEX,     {{Keep, Drop,  Take, Take, Take,  Keep, Drop,   Keep}}};
// clang-format on

// The rules for what such an event does to a file, and nothing else; null for other events.
const RuleRow* OnlyRules(const EventLine& event) {
  switch (event.op) {
    case EVENT_CREATE:
      return event.is_dir ? nullptr : &kCreate;
    case EVENT_DELETE:
      return event.is_dir ? nullptr : &kDelete;
    case EVENT_MODIFY:
      return &kModify;
    case EVENT_ATTR:
      return &kAttr;
    default:
      return nullptr;
  }
}

// A new record of that kind and with that data meets a pending one. Returns whether that one is
// changed; sets `kind` to OP_NONE when it has taken the new one's work.
bool Meet(OP& pending, FileIndexOP& kind, const Json::Value& data, const RuleRow& rules) {
  const auto met = static_cast<std::size_t>(pending.op);
  const Rule rule = met < rules.meeting.size() ? rules.meeting[met] : Keep;
  if (rule == Keep) return false;
  if (rule == Merge) pending.MergeData(data);
  if (rule == Take) {
    pending.op = rules.kind;
    if (rules.kind == OP_UPDATE_CFG) pending.data = data;
  }
  kind = OP_NONE;
  return rule != Drop;
}

void CancelBelow(OPNode& node) {
  std::vector<OPNode*> waiting = Ledger::TakeReindexable(node);
  while (!waiting.empty()) {
    OPNode& below = *waiting.back();
    waiting.pop_back();
    Ledger::ForEachOwn(below, nullptr, [](OP& rec) {
      if (rec.op == OP_RENAME) return false;
      rec.op = OP_NONE;
      return true;
    });
    const std::vector<OPNode*> children = Ledger::TakeReindexable(below);
    waiting.insert(waiting.end(), children.begin(), children.end());
  }
}

// What was there before something was moved over it is gone.
void CancelReplaced(OPNode& destination, const OP* current) {
  Ledger::ForEachOwn(destination, current, [](OP& rec) {
    if (rec.op != OP_DELETE && rec.op != OP_INDEX && rec.op != OP_ATTR) return false;
    rec.op = OP_NONE;
    return true;
  });
}

// A path is handed to the system as text that ends at the first NUL byte: cut there it would name,
// and perhaps remove, something else.
void RefuseNul(const std::string& path) {
  if (path.find('\0') != std::string::npos) {
    throw Error(kErrorBadParameter, "NUL byte in path: " + path);
  }
}

const Json::Value kNoData;

// How many records ahead of the one that is let go memory is asked for.
constexpr std::size_t kAhead = 16;

std::string OpenFailure() {
  return std::string("Failed to open queue, reason=") + strerror(errno);
}

}  // namespace

OPTree::OPTree(const std::string& path, Empty)
    : queue_path(path),
      root(std::make_shared<OPNode>(nullptr, "")),
      pool_(std::make_unique<Pool>()) {}

// Delegates first, so that the destructor takes the tree apart when building fails.
OPTree::OPTree(const std::string& path) : OPTree(path, Empty()) {
  BuildTree();
}

OPTree::~OPTree() {
  // In order of acceptance, in which they lie in memory; the tree's own order is all over the
  // place.
  for (std::size_t i = 0; i < ops.size(); ++i) {
    if (i + kAhead < ops.size()) Ledger::PrefetchRelease(ops[i + kAhead]->node.get());
    const std::shared_ptr<OPNode> node = ops[i]->node;
    ops[i].reset();
    if (node) Ledger::Release(*node);
  }
  std::vector<std::shared_ptr<OPNode>> orphans;
  if (root) orphans.push_back(std::move(root));
  while (!orphans.empty()) {
    const std::shared_ptr<OPNode> node = std::move(orphans.back());
    orphans.pop_back();
    Ledger::Dismantle(*node, orphans);
  }
}

void OPTree::BuildTree() {
  QueueReader input(queue_path);
  if (input.failed()) {
    Fail(QUARRY_SITE("optree"), "!input_stream", kErrorSystem, OpenFailure());
  }
  building_ = true;
  InsertLines(input);
  building_ = false;
  Settle();
  // Half a queue must not pass for a whole one: the rest would be deleted with it.
  if (input.failed()) {
    Fail(QUARRY_SITE("optree"), "!input_stream", kErrorSystem, OpenFailure());
  }
}

void OPTree::InsertLines(QueueReader& input) {
  LookAhead ahead;
  std::shared_ptr<OPNode> last;  // of the line before
  while (ahead.Read(input)) {
    for (const QueueLine& line : ahead.lines()) {
      if (log_level == 7) LogLine(QUARRY_SITE("optree"), "Got event: " + std::string(line.text));
      InsertLine(line, ahead, last);
      if (crashed) return;
    }
  }
}

void OPTree::InsertLine(const QueueLine& line, LookAhead& ahead, std::shared_ptr<OPNode>& last) {
  try {
    if (!line.is_usual) {
      InsertEvent(std::make_shared<Event>(std::string(line.text)));
      return;
    }
    if (line.is_repeated && last) {
      Ledger::Touch(*last);
    } else if (line.directory != nullptr) {
      last = Ledger::Child(*line.directory, line.path.name, line.hash, line.place, pool_.get());
    } else {
      last = NodeAt(line.event.path);
      ahead.Learn(line, *last);
    }
    Insert(last, line.event, kNoData);
  } catch (const Error& error) {
    last.reset();
    ++skipped_lines_;
    LogError(LogSite{"optree.cpp", __LINE__, "BuildTree"},
             "InsertEvent failed, event_raw=" + std::string(line.text) +
                 ", code=" + std::to_string(static_cast<std::int32_t>(error.code())) +
                 ", reason=" + error.reason());
  }
}

void OPTree::InsertEvent(std::shared_ptr<Event> event) {
  RefuseNul(event->path);
  RefuseNul(event->path_old);
  const EventLine line{event->op, event->is_dir, event->path, event->path_old};
  Insert(NodeAt(event->path), line, event->data);
}

// The path that the node stands for, and the old path, hold no NUL byte.
void OPTree::Insert(const std::shared_ptr<OPNode>& node, const EventLine& event,
                    const Json::Value& data) {
  if (const RuleRow* const rules = OnlyRules(event)) {
    FoldOnly(node, *rules);
  } else {
    InsertAny(node, event, data);
  }
}

void OPTree::InsertAny(std::shared_ptr<OPNode> node, const EventLine& event,
                       const Json::Value& data) {
  const auto rec = std::make_shared<OP>(node, OP_NONE);
  const auto has = [&event](EventKind kind) { return (event.op & kind) != 0; };
  const auto has_for_dir = [&](EventKind kind) { return has(kind) && event.is_dir; };
  const auto has_for_file = [&](EventKind kind) { return has(kind) && !event.is_dir; };

  if (has_for_dir(EVENT_CREATE)) HandleReindex(node, rec);
  if (has_for_file(EVENT_CREATE)) Fold(node, rec, kCreate);
  if (has(EVENT_ATTR)) Fold(node, rec, kAttr);
  if (has(EVENT_MODIFY)) Fold(node, rec, kModify);
  if (has_for_dir(EVENT_DELETE)) HandleReindex(node, rec);
  if (has_for_file(EVENT_DELETE)) Fold(node, rec, kDelete);
  if (has(EVENT_RENAME)) {
    rec->src = event.path_old;
    HandleRename(node, rec);
  }
  if (has(EVENT_REINDEX)) HandleReindex(node, rec);
  if (has(EVENT_UPDATE_CFG)) {
    rec->data = data;
    Fold(node, rec, kUpdateCfg);
  }
  if (has(EVENT_OVERFLOW)) crashed = true;
}

std::shared_ptr<OPNode> OPTree::GetNodeByPath(const std::string& path) {
  return NodeAt(path);
}

std::shared_ptr<OPNode> OPTree::NodeAt(std::string_view path) {
  if (!root) throw Error(kErrorTreePath, "GetNodeByPath failed, path=" + std::string(path));
  const std::shared_ptr<OPNode>* node = &root;
  for (std::size_t begin = 0; begin < path.size();) {
    const std::size_t end = std::min(path.find('/', begin), path.size());
    if (end != begin) node = &Ledger::Child(**node, path.substr(begin, end - begin), pool_.get());
    begin = end + 1;
  }
  return *node;
}

void OPTree::Attach(const std::shared_ptr<OPNode>& node, std::shared_ptr<OP> rec) {
  if (std::exchange(rec->attached_.is_done, true)) return;
  MakeRoom(ops);
  ops.push_back(rec);
  node->ops.push_back(std::move(rec));
  Ledger::Touch(*node);
}

void OPTree::Fold(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& rec,
                  const RuleRow& rules) {
  rec->op = rules.kind;
  Ledger::ForEachOwn(*node, rec.get(),
                     [&](OP& pending) { return Meet(pending, rec->op, rec->data, rules); });
  if (rec->op != OP_NONE) Attach(node, rec);
}

// Most events are absorbed by what is pending already: only the others get a record.
void OPTree::FoldOnly(const std::shared_ptr<OPNode>& node, const RuleRow& rules) {
  FileIndexOP kind = rules.kind;
  Ledger::ForEachOwn(*node, nullptr,
                     [&](OP& pending) { return Meet(pending, kind, kNoData, rules); });
  if (kind != OP_NONE) Attach(node, pool_->Make<OP>(node, kind));
}

void OPTree::HandleCreate(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec) {
  Fold(node, rec, kCreate);
}

void OPTree::HandleModify(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec) {
  Fold(node, rec, kModify);
}

void OPTree::HandleAttr(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec) {
  Fold(node, rec, kAttr);
}

void OPTree::HandleDelete(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec) {
  Fold(node, rec, kDelete);
}

void OPTree::HandleUpdateCfg(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec) {
  Fold(node, rec, kUpdateCfg);
}

void OPTree::HandleReindex(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec) {
  Fold(node, rec, kReindex);
  CancelBelow(*node);
}

void OPTree::HandleRename(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec) {
  const std::shared_ptr<OPNode> source = GetNodeByPath(rec->src);
  rec->op = OP_RENAME;
  std::vector<std::shared_ptr<OP>> carriers;
  if (source != node) {
    CancelReplaced(*node, rec.get());
    // An old path without components names nothing that could have been moved.
    if (source != root) {
      carriers = Relocation(*source, *node, *pool_).Deliver(rec.get(), unsettled_);
    }
  }
  Attach(node, rec);
  for (const std::shared_ptr<OP>& carrier : carriers) Attach(carrier->node, carrier);
  if (!building_) Settle();
}

void OPTree::Settle() {
  for (OPNode* node : unsettled_) Ledger::Settle(*node);
  unsettled_.clear();
}

void OPTree::TraverseNodeDescendant(std::shared_ptr<OPNode> node,
                                    std::function<void(std::shared_ptr<OPNode>)> fn,
                                    bool skip_self) {
  std::vector<std::shared_ptr<OPNode>> waiting(1, node);
  while (!waiting.empty()) {
    const std::shared_ptr<OPNode> at = std::move(waiting.back());
    waiting.pop_back();
    // Noted before `fn` is called, which could else add children without end.
    waiting.insert(waiting.end(), at->children.rbegin(), at->children.rend());
    if (!skip_self || at != node) fn(at);
  }
}

std::int32_t OPTree::ProcessOP(std::function<void(std::shared_ptr<OP>)> fn) {
  if (crashed) {
    LogLine(QUARRY_SITE("optree"), "Queue crashed: " + queue_path);
    fn(std::make_shared<OP>(root, OP_FULL_REINDEX));
    return 1;
  }
  for (std::size_t i = 0; i < ops.size(); ++i) {
    if (ops[i]->op != OP_NONE) fn(ops[i]);
  }
  return static_cast<std::int32_t>(ops.size());
}

}  // namespace quarry::fileindex
