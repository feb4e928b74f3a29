// The share and the account database, and lists of strings.

#include <algorithm>
#include <cerrno>
#include <memory>
#include <string>
#include <vector>

#include "platform/include/error.h"
#include "platform/include/list.h"
#include "platform/include/share.h"
#include "platform/include/user.h"
#include "tests/fake_platform/fake_platform.h"
#include "tests/fake_platform/system_calls.h"
#include "tests/fake_platform/world.h"

using quarry::fake::Called;
using quarry::fake::EnterCall;
using quarry::fake::Failure;
using quarry::fake::Share;
using quarry::fake::TheWorld;
using quarry::fake::User;
using quarry::fake::World;
using quarry::fake::WorldLock;

struct HLIBCSZLIST {
  std::vector<std::string> texts;
};

namespace {

// The last error after a look-up that found nothing.
constexpr int kNotFound = 0x1400;

// The records that callers hold keep their texts alive themselves.
struct ShareRecord : TARNSHARE {
  Share share;
};
struct UserRecord : TARNUSER {
  User user;
};

template <typename Item, typename Predicate>
std::unique_ptr<Item> Find(std::vector<Item> World::*items, Predicate predicate) {
  World& world = TheWorld();
  WorldLock lock(world.mutex);
  const auto found = std::find_if((world.*items).begin(), (world.*items).end(), predicate);
  if (found == (world.*items).end()) {
    world.error_code = kNotFound;
    return nullptr;
  }
  return std::make_unique<Item>(*found);
}

void AddOutstanding(int change) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().outstanding += change;
}

std::unique_ptr<Share> ShareNamed(const std::string& name) {
  return Find(&World::shares, [&name](const Share& share) { return share.name == name; });
}

int HandOut(std::unique_ptr<User> user, TARNUSER** out) {
  *out = nullptr;
  if (!user) return -1;
  auto record = std::make_unique<UserRecord>();
  record->user = *user;
  record->szName = record->user.name.c_str();
  record->uid = user->uid;
  record->gid = user->gid;
  AddOutstanding(1);
  *out = record.release();
  return 0;
}

// Answers a getter of one flag of a share.
int GetFlag(const char* function, const TARNSHARE* share, int* value, bool Share::*flag) {
  if (const auto failure = Called(function, share->szName)) return failure->result;
  *value = static_cast<const ShareRecord*>(share)->share.*flag ? 1 : 0;
  return 0;
}

}  // namespace

