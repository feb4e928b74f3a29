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
  // Whoever writes to a file under one of its names is told of under this one only.
  struct stat status {};
  const bool is_alone = fstat(fd, &status) == 0 && status.st_nlink == 1;
  if (is_alone && write(fd, "text", 4) < 0) errno = 0;
  close(fd);
}

void Touch(const std::string& path, unsigned how) {
  const int fd = open(path.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC | O_NOFOLLOW);
  if (fd < 0) return;
  struct stat status {};
  if (fstat(fd, &status) == 0 && status.st_nlink == 1) {
    if (how == 0 && fchmod(fd, status.st_mode ^ 0077) != 0) errno = 0;
    if (how == 1 && futimens(fd, nullptr) != 0) errno = 0;
    if (how == 2 && ftruncate(fd, status.st_size / 2) != 0) errno = 0;
    if (how > 2 && write(fd, "more", 4) < 0) errno = 0;
  }
  close(fd);
}

// The kernel may tell of it in fewer steps.
void MoveToAndFro(const std::string& one, const std::string& other) {
  std::rename(one.c_str(), other.c_str());
  std::rename(other.c_str(), one.c_str());
  std::rename(one.c_str(), other.c_str());
  Write(other + "/late");
}

}  // namespace

// Most of this fails most of the time: what it is done to does not exist, or is in the way.
void Vandal::DoOne() {
  const std::string path = AnyPath();
  switch (Below(14)) {
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
    case 6:
      return MoveToAndFro(path, AnyPath());
    case 7:
    case 8:
      return Touch(path, Below(6));
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
