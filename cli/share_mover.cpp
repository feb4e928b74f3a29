#include "cli/share_mover.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <optional>

#include "cli/problem.h"
#include "cli/system.h"
#include "cli/worker_break.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "common/unique_fd.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/queue/event.h"
#include "platform/linux/share_move.h"

namespace quarry::cli {
namespace {

std::string WhyNotMoved(const SharePlan& plan, int error) {
  const std::string what =
      "Cannot move \"" + plan.old_path + "\" to \"" + plan.new_path + "\": " + strerror(error);
  if (error == EXDEV) {
    return what + ". Copy it (cp -a), then run: quarry share migrate " + plan.to + " " +
           Dirname(plan.new_path) + "/ --copied";
  }
  if (error == EBUSY) return what + ". Mount it at the new place, then run the command again.";
  return what + ".";
}

void SyncDirectory(const std::string& path) {
  const UniqueFd fd(open(path.empty() ? "/" : path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!fd.valid() || fsync(fd.get()) != 0) {
    throw Problem("Cannot write \"" + path + "\": " + strerror(errno) + ". Run the command again.");
  }
}

// The last line of a file, or of so much of it as a line of the queue can take.
std::string LastLine(const std::string& path) {
  constexpr std::streamoff kLongest = 128 << 10;
  std::ifstream file(path, std::ios::binary | std::ios::ate);
  const std::streamoff size = file.tellg();
  if (size <= 0) return {};
  file.seekg(std::max(size - kLongest, std::streamoff{0}));
  std::string line;
  std::string last;
  while (std::getline(file, line)) last = line;
  return last;
}

// Whether the rename of the documents has been queued, which is the last thing that the library
// does. Where the monitor has written behind it, it is queued once more, which does no harm.
bool IsRenameQueued(const SharePlan& plan) {
  Json::Value line;
  return fromString(line, LastLine(sdk::SDKShare(plan.to).GetQueuePath())) && line.isObject() &&
         line["event"] == fileindex::EVENT_RENAME && line["path"] == plan.new_path &&
         line["path_old"] == plan.old_path;
}

void MoveFiles(const SharePlan& plan, bool copied) {
  if (plan.registered) {
    platform::CleanUpShareMove(plan.old_path);
    return;
  }
  MoveDirectory(plan, copied);
  platform::MoveShare(plan.from, plan.new_path);
}

void MoveStatus(const SharePlan& plan) {
  fileindex::StatusMgr status;
  const int bits = status.GetShareStatus(plan.from);
  if (bits == 0) return;
  status.SetShareStatus(plan.to, bits);
  status.ClearShareStatus(plan.from);
}

void MoveIndex(const SharePlan& plan) {
  if (plan.registered && IsRenameQueued(plan)) return;
  if (plan.from == plan.to) {
    fileindex::ShareMigrate(plan.to, plan.old_path, plan.new_path);
  } else {
    MoveStatus(plan);
    fileindex::ShareRename(plan.from, plan.to);
  }
}

}  // namespace

void MoveDirectory(const SharePlan& plan, bool copied) {
  const bool is_old = IsDirExist(plan.old_path, false);
  const bool is_new = IsDirExist(plan.new_path, false);
  if (is_new && (!is_old || copied)) return;
  if (is_new) {
    throw Problem("\"" + plan.new_path + "\" is there already. Move it away; or, if it is a copy " +
                  "of \"" + plan.old_path + "\", move that one away.");
  }
  if (!is_old || copied) {
    throw Problem("There is no directory \"" + (copied ? plan.new_path : plan.old_path) +
                  "\". See that the disk is mounted.");
  }
  if (rename(plan.old_path.c_str(), plan.new_path.c_str()) != 0) {
    throw Problem(WhyNotMoved(plan, errno));
  }
  SyncDirectory(Dirname(plan.new_path));
  SyncDirectory(Dirname(plan.old_path));
}

void MoveShare(const SharePlan& plan, bool copied) {
  const fileindex::FolderMgr folders;
  if (!plan.registered && plan.from != plan.to && folders.IsShareIndexed(plan.to)) {
    throw Problem("Folders of a former share \"" + plan.to + "\" are still listed. Drop them: " +
                  "quarry share clear " + plan.to + " " + plan.new_path);
  }
  // After the folders have got their new names they are those of the new share.
  const bool indexed = folders.IsShareIndexed(plan.from) || folders.IsShareIndexed(plan.to);
  std::optional<WorkerBreak> pause;
  if (indexed) {
    RequireRunningSystem();
    pause.emplace(plan.from);
  }
  MoveFiles(plan, copied);
  platform::ShowMovingShares(true);
  if (indexed) MoveIndex(plan);
  platform::EndShareMove(plan.to);
}

}  // namespace quarry::cli
