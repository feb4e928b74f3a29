// The pending index operations of one queue: a tree of path components, with the operations that
// are pending for each path, folded from the queue's events into as few as possible.

#ifndef QUARRY_FILEINDEX_QUEUE_OPTREE_H_
#define QUARRY_FILEINDEX_QUEUE_OPTREE_H_

#include <json/json.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "common/export.h"
#include "fileindex/queue/event.h"

namespace quarry {
namespace fileindex {

// The kind of a pending operation. The numbers are logged.
enum FileIndexOP : std::int32_t {
  OP_NONE = 0,          // cancelled; never handed out
  OP_DELETE = 1,        // remove the path's document
  OP_INDEX = 2,         // read the file again
  OP_ATTR = 3,          // update the document's attributes only
  OP_UPDATE_CFG = 4,    // apply the configuration change in `data`
  OP_RENAME = 5,        // the path was moved; `src` is the old path
  OP_REINDEX = 6,       // reindex the path and everything below it
  OP_FULL_REINDEX = 7,  // events were lost: reindex the whole share
};

struct EventLine;
struct QueueLine;
class OPNode;
class LookAhead;
class OPTree;
class Pool;
class QueueReader;
struct RuleRow;

// One pending operation. A tree shares its records with the consumer; coalescing changes them in
// place. Not safe for several threads while its tree is being built.
class QUARRY_EXPORT OP {
 public:
  OP(std::shared_ptr<OPNode> node, FileIndexOP op, const std::string& src, const Json::Value& data);
  // The same without an old path and data.
  OP(std::shared_ptr<OPNode> node, FileIndexOP op);
  ~OP();

  // Merges the configuration change `other` into `data`: each of the switches "document", "audio",
  // "video" and "photo" is true afterwards if it was true in either. Throws Error 120, with nothing
  // changed, when `other` or `data` is neither an object nor null.
  void MergeData(const Json::Value& other);

  std::shared_ptr<OPNode> node;  // the path that the operation is about
  FileIndexOP op;

 private:
  friend class OPTree;
  // Whether it is in its tree's list and in a node's. A copy of the record is in neither.
  struct Attachment {
    Attachment() = default;
    Attachment(const Attachment&) {}
    Attachment& operator=(const Attachment&) { return *this; }
    bool is_done = false;
  };
  Attachment attached_;  // here it takes up no room

 public:
  std::string src;   // OP_RENAME: the old full path
  Json::Value data;  // OP_UPDATE_CFG: the change
};

// One path component. A parent and its children hold each other, so the owner of a tree breaks the
// cycle: OPTree does. One thread at a time.
class QUARRY_EXPORT OPNode : public std::enable_shared_from_this<OPNode> {
 public:
  OPNode(std::shared_ptr<OPNode> parent, const std::string& name);
  ~OPNode();
  OPNode(const OPNode&) = delete;
  OPNode& operator=(const OPNode&) = delete;

  // The child of exactly that name (bytes compared), created as the last one if there is none. The
  // node itself must be held by a shared pointer.
  std::shared_ptr<OPNode> GetChild(const std::string& name);

  // The names from the root to this node, joined with "/"; "" for a root, whose name is empty.
  std::string GetPath() const;

  // Calls `fn`, which may change the record, for each entry of `ops` in order, cancelled ones too.
  void TraverseOP(std::function<void(std::shared_ptr<OP>)> fn);

  std::string name;                               // empty for the root
  std::shared_ptr<OPNode> parent;                 // null for the root
  std::vector<std::shared_ptr<OPNode>> children;  // in order of creation
  std::vector<std::shared_ptr<OP>> ops;           // in order of attachment

 private:
  friend class Ledger;  // finds children and records without walking long lists
  struct RecordIndex;
  struct Books;
  static constexpr std::uint32_t kNone = 0xffffffff;

