#include "daemons/fileindexd/survey.h"

#include <algorithm>
#include <climits>
#include <utility>

#include "common/file_util.h"
#include "fileindex/util/util.h"

namespace quarry::fileindexd {

Survey::Survey(FileSystem& files, RulesSource rules, RecyclePredicate in_recycle_bin)
    : files_(files), rules_(std::move(rules)), in_recycle_bin_(std::move(in_recycle_bin)) {}

bool Survey::NamesAllowed(const std::string& base, const std::string& path) const {
  std::size_t begin = base.size() + 1;
  while (begin < path.size()) {
    const std::size_t end = std::min(path.find('/', begin), path.size());
    if (fileindex::IsSystemPreservedFileName(path.substr(begin, end - begin))) return false;
    begin = end + 1;
  }
  return true;
}

Verdict Survey::JudgePlace(const std::string& path, const Place& place) const {
  if (place.kind == PlaceKind::kUnknown) return Verdict::kDoubtful;
  if (place.kind != PlaceKind::kFile && place.kind != PlaceKind::kDirectory) {
    return Verdict::kUnwanted;
  }
  // No system call takes such a path, so nobody could read the file.
  if (path.size() >= PATH_MAX) return Verdict::kDoubtful;
  return Verdict::kWanted;
}

Finding Survey::Examine(const std::string& path) const {
  const Rules rules = rules_();
  const FolderRule* folder = rules->Governing(path);
  Finding finding;
  if (folder == nullptr) return finding;
  if (folder->paused) {
    finding.verdict = Verdict::kAside;
    return finding;
  }
  if (!NamesAllowed(folder->full_path, path)) return finding;
  finding.place = files_.Look(folder->full_path, path);
  finding.verdict = JudgePlace(path, finding.place);
  if (finding.verdict == Verdict::kWanted && in_recycle_bin_(path)) {
    finding.verdict = Verdict::kUnwanted;
  }
  return finding;
}

Finding Survey::ExamineEntry(const std::string& path) const {
  const Rules rules = rules_();
  if (rules->At(path) != nullptr) return Examine(path);
  Finding finding;
  if (IsAside(path)) {
    finding.verdict = Verdict::kAside;
  } else if (!fileindex::IsSystemPreservedFileName(Basename(path))) {
    finding.place = files_.Peek(path);
    finding.verdict = JudgePlace(path, finding.place);
  }
  // What is in a directory outside every bin can only be in one by being the bin.
  if (finding.verdict == Verdict::kWanted && finding.place.kind == PlaceKind::kDirectory &&
      in_recycle_bin_(path)) {
    finding.verdict = Verdict::kUnwanted;
  }
  return finding;
}

bool Survey::IsAside(const std::string& path) const {
  const Rules rules = rules_();
  const FolderRule* folder = rules->Governing(path);
  return folder != nullptr && folder->paused;
}

bool Survey::WantsContent(const std::string& path, const Place& place) const {
  return place.kind == PlaceKind::kFile && rules_()->WantsContent(path);
}

std::string Canonical(const std::string& path) {
  if (path.empty() || path[0] != '/' || path.find('\0') != std::string::npos) return "";
  std::string result;
  std::size_t begin = 1;
  while (begin < path.size()) {
    const std::size_t end = std::min(path.find('/', begin), path.size());
    const std::string name = path.substr(begin, end - begin);
    if (name == "." || name == "..") return "";
    if (!name.empty()) result += "/" + name;
    begin = end + 1;
  }
  return result;
}

}  // namespace quarry::fileindexd
