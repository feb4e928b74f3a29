#include "fileindex/config/folder_mgr.h"

#include <sys/stat.h>

#include <algorithm>
#include <functional>
#include <utility>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/paths.h"
#include "common/sdk/credentials.h"
#include "fileindex/config/state_file.h"
#include "fileindex/util/file_type.h"
#include "fileindex/util/util.h"
#include "platform/include/filesystem.h"

namespace quarry::fileindex {
namespace {

using FolderPtr = std::shared_ptr<Folder>;
using Less = std::function<bool(const FolderPtr&, const FolderPtr&)>;

Less ByFlag(bool (Folder::*flag)() const) {
  return [flag](const FolderPtr& a, const FolderPtr& b) { return (*a.*flag)() < (*b.*flag)(); };
}

Less ByText(const std::string& (Folder::*text)() const) {
  return [text](const FolderPtr& a, const FolderPtr& b) {
    return HLIBCUnicodeUTF8StrCaseCmp((*a.*text)().c_str(), (*b.*text)().c_str()) < 0;
  };
}

Less LessBy(const std::string& sort_by) {
  if (sort_by == "document") return ByFlag(&Folder::IsDocument);
  if (sort_by == "audio") return ByFlag(&Folder::IsAudio);
  if (sort_by == "video") return ByFlag(&Folder::IsVideo);
  if (sort_by == "photo") return ByFlag(&Folder::IsPhoto);
  return ByText(sort_by == "path" ? &Folder::GetPath : &Folder::GetName);
}

bool WantsType(const Folder& folder, FileType type) {
  switch (type) {
    case kDocument:
      return folder.IsDocument();
    case kAudio:
      return folder.IsAudio();
    case kVideo:
      return folder.IsVideo();
    case kImage:
      return folder.IsPhoto();
    default:
      return true;
  }
}

}  // namespace

const std::string kFileIndexFoldersCfgPath =
    RootedPath("/var/packages/Quarry/etc/fileindex.folders");

FolderMgr::FolderMgr() {
  Json::Value folders(Json::arrayValue);
  if (IsAnythingAt(kFileIndexFoldersCfgPath) && !fromFile(folders, kFileIndexFoldersCfgPath)) {
    Fail(QUARRY_SITE_AT("folder_mgr", 39),
         "IsFileExist(kFileIndexFoldersCfgPath) && !folders.fromFile(kFileIndexFoldersCfgPath)",
         kErrorLoadFile, "Cannot load json: " + kFileIndexFoldersCfgPath);
  }
  if (!folders.isArray()) {
    Fail(QUARRY_SITE("folder_mgr"), "!folders.isArray()", kErrorBadParameter,
         "Not an array" + AppendData(folders));
  }
  folders_.reserve(folders.size());
  for (const Json::Value& it : folders) folders_.push_back(std::make_shared<Folder>(it));
}

void FolderMgr::Save() const {
  Json::Value folders(Json::arrayValue);
  for (const FolderPtr& folder : folders_) folders.append(folder->GetData());

  const sdk::SDKCredentials credentials("root");
  if (!toFile(folders, kFileIndexFoldersCfgPath)) {
    Fail(QUARRY_SITE_AT("folder_mgr", 229), "!folders.toFile(kFileIndexFoldersCfgPath)",
         kErrorSaveFile, kFileIndexFoldersCfgPath);
  }
  if (-1 == chmod(kFileIndexFoldersCfgPath.c_str(), 0644)) {
    Fail(QUARRY_SITE_AT("folder_mgr", 231), "-1 == chmod(kFileIndexFoldersCfgPath, 0644)",
         kErrorSystem, kFileIndexFoldersCfgPath);
  }
}

void FolderMgr::Get(FolderPtr& out, const std::string& path) const {
  const auto it = std::find_if(folders_.begin(), folders_.end(),
                               [&](const FolderPtr& folder) { return folder->GetPath() == path; });
  if (it == folders_.end()) {
    Fail(QUARRY_SITE("folder_mgr"), "it == folders_.end()", kErrorFolderNotFound);
  }
  out = *it;
}

bool FolderMgr::HasFolder(const std::string& path) const {
  return std::any_of(folders_.begin(), folders_.end(),
                     [&](const FolderPtr& folder) { return folder->GetPath() == path; });
}

FolderPtr FolderMgr::GetMostSuitableCfg(const std::string& full_path) const {
  const FolderPtr* best = nullptr;
  std::size_t best_length = 0;
  for (const FolderPtr& folder : folders_) {
    const std::size_t length = folder->FullPath().size();
    if (length <= best_length || !folder->Covers(full_path)) continue;
    best = &folder;
    best_length = length;
  }
  return best == nullptr ? FolderPtr() : *best;
}

bool FolderMgr::IsFullPathNeedMeta(const std::string& full_path) const {
  const FolderPtr folder = GetMostSuitableCfg(full_path);
  return folder && WantsType(*folder, GetFileTypeByFullPath(full_path));
}

bool FolderMgr::IsFullPathHasOwnCfg(const std::string& full_path) const {
  return std::any_of(folders_.begin(), folders_.end(),
                     [&](const FolderPtr& folder) { return folder->FullPath() == full_path; });
}

bool FolderMgr::IsFullPathIndexed(const std::string& full_path) const {
  return std::any_of(folders_.begin(), folders_.end(),
                     [&](const FolderPtr& folder) { return folder->Covers(full_path); });
}

bool FolderMgr::IsShareIndexed(const std::string& share) const {
  return std::any_of(folders_.begin(), folders_.end(), [&](const FolderPtr& folder) {
    return GetShareNameByPath(folder->GetPath()) == share;
  });
}

std::set<std::string> FolderMgr::GetIndexedShares() const {
  std::set<std::string> shares;
  for (const FolderPtr& folder : folders_) shares.insert(folder->Share());
  return shares;
}

void FolderMgr::Upsert(FolderPtr& diff, FolderPtr folder) {
  diff = DiffCfg(folder, GetMostSuitableCfg(folder->FullPath()));
  Remove(folder->GetPath());
  folders_.push_back(std::move(folder));
  if (folders_.size() > kFileIndexFoldersMax) {
    Fail(QUARRY_SITE_AT("folder_mgr", 76), "folders_.size() > kFileIndexFoldersMax",
         kErrorTooManyFolders);
  }
}

void FolderMgr::Delete(FolderPtr& diff, const std::string& path) {
  const std::string full_path = GetFullPath(path);
  const FolderPtr before = GetMostSuitableCfg(full_path);
  if (!before) Fail(QUARRY_SITE("folder_mgr"), "!before", kErrorFolderNotFound);
  Remove(path);
  diff = DiffCfg(before, GetMostSuitableCfg(full_path));
}

void FolderMgr::DeleteByShare(const std::string& share) {
  const auto in_share = [&](const FolderPtr& folder) { return folder->Share() == share; };
  folders_.erase(std::remove_if(folders_.begin(), folders_.end(), in_share), folders_.end());
}

void FolderMgr::List(std::vector<FolderPtr>& out, unsigned int& total, unsigned int offset,
                     unsigned int limit, const std::string& sort_by,
                     const std::string& sort_direction) const {
  total = static_cast<unsigned int>(folders_.size());
  out = folders_;
  // The comparison of texts is the host's. Where it contradicts itself this sort still stays within
  // the list, which std::sort would not.
  std::stable_sort(out.begin(), out.end(), LessBy(sort_by));
  if (sort_direction == "desc") std::reverse(out.begin(), out.end());
  out.erase(out.begin(), out.begin() + std::min(offset, total));
  if (out.size() > limit) out.resize(limit);
}

FolderPtr FolderMgr::DiffCfg(FolderPtr now, FolderPtr before) {
  const auto differs = [&](bool (Folder::*flag)() const) {
    return !before || (*now.*flag)() != (*before.*flag)();
  };
  return std::make_shared<Folder>(now->GetPath(), now->GetName(), differs(&Folder::IsDocument),
                                  differs(&Folder::IsAudio), differs(&Folder::IsVideo),
                                  differs(&Folder::IsPhoto), false, false);
}

void FolderMgr::Remove(const std::string& path) {
  const auto is_path = [&](const FolderPtr& folder) { return folder->GetPath() == path; };
  folders_.erase(std::remove_if(folders_.begin(), folders_.end(), is_path), folders_.end());
}

}  // namespace quarry::fileindex
