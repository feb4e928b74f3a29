#include "fileindex/queue/queue_mgr.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string_view>
#include <utility>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/named_file.h"
#include "common/unique_fd.h"
#include "fileindex/queue/queue_reader.h"

namespace quarry::fileindex {
namespace {

const std::string& CheckedQueuePath(const std::string& path) {
  if (path.empty() || path.front() != '/' || path.back() == '/' ||
      path.find('\0') != std::string::npos) {
    throw Error(kErrorBadParameter, "Not a queue path: " + path);
  }
  return path;
}

// Whether `path` is `directory` or lies below it. The "/" keeps /s/a from holding /s/ab.
bool IsAtOrBelow(const std::string& path, const std::string& directory) {
  return StringStartWith(path + "/", directory + "/");
}

// Whoever hands out what a snapshot holds has it locked against writing, which nobody else does: a
// lock of the open file, so that it ends with the manager, or with the process.
struct flock WholeFile(short type) {
  struct flock lock {};
  lock.l_type = type;
  lock.l_whence = SEEK_SET;
  return lock;
}

void Claim(int fd) {
  struct flock lock = WholeFile(F_RDLCK);
  const int saved_errno = errno;
  fcntl(fd, F_OFD_SETLK, &lock);
  errno = saved_errno;
}

bool IsClaimed(const std::string& path) {
  const int saved_errno = errno;
  const UniqueFd file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  struct flock lock = WholeFile(F_WRLCK);
  const bool claimed = fcntl(file.get(), F_OFD_GETLK, &lock) == 0 && lock.l_type != F_UNLCK;
  errno = saved_errno;
  return claimed;
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
  if (!seen_) return unlink(queue_path_tmp_.c_str());
  if (!HoldSeenSnapshot()) return -1;
  const int result = unlink(queue_path_tmp_.c_str());
  // Not left to closing: a child of fork may have the same open file.
  flock(seen_->get(), LOCK_UN);
  // The tree is kept, but what will be at the name next was never read.
  if (result == 0) seen_ = std::make_shared<const UniqueFd>();
  return result;
}

// Any process may make a snapshot once there is none, so the one at the name now may hold lines
// that were never read here. The lock lets one at a time of those who have read the same snapshot
// look and remove; nobody renames over a snapshot that exists. False with errno set when the
// snapshot is not to be removed.
bool QueueMgr::HoldSeenSnapshot() const {
  if (seen_->valid()) {
    while (flock(seen_->get(), LOCK_EX) != 0) {
      if (errno != EINTR) return false;
    }
    if (IsStillNamed(queue_path_tmp_, seen_->get())) return true;
    flock(seen_->get(), LOCK_UN);
  }
  errno = ENOENT;
  return false;
}

std::shared_ptr<OPTree> QueueMgr::GetOPTree() const {
  if (!op_tree_) op_tree_ = std::make_shared<OPTree>(queue_path_);
  return op_tree_;
}

std::shared_ptr<OPTree> QueueMgr::GetOPTreeTmp() const {
  if (op_tree_tmp_) return op_tree_tmp_;
  // Opened before the tree reads it: if it has its name when it is to be removed, it had it all the
  // while, and is what was read.
  seen_ = std::make_shared<const UniqueFd>(
      open(queue_path_tmp_.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  op_tree_tmp_ = std::make_shared<OPTree>(queue_path_tmp_);
  return op_tree_tmp_;
}

std::int32_t QueueMgr::ProcessOP(std::function<void(std::shared_ptr<OP>)> fn, bool use_tmp) {
  if (use_tmp) PrepareTmpQueue();
  if (!IsFileExist(use_tmp ? queue_path_tmp_ : queue_path_)) {
    if (use_tmp) seen_ = std::make_shared<const UniqueFd>();
    return 0;
  }
  if (!use_tmp) return GetOPTree()->ProcessOP(std::move(fn));
  const std::shared_ptr<OPTree> tree = GetOPTreeTmp();
  Claim(seen_->get());
  return tree->ProcessOP(std::move(fn));
}

std::size_t QueueMgr::SkippedLines() const {
  return op_tree_tmp_ ? op_tree_tmp_->SkippedLines() : 0;
}

bool QueueMgr::FindQueue(TornLine torn, const std::string& path, const Predicate& predicate) {
  if (!IsFileExist(path)) return false;
  const int saved_errno = errno;
  QueueReader input(path);
  // The live queue may be renamed at any moment; then it is the snapshot that has its events.
  if (input.failed() && errno == ENOENT) {
    errno = saved_errno;
    return false;
  }
  std::string_view line;
  while (input.Next(line)) {
    const std::string text(line);
    if (torn == TornLine::kIsNone && !input.line_ended() && !IsJson(text)) break;
    if (predicate(std::make_shared<Event>(text))) return true;
  }
  if (input.failed()) {
    Fail(QUARRY_SITE("queue_mgr"), "!input_stream", kErrorSystem,
         std::string("Failed to open queue, reason=") + strerror(errno));
  }
  return false;
}

bool QueueMgr::FindInQueues(const Predicate& predicate) const {
  return FindQueue(TornLine::kIsMalformed, queue_path_, predicate) ||
         FindQueue(TornLine::kIsMalformed, queue_path_tmp_, predicate);
}

bool QueueMgr::IsFullPathProcessing(const std::string& full_path) {
  return FindInQueues([&full_path](const std::shared_ptr<Event>& event) {
    if (IsAtOrBelow(event->path, full_path)) return true;
    // What is moved away is still indexed under its old path until the rename has been applied.
    return (event->op & EVENT_RENAME) != 0 && !event->path_old.empty() &&
           IsAtOrBelow(event->path_old, full_path);
  });
}

bool QueueMgr::IsFullPathHasReindex(const std::string& full_path) {
  return FindInQueues([&full_path](const std::shared_ptr<Event>& event) {
    return event->op == EVENT_REINDEX && IsAtOrBelow(event->path, full_path);
  });
}

bool QueueMgr::IsReindexWaitingFor(const std::string& full_path) {
  const Predicate covers = [&full_path](const std::shared_ptr<Event>& event) {
    return event->op == EVENT_REINDEX && IsAtOrBelow(full_path, event->path);
  };
  if (FindQueue(TornLine::kIsNone, queue_path_, covers)) return true;
  // One that is being worked on may have been at the path already. Asked before reading: what is
  // claimed from now on has not.
  const bool is_in_work = IsClaimed(queue_path_tmp_);
  return FindQueue(TornLine::kIsNone, queue_path_tmp_, covers) && !is_in_work;
}

}  // namespace quarry::fileindex
