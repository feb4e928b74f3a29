// The list of indexed folders, and the file that keeps it.

#ifndef QUARRY_FILEINDEX_CONFIG_FOLDER_MGR_H_
#define QUARRY_FILEINDEX_CONFIG_FOLDER_MGR_H_

#include <cstddef>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "common/export.h"
#include "fileindex/config/folder.h"

namespace quarry {
namespace fileindex {

// The folder list file: one JSON array of what Folder::GetData() gives, in list order, mode 0644.
QUARRY_EXPORT extern const std::string kFileIndexFoldersCfgPath;

// The most folders that the list may hold.
inline constexpr std::size_t kFileIndexFoldersMax = 1000;

// A short-lived value: load, ask or change, Save(). It takes no lock; whoever changes the list
// holds the lock file "/tmp/quarry_cfg_folder.lock" from before the load until after the save. One
// object is for one thread at a time, const members too. Records are shared with the caller.
//
// "Full path" arguments are absolute paths, "path" arguments are share paths. The questions about
// full paths ask every folder for its own, so a folder whose share has vanished makes them throw
// Error 800; a record whose path does not begin with "/" makes them throw Error 120.
class QUARRY_EXPORT FolderMgr {
 public:
  // Loads the file; none at all is an empty list. Throws Error 504 when there is something that
  // cannot be read as JSON or is no regular file, Error 120 when it is no array of folder records.
  FolderMgr();

  // Replaces the file, whole and durably, as the user root. Throws Error 505 when it cannot be
  // written, 502 when its mode cannot be set, 503 when root cannot be become.
  void Save() const;

  // Every record, in list order.
  const std::vector<std::shared_ptr<Folder>>& GetFolders() const { return folders_; }

  // Hands out the record whose path equals `path`. Throws Error 902 when there is none; `out` then
  // stays as it was.
  void Get(std::shared_ptr<Folder>& out, const std::string& path) const;
  bool HasFolder(const std::string& path) const;

  // The deepest folder at or above the full path, the one that governs it; empty when there is
  // none.
  std::shared_ptr<Folder> GetMostSuitableCfg(const std::string& full_path) const;

  // Whether the governing folder wants the content of this file, judged by its name. False when no
  // folder governs it; true for files of no kind.
  bool IsFullPathNeedMeta(const std::string& full_path) const;
  // Whether a folder sits exactly here.
  bool IsFullPathHasOwnCfg(const std::string& full_path) const;
  // Whether some folder governs the full path.
  bool IsFullPathIndexed(const std::string& full_path) const;

  // Whether some folder lies in the share, and the names of all shares that have one.
  bool IsShareIndexed(const std::string& share) const;
  std::set<std::string> GetIndexedShares() const;

  // Inserts `folder`, which must not be empty, at the end of the list, in place of any record of
  // the same path. `diff` becomes DiffCfg of it and the folder that governed its place before.
  // Throws Error 900 when the list now holds more than kFileIndexFoldersMax records; the list then
  // keeps the record and must not be saved.
  void Upsert(std::shared_ptr<Folder>& diff, std::shared_ptr<Folder> folder);

  // Removes the record of `path`. `diff` becomes DiffCfg of the folder that governed the place and
  // the one that governs it now: a record with no kind changed when `path` has no record of its own
  // but an enclosing folder. Throws Error 902 when no folder governs the place; nothing is changed
  // then.
  void Delete(std::shared_ptr<Folder>& diff, const std::string& path);

  // Removes every folder of the share.
  void DeleteByShare(const std::string& share);

  // A page of the sorted list: the first `offset` records are left out, then at most `limit` kept.
  // `total` counts all records. `sort_by` is "document", "audio", "video" or "photo" (false first),
  // "path", or anything else for the name, both without regard to case; "desc" turns the order
  // round. The order among equals is not fixed.
  void List(std::vector<std::shared_ptr<Folder>>& out, unsigned int& total, unsigned int offset,
            unsigned int limit, const std::string& sort_by,
            const std::string& sort_direction) const;

  // A new record with the path and name of `now`, which must not be empty: those of the four kinds
  // are true that `now` and `before` do not agree on, all four when `before` is empty.
  static std::shared_ptr<Folder> DiffCfg(std::shared_ptr<Folder> now,
                                         std::shared_ptr<Folder> before);

 private:
  void Remove(const std::string& path);

  std::vector<std::shared_ptr<Folder>> folders_;
};

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_FILEINDEX_CONFIG_FOLDER_MGR_H_
