// Which folder governs a place of a share.

#ifndef QUARRY_DAEMONS_FILEINDEXD_FOLDER_RULES_H_
#define QUARRY_DAEMONS_FILEINDEXD_FOLDER_RULES_H_

#include <functional>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace quarry::fileindexd {

// One indexed folder.
struct FolderRule {
  std::string path;       // the share path: the folder's identity
  std::string full_path;  // where it is
  bool document = false;
  bool audio = false;
  bool video = false;
  bool photo = false;
  bool paused = false;

  bool operator==(const FolderRule&) const = default;
};

// The folders of one share, by the rule of the library's FolderMgr: the deepest folder at or above
// a place governs it. Unlike that class it knows one share only, so that no other share's trouble
// matters, and answers in a time that does not grow with the number of folders. Never changes; may
// be used from any thread. Places are full paths.
class FolderRules {
 public:
  // Of two folders with the same place the first one counts.
  explicit FolderRules(const std::vector<FolderRule>& folders);

  // All folders, in ascending order of place.
  using Folders = std::map<std::string, FolderRule, std::less<>>;
  const Folders& folders() const { return folders_; }

  // The folder exactly at the place, or that governs it; null when there is none.
  const FolderRule* At(std::string_view path) const;
  const FolderRule* Governing(std::string_view path) const;

  // Whether a folder lies below the place, itself not counted.
  bool HasFolderBelow(const std::string& path) const;
  // These folders.
  std::vector<const FolderRule*> FoldersBelow(const std::string& path) const;

  // Whether the folder that governs the place, or one below it, is paused.
  bool TouchesPaused(const std::string& path) const;

  // Whether no folder is to be worked on.
  bool AllPaused() const;

  // Whether the governing folder wants the content of a file of this name; false without one.
  bool WantsContent(const std::string& path) const;

  bool operator==(const FolderRules&) const = default;

 private:
  Folders folders_;
  // By length of a place whether there is a folder of such a place: every file asks for all places
  // above its own, and hardly any is as long as a folder's.
  std::vector<bool> lengths_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_FOLDER_RULES_H_
