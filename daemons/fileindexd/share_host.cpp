#include "daemons/fileindexd/share_host.h"

#include <vector>

#include "common/error.h"
#include "common/file_util.h"
#include "common/lock_file.h"
#include "common/paths.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/util/util.h"

namespace quarry::fileindexd {
namespace {

using fileindex::Folder;
using fileindex::FolderMgr;
using fileindex::StatusMgr;

const std::string kFolderLock = RootedPath("/tmp/quarry_cfg_folder.lock");

FolderRule ToRule(const Folder& folder, const std::string& volume) {
  FolderRule rule;
  rule.path = folder.GetPath();
  rule.full_path = volume + folder.GetPath();
  rule.document = folder.IsDocument();
  rule.audio = folder.IsAudio();
  rule.video = folder.IsVideo();
  rule.photo = folder.IsPhoto();
  rule.paused = folder.IsPaused();
  return rule;
}

// A record without a share belongs to nobody, and must not be in anybody's way.
bool LiesIn(const Folder& folder, const std::string& share) {
  try {
    return folder.GetShare() == share;
  } catch (const Error&) {
    return false;
  }
}

class LiveShareHost : public ShareHost {
 public:
  explicit LiveShareHost(const std::string& share) : share_(share) {}

  ShareLayout Load() override {
    const sdk::SDKShare share(share_);
    ShareLayout layout;
    layout.root = share.GetPath();
    layout.queue_path = share.GetQueuePath();
    std::vector<FolderRule> folders;
    const FolderMgr list;
    for (const auto& folder : list.GetFolders()) {
      if (LiesIn(*folder, share_)) folders.push_back(ToRule(*folder, Dirname(layout.root)));
    }
    layout.rules = std::make_shared<const FolderRules>(folders);
    return layout;
  }

  bool NeedsReindex() override {
    const int bits = StatusMgr().GetShareStatus(share_);
    return (bits & fileindex::kShareNeedReindex) != 0 && (bits & fileindex::kShareNeedRebuild) == 0;
  }

  void MarkNeedsReindex() override {
    StatusMgr().SetShareStatus(share_, fileindex::kShareNeedReindex);
  }

  void ClearNeedsReindex() override {
    StatusMgr().UnsetShareStatus(share_, fileindex::kShareNeedReindex);
  }

  // Only a name can make a place a bin, but for the share of the users' homes.
  bool IsInRecycleBin(const std::string& path) override {
    if (share_ != "homes" && path.find("#recycle") == std::string::npos) return false;
    return fileindex::IsFullPathInRecycleBin(path);
  }

  bool CreateIndexIfWanted(const std::function<void()>& create) override {
    const LockFile lock(kFolderLock, true);
    if (Load().rules->folders().empty()) return false;
    create();
    return true;
  }

 private:
  const std::string share_;
};

}  // namespace

std::unique_ptr<ShareHost> MakeShareHost(const std::string& share) {
  return std::make_unique<LiveShareHost>(share);
}

}  // namespace quarry::fileindexd
