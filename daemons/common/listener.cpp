#include "daemons/common/listener.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "common/error.h"
#include "daemons/common/socket_address.h"
#include "daemons/common/system_error.h"

namespace quarry::daemon {
namespace {

constexpr mode_t kSocketMode = 0660;

// Makes room at `path` for a socket: what a dead process left there may go, nothing else.
void RemoveStaleSocket(const std::string& path) {
  struct stat info {};
  if (lstat(path.c_str(), &info) != 0) {
    if (errno == ENOENT) return;
    ThrowSystemError("Cannot look at " + path);
  }
  if (!S_ISSOCK(info.st_mode)) {
    throw Error(kErrorSystem, path + " is in the way: it is no socket.");
  }
  const int result = ProbeSocket(path);
  if (result == 0 || result == EAGAIN) {
    throw Error(kErrorSystem, "Another process listens at " + path + " already.");
  }
  if (result != ECONNREFUSED && result != ENOENT) {
    errno = result;
    ThrowSystemError("Cannot tell whether anybody listens at " + path);
  }
  if (unlink(path.c_str()) != 0 && errno != ENOENT) ThrowSystemError("Cannot remove " + path);
}

}  // namespace

Listener::Listener(const std::string& path) : path_(path) {
  const sockaddr_un address = SocketAddress(path);
  MakeParentDirectories(path);
  RemoveStaleSocket(path);
  fd_.Reset(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  // The file gets the socket's own mode, so it is never more open than it is to be, not for a
  // moment; the second call undoes what the umask has taken away.
  if (!fd_.valid() || fchmod(fd_.get(), kSocketMode) != 0) {
    ThrowSystemError("Cannot make a socket");
  }
  if (bind(fd_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) {
    ThrowSystemError("Cannot listen at " + path);
  }
  struct stat info {};
  if (chmod(path.c_str(), kSocketMode) != 0 || lstat(path.c_str(), &info) != 0 ||
      listen(fd_.get(), SOMAXCONN) != 0) {
    const int saved = errno;
    unlink(path.c_str());
    errno = saved;
    ThrowSystemError("Cannot listen at " + path);
  }
  device_ = info.st_dev;
  inode_ = info.st_ino;
}

Listener::~Listener() {
  Unlink();
}

void Listener::Unlink() {
  struct stat info {};
  if (lstat(path_.c_str(), &info) == 0 && info.st_dev == device_ && info.st_ino == inode_) {
    unlink(path_.c_str());
  }
}

UniqueFd Listener::Accept() {
  while (true) {
    UniqueFd fd(accept4(fd_.get(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
    if (fd.valid() || (errno != EINTR && errno != ECONNABORTED)) return fd;
  }
}

}  // namespace quarry::daemon
