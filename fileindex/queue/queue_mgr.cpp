#include "fileindex/queue/queue_mgr.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <utility>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "fileindex/queue/queue_reader.h"

namespace quarry::fileindex {
namespace {

const std::string& CheckedQueuePath(const std::string& path) {
  if (!StringStartWith(path, "/") || Basename(path).empty() ||
      path.find('\0') != std::string::npos) {
    throw Error(kErrorBadParameter, "Not a queue path: " + path);
  }
  return path;
}

// Whether `path` is `directory` or lies below it. The "/" keeps /s/a from holding /s/ab.
bool IsAtOrBelow(const std::string& path, const std::string& directory) {
  return StringStartWith(path + "/", directory + "/");
}

bool IsJson(const std::string& text) {
  Json::Value ignored;
  return fromString(ignored, text);
}

}  // namespace

QueueMgr::QueueMgr(const std::string& queue_path)
    : queue_path_(CheckedQueuePath(queue_path)), queue_path_tmp_(queue_path + ".tmp") {}

void QueueMgr::PrepareTmpQueue() {
  if (!IsFileExist(queue_path_)) return;
  const LockFile lock(queue_path_, true);
  if (IsFileExist(queue_path_tmp_)) return;
  if (0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str())) {
    Fail(QUARRY_SITE("queue_mgr"), "0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str())",
         kErrorSystem, std::string("rename failed, reason=") + strerror(errno));
  }
}

int QueueMgr::DeleteTmp() {
  return unlink(queue_path_tmp_.c_str());
}

std::shared_ptr<OPTree> QueueMgr::GetOPTree() const {
  if (!op_tree_) op_tree_ = std::make_shared<OPTree>(queue_path_);
  return op_tree_;
}

std::shared_ptr<OPTree> QueueMgr::GetOPTreeTmp() const {
  if (!op_tree_tmp_) op_tree_tmp_ = std::make_shared<OPTree>(queue_path_tmp_);
  return op_tree_tmp_;
}

std::int32_t QueueMgr::ProcessOP(std::function<void(std::shared_ptr<OP>)> fn, bool use_tmp) {
  if (use_tmp) PrepareTmpQueue();
  if (!IsFileExist(use_tmp ? queue_path_tmp_ : queue_path_)) return 0;
  return (use_tmp ? GetOPTreeTmp() : GetOPTree())->ProcessOP(std::move(fn));
}

bool QueueMgr::FindQueue(TornLine torn, const std::string& path, const Predicate& predicate) {
  if (!IsFileExist(path)) return false;
  QueueReader input(path);
  // The live queue may be renamed at any moment; then it is the snapshot that has its events.
  if (input.failed() && errno == ENOENT) return false;
  std::string line;
  while (input.Next(line)) {
    if (torn == TornLine::kIsNone && !input.line_ended() && !IsJson(line)) break;
    if (predicate(std::make_shared<Event>(line))) return true;
  }
  if (input.failed()) {
    Fail(QUARRY_SITE("queue_mgr"), "!input_stream", kErrorSystem,
         std::string("Failed to open queue, reason=") + strerror(errno));
  }
  return false;
}

bool QueueMgr::FindInQueues(TornLine torn, const Predicate& predicate) const {
  return FindQueue(torn, queue_path_, predicate) || FindQueue(torn, queue_path_tmp_, predicate);
}

bool QueueMgr::IsFullPathProcessing(const std::string& full_path) {
  return FindInQueues(TornLine::kIsMalformed, [&full_path](const std::shared_ptr<Event>& event) {
    if (IsAtOrBelow(event->path, full_path)) return true;
    // What is moved away is still indexed under its old path until the rename has been applied.
    return (event->op & EVENT_RENAME) != 0 && !event->path_old.empty() &&
           IsAtOrBelow(event->path_old, full_path);
  });
}

bool QueueMgr::IsFullPathHasReindex(const std::string& full_path) {
  return FindInQueues(TornLine::kIsMalformed, [&full_path](const std::shared_ptr<Event>& event) {
    return event->op == EVENT_REINDEX && IsAtOrBelow(event->path, full_path);
  });
}

bool QueueMgr::IsReindexWaitingFor(const std::string& full_path) {
  return FindInQueues(TornLine::kIsNone, [&full_path](const std::shared_ptr<Event>& event) {
    return event->op == EVENT_REINDEX && IsAtOrBelow(full_path, event->path);
  });
}

}  // namespace quarry::fileindex
