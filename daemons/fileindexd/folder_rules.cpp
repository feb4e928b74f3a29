#include "daemons/fileindexd/folder_rules.h"

#include <algorithm>

#include "common/file_util.h"
#include "fileindex/util/file_type.h"

namespace quarry::fileindexd {

FolderRules::FolderRules(const std::vector<FolderRule>& folders) {
  for (const FolderRule& folder : folders) {
    const std::size_t length = folder.full_path.size();
    folders_.emplace(folder.full_path, folder);
    if (length >= lengths_.size()) lengths_.resize(length + 1);
    lengths_[length] = true;
  }
}

const FolderRule* FolderRules::At(std::string_view path) const {
  if (path.size() >= lengths_.size() || !lengths_[path.size()]) return nullptr;
  const auto found = folders_.find(path);
  return found == folders_.end() ? nullptr : &found->second;
}

const FolderRule* FolderRules::Governing(std::string_view path) const {
  while (!path.empty()) {
    if (const FolderRule* folder = At(path)) return folder;
    const std::size_t slash = path.rfind('/');
    if (slash == std::string_view::npos) return nullptr;
    path = path.substr(0, slash);
  }
  return nullptr;
}

bool FolderRules::HasFolderBelow(const std::string& path) const {
  const std::string prefix = path + "/";
  const auto next = folders_.lower_bound(prefix);
  return next != folders_.end() && StringStartWith(next->first, prefix);
}

std::vector<const FolderRule*> FolderRules::FoldersBelow(const std::string& path) const {
  const std::string prefix = path + "/";
  std::vector<const FolderRule*> below;
  for (auto it = folders_.lower_bound(prefix);
       it != folders_.end() && StringStartWith(it->first, prefix); ++it) {
    below.push_back(&it->second);
  }
  return below;
}

bool FolderRules::TouchesPaused(const std::string& path) const {
  const FolderRule* governing = Governing(path);
  if (governing != nullptr && governing->paused) return true;
  const std::vector<const FolderRule*> below = FoldersBelow(path);
  return std::any_of(below.begin(), below.end(), [](const FolderRule* f) { return f->paused; });
}

bool FolderRules::AllPaused() const {
  return std::all_of(folders_.begin(), folders_.end(),
                     [](const auto& entry) { return entry.second.paused; });
}

bool FolderRules::WantsContent(const std::string& path) const {
  const FolderRule* folder = Governing(path);
  if (folder == nullptr) return false;
  switch (fileindex::GetFileTypeByFullPath(path)) {
    case fileindex::kDocument:
      return folder->document;
    case fileindex::kAudio:
      return folder->audio;
    case fileindex::kVideo:
      return folder->video;
    case fileindex::kImage:
      return folder->photo;
    case fileindex::kOther:
      break;
  }
  return true;
}

}  // namespace quarry::fileindexd
