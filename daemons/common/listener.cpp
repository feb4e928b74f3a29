#include "daemons/common/listener.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

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

std::string DirectoryOf(const std::string& path) {
  const std::filesystem::path parent = std::filesystem::path(path).parent_path();
  return parent.empty() ? "." : parent.string();
}

// The address is short whatever the directory's path.
bool Bind(int fd, int dir, const std::string& name) {
  const sockaddr_un address = SocketAddress("/proc/self/fd/" + std::to_string(dir) + "/" + name);
  return bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
}

}  // namespace

Listener::Listener(const std::string& path) : path_(path) {
  CheckSocketPath(path);
  MakeParentDirectories(path);
  RemoveStaleSocket(path);
  fd_.Reset(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  // The file gets the socket's own mode, so it is never more open than it is to be, not for a
  // moment; the second call undoes what the umask has taken away.
  if (!fd_.valid() || fchmod(fd_.get(), kSocketMode) != 0) {
    ThrowSystemError("Cannot make a socket");
  }
  const UniqueFd dir(open(DirectoryOf(path).c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  const std::string name = "." + std::to_string(getpid()) + "-" + std::to_string(fd_.get());
  if (!dir.valid() || !Bind(fd_.get(), dir.get(), name)) {
    ThrowSystemError("Cannot listen at " + path);
  }
  const bool listening = ListenAs(dir.get(), name);
  const int saved = errno;
  unlinkat(dir.get(), name.c_str(), 0);
  errno = saved;
  if (!listening) ThrowSystemError("Cannot listen at " + path);
}

// The path is given to the socket when somebody listens there: who finds it can connect. It is not
// taken from anybody who was faster.
bool Listener::ListenAs(int dir, const std::string& name) {
  struct stat info {};
  if (fchmodat(dir, name.c_str(), kSocketMode, 0) != 0 || listen(fd_.get(), SOMAXCONN) != 0 ||
      fstatat(dir, name.c_str(), &info, AT_SYMLINK_NOFOLLOW) != 0 ||
      linkat(dir, name.c_str(), AT_FDCWD, path_.c_str(), 0) != 0) {
    return false;
  }
  device_ = info.st_dev;
  inode_ = info.st_ino;
  return true;
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
