#include "platform/linux/share_registry.h"

#include <json/json.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>

#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/paths.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/path_name.h"
#include "platform/linux/share_store.h"

namespace quarry::platform {
namespace {

constexpr std::size_t kMaxNameBytes = 255;
constexpr std::size_t kMaxPathBytes = 3000;

[[noreturn]] void Refuse(const std::string& sentence) {
  throw Error(kErrorBadParameter, sentence);
}

[[noreturn]] void SystemFailure(const std::string& what) {
  throw Error(kErrorSystem, what + ": " + std::strerror(errno));
}

bool HasControlCharacter(const std::string& text) {
  return std::any_of(text.begin(), text.end(), [](char c) {
    const auto byte = static_cast<unsigned char>(c);
    return byte < 0x20 || byte == 0x7f;
  });
}

void RequireDirectory(const std::string& path) {
  struct stat info {};
  if (stat(path.c_str(), &info) != 0) Refuse("\"" + path + "\": " + std::strerror(errno) + ".");
  if (!S_ISDIR(info.st_mode)) Refuse("\"" + path + "\" is no directory.");
  const std::string resolved = ResolvedPath(path);
  if (resolved.empty()) SystemFailure("Cannot resolve \"" + path + "\"");
  if (path != resolved) {
    Refuse("\"" + path + "\" leads through a link; the directory is \"" + resolved + "\".");
  }
}

void RequireNoConflict(const ShareRecord& share, const ShareRecord& other) {
  if (other.name == share.name) {
    Refuse("There is a share called \"" + share.name + "\" already, at \"" + other.path + "\".");
  }
  if (other.path == share.path) {
    Refuse("\"" + share.path + "\" is the share \"" + other.name + "\" already.");
  }
  if (IsSameOrBelow(share.path, other.path)) {
    Refuse("\"" + share.path + "\" lies in the share \"" + other.name + "\": add it as a folder.");
  }
  if (IsSameOrBelow(other.path, share.path)) {
    Refuse("\"" + share.path + "\" contains the share \"" + other.name + "\" (\"" + other.path +
           "\"): shares do not contain each other.");
  }
  if (NameForPath(other.path) == NameForPath(share.path)) {
    Refuse("\"" + share.path + "\" cannot be told from \"" + other.path +
           "\": use a shorter path.");
  }
}

Json::Value ToJson(const std::vector<ShareRecord>& shares) {
  Json::Value list(Json::arrayValue);
  for (const ShareRecord& share : shares) {
    Json::Value entry;
    entry["name"] = share.name;
    entry["path"] = share.path;
    entry["encrypted"] = share.encrypted;
    entry["encryption"] = share.encryption;
    entry["read_only"] = share.read_only;
    entry["hide_unreadable"] = share.hide_unreadable;
    entry["recycle_bin"] = share.recycle_bin;
    if (!share.moved_from.empty()) entry["moved_from"] = share.moved_from;
    list.append(entry);
  }
  Json::Value root;
  root["shares"] = list;
  return root;
}

void Save(const std::vector<ShareRecord>& shares) {
  if (!WriteFileDurably(ShareFilePath(), toString(ToJson(shares)) + "\n")) {
    SystemFailure("Cannot write " + ShareFilePath());
  }
}

void MakeStateDirectories() {
  for (const char* fixed :
       {"/var/lib/quarry/queue", "/var/lib/quarry/index", "/var/lib/quarry/monitor"}) {
    const std::string directory = RootedPath(fixed);
    // What lies there tells of files that not everybody may see.
    if (!MakeDirectories(directory, 0750)) SystemFailure("Cannot make " + directory);
  }
}

ShareRecord* Find(std::vector<ShareRecord>& shares, const std::string& name) {
  const auto found = std::find_if(shares.begin(), shares.end(),
                                  [&](const ShareRecord& share) { return share.name == name; });
  return found == shares.end() ? nullptr : &*found;
}

// The record of a share that is to live at `new_path`.
ShareRecord MovedTo(const ShareRecord& share, const std::string& new_path) {
  if (!share.moved_from.empty()) {
    Refuse("The share \"" + share.name + "\" is still on its way from \"" + share.moved_from +
           "\".");
  }
  ShareRecord moved = share;
  moved.path = new_path;
  moved.name = new_path.substr(new_path.rfind('/') + 1);
  moved.moved_from = share.path;
  ValidateShare(moved);
  if (IsSameOrBelow(new_path, share.path)) {
    Refuse("\"" + new_path + "\" lies in the share itself.");
  }
  RequireDirectory(new_path);
  return moved;
}

// The lock under which the file is read and replaced; its directory is made first.
std::unique_ptr<LockFile> LockShares() {
  const std::string directory = ParentDirectory(ShareFilePath());
  if (!MakeDirectories(directory, 0755)) SystemFailure("Cannot make " + directory);
  return std::make_unique<LockFile>(ShareFilePath() + ".lock", true);
}

}  // namespace

void ValidateShare(const ShareRecord& share) {
  const std::string& name = share.name;
  if (name.empty() || name == "." || name == "..") Refuse("A share needs a name.");
  if (name.size() > kMaxNameBytes || name.find('/') != std::string::npos ||
      HasControlCharacter(name)) {
    Refuse("A share's name has at most 255 bytes, no \"/\" and no control characters.");
  }
  const std::string& path = share.path;
  if (path.find('\0') != std::string::npos || !IsPlainAbsolutePath(path)) {
    Refuse("\"" + path +
           "\" cannot be a share: give an absolute path below \"/\", without \".\", "
           "\"..\", \"//\" or a \"/\" at its end.");
  }
  if (path.size() > kMaxPathBytes) Refuse("A share's path has at most 3000 bytes.");
  if (path.substr(path.rfind('/') + 1) != name) {
    Refuse("The share \"" + name + "\" cannot live at \"" + path +
           "\": a share's directory ends in its name.");
  }
}

std::vector<ShareRecord> ReadShares() {
  return *LoadShares();
}

void AddShare(const ShareRecord& share) {
  ValidateShare(share);
  RequireDirectory(share.path);
  const auto lock = LockShares();
  std::vector<ShareRecord> shares = ReadShares();
  bool known = false;
  for (ShareRecord& other : shares) {
    if (other.name == share.name && other.path == share.path) {
      const std::string moved_from = other.moved_from;
      other = share;
      other.moved_from = moved_from;
      known = true;
    } else {
      RequireNoConflict(share, other);
    }
  }
  if (!known) shares.push_back(share);
  MakeStateDirectories();
  Save(shares);
}

bool RemoveShare(const std::string& name) {
  const auto lock = LockShares();
  std::vector<ShareRecord> shares = ReadShares();
  const auto end = std::remove_if(shares.begin(), shares.end(),
                                  [&](const ShareRecord& share) { return share.name == name; });
  if (end == shares.end()) return false;
  shares.erase(end, shares.end());
  Save(shares);
  return true;
}

void ReplaceSharePath(const std::string& name, const std::string& new_path,
                      const std::function<void()>& prepare) {
  const auto lock = LockShares();
  std::vector<ShareRecord> shares = ReadShares();
  ShareRecord* const known = Find(shares, name);
  if (known == nullptr) Refuse("There is no share called \"" + name + "\".");
  const ShareRecord moved = MovedTo(*known, new_path);
  for (const ShareRecord& other : shares) {
    if (&other != known) RequireNoConflict(moved, other);
  }
  MakeStateDirectories();
  prepare();
  *known = moved;
  Save(shares);
}

void EndShareMove(const std::string& name) {
  const auto lock = LockShares();
  std::vector<ShareRecord> shares = ReadShares();
  ShareRecord* share = Find(shares, name);
  if (share == nullptr || share->moved_from.empty()) return;
  share->moved_from.clear();
  Save(shares);
}

}  // namespace quarry::platform
