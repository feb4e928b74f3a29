#include "common/file_util.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <memory>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/sdk/share.h"
#include "platform/include/filesystem.h"
#include "platform/include/user.h"

namespace quarry {
namespace {

// The system would take such a path for the shorter one before the NUL byte.
bool HasNul(const std::string& path) {
  return path.find('\0') != std::string::npos;
}

bool Lstat(const std::string& path, struct stat& info) {
  return !HasNul(path) && lstat(path.c_str(), &info) == 0;
}

// The text of a symbolic link, or "" when it cannot be read.
std::string LinkText(const std::string& path) {
  std::array<char, 4096> text{};
  const ssize_t length = readlink(path.c_str(), text.data(), text.size());
  if (length < 0) return "";
  return std::string(text.data(), static_cast<size_t>(length));
}

char LowerAscii(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

struct Account {
  uid_t uid;
  gid_t gid;
};

// The account under which the package's own files are kept.
Account ServiceAccount() {
  {
    LockMutex lock(sdk::SDKMutex());
    TARNUSER* record = nullptr;
    const int result = TARNUserGet("Quarry", &record);
    const std::unique_ptr<TARNUSER, decltype(&TARNUserFree)> user(record, &TARNUserFree);
    if (result >= 0 && user) return {user->uid, user->gid};
  }
  throw Error(kErrorServiceAccount);
}

}  // namespace

bool IsFileExist(const std::string& path) {
  struct stat info {};
  return Lstat(path, info) && S_ISREG(info.st_mode);
}

bool IsDirExist(const std::string& path, bool follow) {
  constexpr int kMaxHops = 40;
  std::string place = path;
  for (int hops = 0; hops <= kMaxHops; ++hops) {
    struct stat info {};
    if (!Lstat(place, info)) return false;
    if (S_ISDIR(info.st_mode)) return true;
    if (!follow || !S_ISLNK(info.st_mode)) return false;
    place = LinkText(place);
  }
  return false;
}

bool IsDirentDir(const dirent& entry, const std::string& /*path*/) {
  return entry.d_type == DT_DIR;
}

bool CheckACLPerm(const std::string& path, int perm) {
  if (HasNul(path)) return false;
  const int granted = TARNACLPermGet(path.c_str());
  return granted >= 0 && (granted & perm) != 0;
}

bool IsMountPoint(const std::string& path) {
  return !HasNul(path) && TARNFSDirIsMntPoint(path.c_str()) > 0;
}

bool StringStartWith(const std::string& text, const std::string& prefix) {
  return text.compare(0, prefix.size(), prefix) == 0;
}

std::string Basename(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == std::string::npos ? path : path.substr(slash + 1);
}

std::string Dirname(const std::string& path) {
  return path.substr(0, path.rfind('/'));
}

std::string GetFileExtension(const std::string& path, bool lower) {
  const std::string name = Basename(path);
  const size_t dot = name.rfind('.');
  if (dot == std::string::npos) return "";
  std::string extension = name.substr(dot + 1);
  if (lower) std::transform(extension.begin(), extension.end(), extension.begin(), LowerAscii);
  return extension;
}

std::string RealPath(const std::string& path) {
  if (HasNul(path)) return "";
  const std::unique_ptr<char, decltype(&std::free)> resolved(realpath(path.c_str(), nullptr),
                                                             &std::free);
  return resolved ? resolved.get() : "";
}

bool Unlink(const std::string& path) {
  if (HasNul(path)) {
    errno = EINVAL;
    return false;
  }
  return unlink(path.c_str()) == 0 || errno == ENOENT;
}

bool MVFileImpl(const std::string& from, const std::string& to, TARNCOPYARGS* args) {
  if (HasNul(from) || HasNul(to)) {
    errno = EINVAL;
    return false;
  }
  return TARNFileCopy(from.c_str(), to.c_str(), args) == 0;
}

bool MVFile(const std::string& from, const std::string& to) {
  TARNCOPYARGS args{};
  args.preserve = 1;
  args.move = 1;
  return MVFileImpl(from, to, &args);
}

bool CPFile(const std::string& from, const std::string& to) {
  TARNCOPYARGS args{};
  args.preserve = 1;
  return MVFileImpl(from, to, &args);
}

bool ChownQuarry(const std::string& path) {
  const Account account = ServiceAccount();
  if (HasNul(path)) {
    errno = EINVAL;
    return false;
  }
  return chown(path.c_str(), account.uid, account.gid) == 0;
}

}  // namespace quarry
