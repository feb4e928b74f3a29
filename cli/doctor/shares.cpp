// Shares that have vanished, and folders that cannot be indexed any longer.

#include <map>
#include <set>

#include "cli/doctor/checks.h"
#include "cli/doctor/known_places.h"
#include "cli/folders.h"
#include "cli/share_plan.h"
#include "common/error.h"
#include "common/file_util.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/util/util.h"
#include "platform/linux/share_registry.h"

namespace quarry::cli {
namespace {

using platform::ShareRecord;

void LeaveUnknownShare(Examination& examination, const std::string& name,
                       const std::map<std::string, std::string>& with_index) {
  const auto found = with_index.find(name);
  const std::string path = found == with_index.end() ? "/ITS/FULL/PATH" : found->second;
  examination.Leave("The share " + name + " is not known any more, but is to be indexed",
                    "Make it known again: quarry share add " + path +
                        "   or drop it from the index: quarry share clear " + name + " " + path);
}

// Whether the share's folders can be looked at.
bool CheckShare(Examination& examination, const std::vector<ShareRecord>& shares,
                const ShareRecord& share, bool indexed) {
  if (!share.moved_from.empty()) {
    examination.Leave("The move of the share " + share.name + " was cut short",
                      "End it with: " + UnfinishedMove(shares, share.name));
    return false;
  }
  if (IsDirExist(share.path, true)) return true;
  const std::string trouble =
      "The directory of the share " + share.name + " (" + share.path + ") is not there";
  if (indexed) {
    examination.Leave(trouble,
                      "Bring its disk back, and indexing goes on   or drop it from the index: "
                      "quarry share pause " +
                          share.name + "; quarry share clear " + share.name);
  } else {
    examination.Note(trouble, "To forget it: quarry share remove " + share.name);
  }
  return false;
}

void CheckFolder(Examination& examination, const std::string& path) {
  if (fileindex::CanPathBeIndexed(path)) return;
  examination.Leave("The folder " + path +
                        " cannot be indexed any longer (moved, unmounted, encrypted or read-only)",
                    "Bring it back, or index it no longer: quarry folder delete " + path);
}

}  // namespace

void CheckShares(Examination& examination) {
  const std::vector<ShareRecord> shares = platform::ReadShares();
  const auto folders = AllFolders();
  const std::set<std::string> indexed = fileindex::FolderMgr().GetIndexedShares();
  std::set<std::string> known;
  std::set<std::string> there;
  for (const ShareRecord& share : shares) {
    known.insert(share.name);
    known.insert(Basename(share.moved_from));
    if (CheckShare(examination, shares, share, indexed.count(share.name) > 0)) {
      there.insert(share.name);
    }
  }
  for (const std::string& name : indexed) {
    if (known.count(name) == 0) LeaveUnknownShare(examination, name, SharesWithIndex());
  }
  for (const auto& folder : folders) {
    if (there.count(folder->GetShare()) > 0) CheckFolder(examination, folder->GetPath());
  }
}

}  // namespace quarry::cli
