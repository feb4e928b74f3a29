// Switching the effective user for the length of a scope.

#ifndef QUARRY_COMMON_SDK_CREDENTIALS_H_
#define QUARRY_COMMON_SDK_CREDENTIALS_H_

#include <sys/types.h>

#include <string>
#include <vector>

#include "common/export.h"

namespace quarry::sdk {

// Remembers the effective user and group and restores them at the end of its life. Credentials
// belong to the whole process: every thread is affected, so hold one around short sections only,
// and end scopes in the reverse order of their beginnings. Asks the platform under SDKMutex().
// Failures are logged; those that are thrown leave the lock free.
class QUARRY_EXPORT SDKCredentials {
 public:
  // Remembers the current user. Throws Error 503 when it has no account.
  SDKCredentials();
  // Remembers the current ids and becomes `user`, see AsUser.
  explicit SDKCredentials(const std::string& user);
  // Where the ids differ from those remembered: becomes the account of the constructor, by name,
  // and then takes the remembered ids back if they still differ. Never throws; a failure is logged,
  // and without one errno stays as it was.
  ~SDKCredentials();
  SDKCredentials(const SDKCredentials&) = delete;
  SDKCredentials& operator=(const SDKCredentials&) = delete;

  // Becomes the account named `user`; a member of the administrators' group is served as "root".
  // Throws Error 503.
  void AsUser(const std::string& user);

 private:
  bool AreIdsRestored() const;
  // Takes the remembered ids and groups back as far as the system allows, and returns whether it
  // allowed all, errno as it was, or set.
  bool RestoreIds();

  uid_t euid_;
  gid_t egid_;
  std::vector<gid_t> groups_;
  std::string username_;
};

}  // namespace quarry::sdk

#endif  // QUARRY_COMMON_SDK_CREDENTIALS_H_
