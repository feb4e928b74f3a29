// Switching the effective user for the length of a scope.

#ifndef QUARRY_COMMON_SDK_CREDENTIALS_H_
#define QUARRY_COMMON_SDK_CREDENTIALS_H_

#include <sys/types.h>

#include <string>

#include "common/export.h"

namespace quarry::sdk {

// Remembers the effective user and group and restores them at the end of its life. Credentials
// belong to the whole process: every thread is affected, so hold one around short sections only.
class QUARRY_EXPORT SDKCredentials {
 public:
  // Remembers the current user. Throws Error 503 when it has no account.
  SDKCredentials();
  // Remembers the current ids and becomes `user`, see AsUser. The destructor returns to `user`'s
  // account by name, and then to the remembered ids if they still differ.
  explicit SDKCredentials(const std::string& user);
  // Never throws; a failure is logged.
  ~SDKCredentials();
  SDKCredentials(const SDKCredentials&) = delete;
  SDKCredentials& operator=(const SDKCredentials&) = delete;

  // Becomes `user`; a member of the administrators' group is served as "root". Throws Error 503.
  void AsUser(const std::string& user);

 private:
  uid_t euid_;
  gid_t egid_;
  std::string username_;
};

}  // namespace quarry::sdk

#endif  // QUARRY_COMMON_SDK_CREDENTIALS_H_
