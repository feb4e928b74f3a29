#include <set>

#include "cli/doctor/checks.h"
#include "cli/doctor/queue_file.h"
#include "common/error.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder_mgr.h"

namespace quarry::cli {
namespace {

void CheckQueue(Examination& examination, const std::string& path, const std::string& share_path) {
  const std::uint64_t bad = CountBadLines(path);
  if (bad == 0) return;
  examination.Mend("The queue " + path + " has lines that cannot be read: " + std::to_string(bad),
                   "taken out; the share is compared with its files", [&] {
                     // A worker may have been done with them meanwhile.
                     RemoveBadLines(path, share_path);
                     return "";
                   });
}

void CheckShare(Examination& examination, const std::string& name) {
  const sdk::SDKShare share(name);
  // The snapshot first, because that is where lines go from the queue.
  CheckQueue(examination, share.GetQueuePath() + ".tmp", share.GetPath());
  CheckQueue(examination, share.GetQueuePath(), share.GetPath());
}

}  // namespace

void CheckQueues(Examination& examination) {
  const std::set<std::string> indexed = fileindex::FolderMgr().GetIndexedShares();
  for (const std::string& name : sdk::SDKShare::Enum()) {
    if (indexed.count(name) == 0) continue;
    examination.Part("the queue of " + name, [&](Examination& part) { CheckShare(part, name); });
  }
}

}  // namespace quarry::cli
