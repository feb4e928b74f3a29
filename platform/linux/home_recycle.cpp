// The recycle bins of users' home folders, which are the directories in the share "homes".

#include <dirent.h>
#include <pwd.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "platform/include/recycle.h"
#include "platform/linux/keep_errno.h"
#include "platform/linux/last_error.h"
#include "platform/linux/share_store.h"

namespace quarry::platform {
namespace {

constexpr char kHomesShare[] = "homes";
constexpr char kRecycleName[] = "/#recycle";
constexpr char kAccountFile[] = "/etc/passwd";

using Names = std::vector<std::string>;

bool IsDirectory(const std::string& path) {
  const KeepErrno keep;
  struct stat info {};
  return lstat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

// The names in a directory, sorted. False, with errno set, when it cannot be read.
bool ListDirectory(const std::string& path, Names* names) {
  const std::unique_ptr<DIR, int (*)(DIR*)> directory(opendir(path.c_str()), &closedir);
  if (directory == nullptr) return false;
  const int before = errno;
  errno = 0;
  while (const dirent* entry = readdir(directory.get())) {
    const std::string name = entry->d_name;
    if (name != "." && name != "..") names->push_back(name);
  }
  if (errno != 0) return false;
  errno = before;
  std::sort(names->begin(), names->end());
  return true;
}

// The accounts that this machine keeps itself; all others come from a directory service.
bool LocalAccounts(std::set<std::string>* names) {
  const std::unique_ptr<FILE, int (*)(FILE*)> file(fopen(kAccountFile, "re"), &fclose);
  if (file == nullptr) return false;
  const KeepErrno keep;  // the end of the file is an error to fgetpwent
  while (const passwd* entry = fgetpwent(file.get())) names->insert(entry->pw_name);
  return true;
}

// Appends the recycle bins of the homes that `wanted` accepts.
template <typename Wanted>
int EnumRecyclePaths(HLIBCSZLIST** list, Wanted wanted) {
  if (list == nullptr) {
    errno = EINVAL;
    return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  }
  const ShareList shares = TryLoadShares();
  if (shares == nullptr) return -1;
  const auto homes = std::find_if(shares->begin(), shares->end(), [](const ShareRecord& share) {
    return share.name == kHomesShare;
  });
  if (homes == shares->end()) return 0;
  Names names;
  if (!ListDirectory(homes->path, &names)) return QUARRY_PLATFORM_FAIL(kErrSystem);
  for (const std::string& name : names) {
    const std::string path = homes->path + "/" + name + kRecycleName;
    if (!wanted(name) || !IsDirectory(path)) continue;
    if (HLIBCSzListPush(path.c_str(), list) < 0) return QUARRY_PLATFORM_FAIL(kErrSystem);
  }
  return 0;
}

}  // namespace

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int TARNRecycleHomeEnumRecyclePath(HLIBCSZLIST** list) {
  return EnumRecyclePaths(list, [](const std::string&) { return true; });
}

int TARNRecycleHomeEnumRecyclePathForAuthType(HLIBCSZLIST** list, AUTH_TYPE auth) {
  std::set<std::string> local;
  if (!LocalAccounts(&local)) return QUARRY_PLATFORM_FAIL(kErrSystem);
  return EnumRecyclePaths(list, [&](const std::string& name) {
    return (local.count(name) != 0) == (auth == AUTH_TYPE_LOCAL);
  });
}

}  // extern "C"