extern "C" {

HLIBCSZLIST* HLIBCSzListAlloc(int size) {
  if (Called("HLIBCSzListAlloc", size)) return nullptr;
  AddOutstanding(1);
  return new HLIBCSZLIST;
}

void HLIBCSzListFree(HLIBCSZLIST* list) {
  Called("HLIBCSzListFree");
  if (list == nullptr) return;
  AddOutstanding(-1);
  delete list;
}

int HLIBCSzListPush(const char* text, HLIBCSZLIST** list) {
  if (const auto failure = EnterCall("HLIBCSzListPush", "")) return failure->result;
  (*list)->texts.emplace_back(text);
  return 0;
}

int HLIBCSzListCount(const HLIBCSZLIST* list) {
  return static_cast<int>(list->texts.size());
}

const char* HLIBCSzListGet(const HLIBCSZLIST* list, int index) {
  if (index < 0 || index >= HLIBCSzListCount(list)) return nullptr;
  return list->texts[static_cast<size_t>(index)].c_str();
}

int TARNShareGet(const char* name, TARNSHARE** share) {
  *share = nullptr;
  if (const auto failure = Called("TARNShareGet", name)) return failure->result;
  const auto found = ShareNamed(name);
  if (!found) return -1;
  auto record = std::make_unique<ShareRecord>();
  record->share = *found;
  record->szName = record->share.name.c_str();
  record->szPath = record->share.path.c_str();
  record->ftpPrivilege = record->share.ftp_privilege;
  AddOutstanding(1);
  *share = record.release();
  return 0;
}

void TARNShareFree(TARNSHARE* share) {
  Called("TARNShareFree", share == nullptr ? nullptr : share->szName);
  if (share == nullptr) return;
  AddOutstanding(-1);
  delete static_cast<ShareRecord*>(share);
}

int TARNShareNamePathGet(const char* full_path, char* name, size_t name_size, char* path,
                         size_t path_size) {
  if (const auto failure = Called("TARNShareNamePathGet", full_path)) return failure->result;
  const auto found = Find(&World::shares, [full_path](const Share& share) {
    return quarry::fake::IsWithin(full_path, share.path);
  });
  if (!found) return -1;
  const bool fits = quarry::fake::CopyOut(found->name, name, name_size) &&
                    quarry::fake::CopyOut(found->path, path, path_size);
  return fits ? 0 : -1;
}

int HLIBShareEnum(HLIBCSZLIST** list, HLIBShareEnumFunc enum_func) {
  if (const auto failure = Called("HLIBShareEnum")) return failure->result;
  std::vector<Share> shares;
  {
    WorldLock lock(TheWorld().mutex);
    shares = TheWorld().shares;
  }
  for (const Share& share : shares) {
    if (enum_func(share.name.c_str(), list) < 0) return -1;
  }
  return 0;
}

int HLIBShareHideUnreadableGet(const TARNSHARE* share, int* hidden) {
  return GetFlag(__func__, share, hidden, &Share::hide_unreadable);
}

int HLIBShareIsEncryptedGet(const TARNSHARE* share, int* encrypted) {
  return GetFlag(__func__, share, encrypted, &Share::encrypted);
}

int HLIBShareIsReadOnlyGet(const TARNSHARE* share, int* read_only) {
  return GetFlag(__func__, share, read_only, &Share::read_only);
}

int HLIBShareIsEncryptionGet(const TARNSHARE* share, int* encryption) {
  return GetFlag(__func__, share, encryption, &Share::encryption);
}

int HLIBShareRecycleStatusGet(const TARNSHARE* share, int* enabled) {
  return GetFlag(__func__, share, enabled, &Share::recycle_bin);
}

int TARNShareUserPrivGet(const TARNSHARE* share, const char* user) {
  const auto failure = Called("TARNShareUserPrivGet", share->szName, user);
  if (failure) return failure->result;
  const auto& privileges = static_cast<const ShareRecord*>(share)->share.privileges;
  const auto found = privileges.find(user);
  return found == privileges.end() ? TARN_PRIV_NONE : found->second;
}

int TARNUserGet(const char* name, TARNUSER** user) {
  *user = nullptr;
  if (const auto failure = Called("TARNUserGet", name)) return failure->result;
  return HandOut(Find(&World::users, [name](const User& known) { return known.name == name; }),
                 user);
}

int TARNUserGetByUID(unsigned int uid, TARNUSER** user) {
  *user = nullptr;
  if (const auto failure = Called("TARNUserGetByUID", uid)) return failure->result;
  return HandOut(Find(&World::users, [uid](const User& known) { return known.uid == uid; }), user);
}

void TARNUserFree(TARNUSER* user) {
  Called("TARNUserFree", user == nullptr ? nullptr : user->szName);
  if (user == nullptr) return;
  AddOutstanding(-1);
  delete static_cast<UserRecord*>(user);
}

int HLIBGroupIsAdminGroupMem(const char* name, int flags) {
  if (const auto failure = Called("HLIBGroupIsAdminGroupMem", name, flags)) return failure->result;
  const auto found = Find(&World::users, [name](const User& known) { return known.name == name; });
  return found && found->administrator ? 1 : 0;
}

int HLIBCErrGet() {
  const auto failure = Called("HLIBCErrGet");
  if (failure) return failure->result;
  WorldLock lock(TheWorld().mutex);
  return TheWorld().error_code;
}

const char* HLIBCErrorGetFile() {
  Called("HLIBCErrorGetFile");
  WorldLock lock(TheWorld().mutex);
  return TheWorld().error_file.c_str();
}

int HLIBCErrorGetLine() {
  Called("HLIBCErrorGetLine");
  WorldLock lock(TheWorld().mutex);
  return TheWorld().error_line;
}

}  // extern "C"

bool ResetCredentialsByName(const std::string& name, bool keep_privilege) {
  if (Called("ResetCredentialsByName", name, keep_privilege)) return false;
  const auto user = Find(&World::users, [&name](const User& known) { return known.name == name; });
  if (user && quarry::fake::EffectiveIdsAreFaked()) {
    quarry::fake::SetEffectiveIds(user->uid, user->gid);
  }
  return true;
}
