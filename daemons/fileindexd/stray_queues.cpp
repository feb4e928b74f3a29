#include "daemons/fileindexd/stray_queues.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "common/error.h"
#include "common/sdk/share.h"
#include "common/unique_fd.h"
#include "daemons/common/log.h"
#include "daemons/fileindexd/state_files.h"

namespace quarry::fileindexd {
namespace {

bool Exists(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0;
}

// The lock that everybody takes who writes to the queue, if it is free and the file is still the
// queue.
UniqueFd TryLock(const std::string& queue) {
  UniqueFd fd(open(queue.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  struct stat opened {};
  struct stat named {};
  if (!fd.valid() || flock(fd.get(), LOCK_EX | LOCK_NB) != 0 || fstat(fd.get(), &opened) != 0 ||
      lstat(queue.c_str(), &named) != 0 || opened.st_dev != named.st_dev ||
      opened.st_ino != named.st_ino) {
    return UniqueFd();
  }
  return fd;
}

// "" for a share that cannot be asked, as one that is just being moved.
std::string QueueOf(const std::string& share) {
  try {
    return sdk::SDKShare(share).GetQueuePath();
  } catch (const Error&) {
    return {};
  }
}

void RemoveQueueOf(const std::string& share) {
  const std::string queue = QueueOf(share);
  if (queue.empty() || !Exists(queue)) return;
  const UniqueFd lock = TryLock(queue);
  // Folders are saved before anything is queued for them: with the lock held, a line that counts
  // comes with a folder that is seen here.
  if (!lock.valid() || LoadIndexedShares().count(share) > 0) return;
  unlink((queue + ".tmp").c_str());
  if (unlink(queue.c_str()) == 0) {
    daemon::LogInfo("Removed the queue of share " + share + ", of which nothing is indexed");
  }
}

}  // namespace

void RemoveStrayQueues() {
  const std::set<std::string> indexed = LoadIndexedShares();
  for (const std::string& share : sdk::SDKShare::Enum()) {
    if (indexed.count(share) == 0) RemoveQueueOf(share);
  }
}

}  // namespace quarry::fileindexd
