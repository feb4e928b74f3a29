#include "tests/daemons/tarnotifyd/support/vandal.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <system_error>

namespace quarry::test {
namespace {

void Write(const std::string& path) {
  const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
  if (fd < 0) return;
  if (write(fd, "text", 4) < 0) errno = 0;
  close(fd);
}

}  // namespace

// Most of this fails most of the time: what it is done to does not exist, or is in the way.
void Vandal::DoOne() {
  const std::string path = AnyPath();
  switch (Below(10)) {
    case 0:
    case 1:
    case 2:
      return Create(path);
    case 3:
      return MakeNest(path);
    case 4:
      return Replace(path);
    case 5: {
      std::error_code error;
      std::filesystem::remove_all(path, error);
      return;
    }
    default:
      return Move(path);
  }
}

std::string Vandal::AnyName() {
  static const std::string names[] = {"a", "b", "c", "d", "\xff\xfe", "@eaDir"};
  // The ignored name is rarer.
  const unsigned which = Below(11);
  return names[which < 10 ? which / 2 : 5];
}

std::string Vandal::AnyPath() {
  std::string path = inside_;
  for (unsigned depth = 1 + Below(4); depth > 0; --depth) path += "/" + AnyName();
  return path;
}

void Vandal::Move(const std::string& path) {
  switch (Below(6)) {
    case 0:
      std::rename(path.c_str(), Outside().c_str());
      return;
    case 1:
      std::rename(Outside().c_str(), path.c_str());
      return;
    case 2:
      renameat2(AT_FDCWD, path.c_str(), AT_FDCWD, AnyPath().c_str(), RENAME_EXCHANGE);
      return;
    default:
      std::rename(path.c_str(), AnyPath().c_str());
  }
}

void Vandal::Create(const std::string& path) {
  switch (Below(6)) {
    case 0:
      if (symlink(outside_.c_str(), path.c_str()) != 0) chmod(path.c_str(), 0700);
      return;
    case 1:
      if (link(AnyPath().c_str(), path.c_str()) != 0) errno = 0;
      return;
    case 2:
      mkdir(path.c_str(), 0700);
      return;
    default:
      return Write(path);
  }
}

void Vandal::MakeNest(const std::string& path) {
  std::string at = path;
  for (int depth = 0; depth < 5; ++depth) {
    if (mkdir(at.c_str(), 0700) == 0) Write(at + "/file");
    at += "/" + AnyName();
  }
}

void Vandal::Replace(const std::string& path) {
  std::rename(path.c_str(), AnyPath().c_str());
  MakeNest(path);
}

}  // namespace quarry::test