  std::unique_ptr<Books> books_;            // only where there are children or many records
  std::uint32_t place_ = kNone;             // among the parent's children
  std::uint32_t next_reindexable_ = kNone;  // place of the next one in a list of the parent's
  std::uint32_t next_movable_ = kNone;      // books; kNone for what is not in the list
};

// "[kind] path, data=JSON", with "old path -> " before the path where there is one.
QUARRY_EXPORT std::ostream& operator<<(std::ostream& stream, const OP& op);

// "Node[name]: " and a line for each operation, indented by two blanks.
QUARRY_EXPORT std::ostream& operator<<(std::ostream& stream, const OPNode& node);

// The tree of one queue file. Building costs time and memory in proportion to the file; no call
// recurses with the depth of a path. Built once, then read: it does not follow a file that grows.
// One thread at a time. Records and nodes that a caller keeps stay usable, paths included, when the
// tree is gone; nodes then have no children and no records any more.
class QUARRY_EXPORT OPTree {
 public:
  // Builds the tree of the file. Throws Error 502 when it cannot be read.
  explicit OPTree(const std::string& queue_path);
  ~OPTree();
  OPTree(const OPTree&) = delete;
  OPTree& operator=(const OPTree&) = delete;

  // Folds the file's lines into the tree, up to an overflow marker; the last line need not be
  // ended. A line that is malformed or cannot be folded is logged and skipped. Throws as the
  // constructor.
  void BuildTree();

  // How many lines were skipped: what they told of, the tree does not.
  std::size_t SkippedLines() const { return skipped_lines_; }

  // Folds one event into the tree. Throws Error 120 when one of its paths holds a NUL byte, and
  // when a configuration change cannot be merged because one of the two is neither an object nor
  // null. A rename that appends many records to a few costs time in proportion to both; BuildTree
  // puts such lists in order once, at its end.
  void InsertEvent(std::shared_ptr<Event> event);

  // The node of a path, created with all nodes above it as needed; empty components do not count.
  // Throws Error 9999 when the tree has no root.
  std::shared_ptr<OPNode> GetNodeByPath(const std::string& path);

  // The rules: each gives `rec` its kind, lets it meet the records that are attached to `node`, and
  // attaches it unless one of them has taken its work. A record is attached once, however many
  // rules it goes through.
  void HandleCreate(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec);
  void HandleModify(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec);
  void HandleAttr(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec);
  void HandleDelete(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec);
  // Moves what is pending at rec->src and below it to `node`, the new place, and has it done there
  // after the rename.
  void HandleRename(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec);
  // Cancels besides everything below `node` but renames.
  void HandleReindex(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec);
  void HandleUpdateCfg(std::shared_ptr<OPNode> node, std::shared_ptr<OP> rec);

  // Calls `fn` for every node below `node`, and for `node` itself unless `skip_self`: parents
  // before their children, children in order of creation. Children that `fn` adds to the node that
  // it is called for, or to one that was visited before, are not visited.
  void TraverseNodeDescendant(std::shared_ptr<OPNode> node,
                              std::function<void(std::shared_ptr<OPNode>)> fn, bool skip_self);

  // Hands the records that are not cancelled to `fn` in order of acceptance and returns the number
  // of all records; after an overflow, hands out one OP_FULL_REINDEX and returns 1. What `fn`
  // throws passes through.
  std::int32_t ProcessOP(std::function<void(std::shared_ptr<OP>)> fn);

  bool crashed = false;  // the queue has an overflow marker
  std::string queue_path;
  std::shared_ptr<OPNode> root;
  std::vector<std::shared_ptr<OP>> ops;  // all accepted records, in order of acceptance

 private:
  struct Empty {};
  OPTree(const std::string& path, Empty);

  void InsertLines(QueueReader& input);
  void InsertLine(const QueueLine& line, LookAhead& ahead, std::shared_ptr<OPNode>& last);
  void Insert(const std::shared_ptr<OPNode>& node, const EventLine& event, const Json::Value& data);
  void InsertAny(std::shared_ptr<OPNode> node, const EventLine& event, const Json::Value& data);
  std::shared_ptr<OPNode> NodeAt(std::string_view path);
  void Attach(const std::shared_ptr<OPNode>& node, std::shared_ptr<OP> rec);
  void Fold(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& rec,
            const RuleRow& rules);
  void FoldOnly(const std::shared_ptr<OPNode>& node, const RuleRow& rules);
  void Settle();

  std::unique_ptr<Pool> pool_;      // of most nodes and records
  std::vector<OPNode*> unsettled_;  // nodes whose lists are not in order yet
  bool building_ = false;           // nobody looks at the lists yet
  std::size_t skipped_lines_ = 0;
};

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_FILEINDEX_QUEUE_OPTREE_H_
