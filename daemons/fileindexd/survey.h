// What a place on the disk means for the index.

#ifndef QUARRY_DAEMONS_FILEINDEXD_SURVEY_H_
#define QUARRY_DAEMONS_FILEINDEXD_SURVEY_H_

#include <functional>
#include <memory>
#include <string>

#include "daemons/fileindexd/file_system.h"
#include "daemons/fileindexd/folder_rules.h"

namespace quarry::fileindexd {

enum class Verdict {
  kWanted,    // it is to have a document
  kUnwanted,  // it is to have none
  kAside,     // its folder is paused: nothing is changed
  kDoubtful,  // what is there cannot be told: nothing is changed
};

struct Finding {
  Verdict verdict = Verdict::kUnwanted;
  Place place;  // of a wanted place: a file or a directory
};

// Wanted are files and directories that a folder governs. Not wanted are names that the system
// keeps for itself, symbolic links and special files, what lies in a recycle bin, and other file
// systems below a folder: none of these is entered either. A folder's own place is wanted whatever
// its name and mount.
class Survey {
 public:
  using Rules = std::shared_ptr<const FolderRules>;
  using RulesSource = std::function<Rules()>;
  // Whether a directory is a recycle bin or lies in one.
  using RecyclePredicate = std::function<bool(const std::string& path)>;

  // `rules` is asked anew for each place, so that a change takes effect in the middle of a walk; it
  // may throw, and all members then do. The file system must outlive the survey.
  Survey(FileSystem& files, RulesSource rules, RecyclePredicate in_recycle_bin);

  Rules rules() const { return rules_(); }
  FileSystem& files() const { return files_; }

  // Any place at all.
  Finding Examine(const std::string& path) const;
  // An entry of a directory that is wanted.
  Finding ExamineEntry(const std::string& path) const;
  // Whether a document of the place is to be left alone though nothing may be there.
  bool IsAside(const std::string& path) const;
  // Whether the place's content is to be read.
  bool WantsContent(const std::string& path, const Place& place) const;

 private:
  bool NamesAllowed(const std::string& base, const std::string& path) const;
  Verdict JudgePlace(const std::string& path, const Place& place) const;

  FileSystem& files_;
  RulesSource rules_;
  RecyclePredicate in_recycle_bin_;
};

// `path` with single slashes and none at its end; empty when it is not absolute, or has a component
// "." or ".." or a NUL byte, and so names no place that could be in an index.
std::string Canonical(const std::string& path);

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_SURVEY_H_
