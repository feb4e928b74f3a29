// One shared folder as the platform knows it.

#ifndef QUARRY_COMMON_SDK_SHARE_H_
#define QUARRY_COMMON_SDK_SHARE_H_

#include <string>
#include <vector>

#include "common/export.h"

struct TARNSHARE;

namespace quarry {

class Mutex;

namespace sdk {

// The one lock around the platform's share and user calls, which are not safe for threads. It is
// taken innermost and never held across a call to a daemon.
QUARRY_EXPORT Mutex& SDKMutex();

// Owns the platform's record of one share. All members ask the platform under SDKMutex(), wait for
// it, and may be called from any thread; failures are logged and thrown as Error with the lock
// released. Names and paths are UTF-8.
class QUARRY_EXPORT SDKShare {
 public:
  // Looks the share up by its exact name. Throws Error 800 when there is none.
  explicit SDKShare(const std::string& share_name);
  ~SDKShare();
  SDKShare(const SDKShare&) = delete;
  SDKShare& operator=(const SDKShare&) = delete;

  // The name given to the constructor. Valid as long as this object.
  const std::string& GetName() const { return name_; }
  // The share's full path: the directory in which it lives, "/" and its name.
  std::string GetPath() const;

  // Whether files that a user cannot read are hidden from that user; false when not known.
  bool IsHideUnReadable() const;
  // Whether 100 MiB can still be written to the share's volume; true unless it is known to be full.
  bool IsSpaceEnough() const;
  // The share's FTP privilege, and the privilege of the account named `user`: values of the
  // platform, compared with its constants only.
  int GetFTPPrivilege() const;
  int GetPrivilege(const std::string& user) const;
  // Whether the share may have an index: neither encrypted nor read-only. Throws Error 502.
  bool CanBeIndexed() const;
  // Whether the share can be encrypted at all. Throws Error 502.
  bool IsEncryption() const;
  // Whether the share's recycle bin is on. Throws Error 502.
  bool IsEnableRecycleBin() const;

  // The share's event queue file. Throws Error 502.
  std::string GetQueuePath() const;
  // The directory of the share's search index. Throws Error 502.
  std::string GetDBPath() const;
  // The name of the share's search index. Throws Error 502.
  std::string GetDBName() const;

  // The names of all shares, in the platform's order. Throws Error 121.
  static std::vector<std::string> Enum();

 private:
  TARNSHARE* share_info_ = nullptr;
  std::string name_;
};

}  // namespace sdk
}  // namespace quarry

#endif  // QUARRY_COMMON_SDK_SHARE_H_
