#include "common/sdk/share.h"

#include <array>
#include <cerrno>
#include <cstdio>
#include <memory>

#include "common/lock_file.h"
#include "common/log.h"
#include "platform/include/error.h"
#include "platform/include/filesystem.h"
#include "platform/include/index_path.h"
#include "platform/include/list.h"
#include "platform/include/share.h"

namespace quarry::sdk {
namespace {

// What must fit on a volume before more is indexed.
constexpr unsigned long long kNeededBytes = 100ULL << 20;

using Getter = int (*)(const TARNSHARE*, int*);

// Asks for one property under the lock. False when the platform cannot tell.
bool Ask(Getter getter, const TARNSHARE* share, int& value) {
  LockMutex lock(SDKMutex());
  return getter(share, &value) >= 0;
}

// Has the platform compose a text from `subject` under the lock. False when it cannot.
template <size_t kSize>
bool Compose(int (*compose)(const char*, char*, size_t), const char* subject, std::string& text) {
  std::array<char, kSize> buffer{};
  LockMutex lock(SDKMutex());
  if (compose(subject, buffer.data(), buffer.size()) < 0) return false;
  text = buffer.data();
  return true;
}

// A list of strings, released under the lock that its user holds. Leaves errno to whom it tells why
// the list could not be filled.
class NameList {
 public:
  NameList() : list_(HLIBCSzListAlloc(BUFSIZ)) {}
  ~NameList() {
    const int saved_errno = errno;
    if (list_ != nullptr) HLIBCSzListFree(list_);
    errno = saved_errno;
  }
  NameList(const NameList&) = delete;
  NameList& operator=(const NameList&) = delete;

  bool IsAllocated() const { return list_ != nullptr; }
  bool Fill() { return HLIBShareEnum(&list_, &HLIBCSzListPush) >= 0; }
  std::vector<std::string> Names() const {
    std::vector<std::string> names;
    const int count = HLIBCSzListCount(list_);
    for (int i = 0; i < count; ++i) names.emplace_back(HLIBCSzListGet(list_, i));
    return names;
  }

 private:
  HLIBCSZLIST* list_;
};

}  // namespace

Mutex& SDKMutex() {
  // Never destroyed: static objects of a host program may use it while the program ends.
  static Mutex* const mutex = new Mutex;
  return *mutex;
}

SDKShare::SDKShare(const std::string& share_name) : name_(share_name) {
  bool found = false;
  // The platform would look up the name before a NUL byte.
  if (share_name.find('\0') == std::string::npos) {
    LockMutex lock(SDKMutex());
    found = TARNShareGet(share_name.c_str(), &share_info_) >= 0 && share_info_ != nullptr;
  }
  if (!found) {
    Fail(QUARRY_SITE("share"), "0 > TARNShareGet(share_name.c_str(), &share_info_) || !share_info_",
         kErrorShareNotFound);
  }
}

SDKShare::~SDKShare() {
  LockMutex lock(SDKMutex());
  TARNShareFree(share_info_);
}

std::string SDKShare::GetPath() const {
  return share_info_->szPath;
}

bool SDKShare::IsHideUnReadable() const {
  int hidden = 0;
  return Ask(&HLIBShareHideUnreadableGet, share_info_, hidden) && hidden == 1;
}

bool SDKShare::IsSpaceEnough() const {
  LockMutex lock(SDKMutex());
  if (TARNQuotaIsEnough(share_info_->szPath, 0, kNeededBytes) != 0) return true;
  const int error = HLIBCErrGet();
  return error != kHLIBErrNoSpace && error != kHLIBErrQuota;
}

int SDKShare::GetFTPPrivilege() const {
  return share_info_->ftpPrivilege;
}

int SDKShare::GetPrivilege(const std::string& user) const {
  if (user.find('\0') != std::string::npos) return TARN_PRIV_NONE;
  LockMutex lock(SDKMutex());
  return TARNShareUserPrivGet(share_info_, user.c_str());
}

bool SDKShare::CanBeIndexed() const {
  int is_encrypted = 0;
  if (!Ask(&HLIBShareIsEncryptedGet, share_info_, is_encrypted)) {
    Fail(QUARRY_SITE_AT("share", 73), "0 > HLIBShareIsEncryptedGet(share_info_, &is_encrypted)",
         kErrorSystem, "HLIBShareis_encryptedGet failed, share=" + name_);
  }
  int is_readonly = 0;
  if (!Ask(&HLIBShareIsReadOnlyGet, share_info_, is_readonly)) {
    Fail(QUARRY_SITE_AT("share", 75), "0 > HLIBShareIsReadOnlyGet(share_info_, &is_readonly)",
         kErrorSystem, "HLIBShareis_readonlyGet failed, share=" + name_);
  }
  return is_encrypted == 0 && is_readonly == 0;
}

bool SDKShare::IsEncryption() const {
  int is_encryption = 0;
  if (!Ask(&HLIBShareIsEncryptionGet, share_info_, is_encryption)) {
    Fail(QUARRY_SITE("share"), "0 > HLIBShareIsEncryptionGet(share_info_, &is_encryption)",
         kErrorSystem, "HLIBShareIsEncryptionGet failed, share=" + name_);
  }
  return is_encryption != 0;
}

bool SDKShare::IsEnableRecycleBin() const {
  int is_enabled = 0;
  if (!Ask(&HLIBShareRecycleStatusGet, share_info_, is_enabled)) {
    Fail(QUARRY_SITE("share"), "0 > HLIBShareRecycleStatusGet(share_info_, &is_enabled)",
         kErrorSystem, "HLIBShareRecycleStatusGet failed, share=" + name_);
  }
  return is_enabled != 0;
}

std::string SDKShare::GetQueuePath() const {
  std::string path;
  if (!Compose<4096>(&FILEIDXQueuePathCompose, share_info_->szPath, path)) {
    Fail(QUARRY_SITE("share"), "0 > FILEIDXQueuePathCompose(share_info_->szPath, buf, 4096)",
         kErrorSystem, "FILEIDXQueuePathCompose failed, share=" + name_);
  }
  return path;
}

std::string SDKShare::GetDBPath() const {
  std::string path;
  if (!Compose<4096>(&FILEIDXDBPathCompose, share_info_->szPath, path)) {
    Fail(QUARRY_SITE("share"), "0 > FILEIDXDBPathCompose(share_info_->szPath, buf, 4096)",
         kErrorSystem, "FILEIDXDBPathCompose failed, share=" + name_);
  }
  return path;
}

std::string SDKShare::GetDBName() const {
  std::string name;
  if (!Compose<1024>(&FILEIDXGetIndexID, share_info_->szName, name)) {
    Fail(QUARRY_SITE("share"), "0 > FILEIDXGetIndexID(share_info_->szName, buf, 1024)",
         kErrorSystem, "FILEIDXGetIndexID failed, share=" + name_);
  }
  return name;
}

std::vector<std::string> SDKShare::Enum() {
  bool is_allocated = false;
  {
    LockMutex lock(SDKMutex());
    NameList list;
    is_allocated = list.IsAllocated();
    if (is_allocated && list.Fill()) return list.Names();
  }
  if (!is_allocated) {
    Fail(QUARRY_SITE("share"), "nullptr == (share_list = HLIBCSzListAlloc(BUFSIZ))",
         kErrorShareEnum);
  }
  Fail(QUARRY_SITE("share"), "0 > HLIBShareEnum(&share_list, &enum_func)", kErrorShareEnum,
       "HLIBShareEnum failed");
}

}  // namespace quarry::sdk
