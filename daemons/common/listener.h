// A Unix-domain socket that waits for connections.

#ifndef QUARRY_DAEMONS_COMMON_LISTENER_H_
#define QUARRY_DAEMONS_COMMON_LISTENER_H_

#include <sys/types.h>

#include <string>

#include "common/unique_fd.h"

namespace quarry::daemon {

// Listens as long as the object lives, and removes the socket file at its end if it is still its
// own.
class Listener {
 public:
  // As SocketServer's constructor says.
  explicit Listener(const std::string& path);
  ~Listener();
  // Removes the socket file now. Who has connected already is still accepted.
  void Unlink();
  Listener(const Listener&) = delete;
  Listener& operator=(const Listener&) = delete;

  int fd() const { return fd_.get(); }

  // The next waiting connection, non-blocking. Without one the descriptor is invalid and errno says
  // why: EAGAIN when nobody waits.
  UniqueFd Accept();

 private:
  bool ListenAs(int dir, const std::string& name);

  std::string path_;
  UniqueFd fd_;
  dev_t device_ = 0;
  ino_t inode_ = 0;
};

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_LISTENER_H_
