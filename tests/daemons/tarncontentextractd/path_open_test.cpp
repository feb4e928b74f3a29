#include "daemons/tarncontentextractd/path_open.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>
#include <filesystem>

#include "daemons/common/socket_address.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

class PathOpen : public ::testing::Test {
 protected:
  PathOpen() {
    test::WriteFile(dir_ / "inner/file", "words");
    test::MakeDirs(dir_ / "other");
  }

  void Link(const std::string& target, const std::string& name) {
    ASSERT_EQ(symlink(target.c_str(), (dir_ / name).c_str()), 0);
  }
  // Whether both are the same inode.
  static bool IsPlace(int place, const std::string& path) {
    struct stat found {};
    struct stat wanted {};
    return fstat(place, &found) == 0 && lstat(path.c_str(), &wanted) == 0 &&
           found.st_dev == wanted.st_dev && found.st_ino == wanted.st_ino;
  }
  bool Opens(const std::string& path, const std::string& wanted) {
    return IsPlace(OpenPlace(path).get(), wanted);
  }
  int ErrorOf(const std::string& path) {
    errno = 0;
    return OpenPlace(path).valid() ? 0 : errno;
  }

  test::TempDir dir_;
};

TEST_F(PathOpen, FindsFilesAndDirectories) {
  EXPECT_TRUE(Opens(dir_ / "inner/file", dir_ / "inner/file"));
  EXPECT_TRUE(Opens(dir_ / "inner", dir_ / "inner"));
  EXPECT_TRUE(Opens(dir_ / "//inner///file", dir_ / "inner/file"));
  EXPECT_TRUE(Opens("/", "/"));
}

TEST_F(PathOpen, GivesNoRightToRead) {
  const UniqueFd place = OpenPlace(dir_ / "inner/file");
  char byte = 0;
  EXPECT_EQ(read(place.get(), &byte, 1), -1);
  EXPECT_EQ(errno, EBADF);
  EXPECT_EQ(fcntl(place.get(), F_GETFD) & FD_CLOEXEC, FD_CLOEXEC);
}

TEST_F(PathOpen, TellsWhyThereIsNothing) {
  EXPECT_EQ(ErrorOf(dir_ / "none"), ENOENT);
  EXPECT_EQ(ErrorOf(dir_ / "none/file"), ENOENT);
  EXPECT_EQ(ErrorOf(dir_ / "inner/file/below"), ENOTDIR);
  EXPECT_EQ(ErrorOf(dir_ / "inner/file/below/more"), ENOTDIR);
  EXPECT_EQ(ErrorOf(dir_ / std::string(NAME_MAX + 1, 'x')), ENAMETOOLONG);
}

TEST_F(PathOpen, NeverFollowsTheLastComponent) {
  Link(dir_ / "inner/file", "link");
  Link("nowhere", "broken");
  EXPECT_TRUE(Opens(dir_ / "link", dir_ / "link"));
  EXPECT_TRUE(Opens(dir_ / "broken", dir_ / "broken"));
}

TEST_F(PathOpen, FollowsItsOwnLinksOnTheWay) {
  Link(dir_ / "inner", "absolute");
  Link("other/../inner", "relative");
  Link("absolute", "chain");
  Link("/", "root");
  for (const char* way : {"absolute", "relative", "chain"}) {
    EXPECT_TRUE(Opens(dir_ / (std::string(way) + "/file"), dir_ / "inner/file")) << way;
  }
  EXPECT_TRUE(Opens(dir_ / "root" + dir_.path() + "/inner/file", dir_ / "inner/file"));
  Link(dir_ / "inner/file", "inner/last");
  EXPECT_TRUE(Opens(dir_ / "chain/last", dir_ / "inner/last")) << "the last is not followed";
}

TEST_F(PathOpen, FollowsNoLinkOfAnotherAccount) {
  if (geteuid() != 0) return;  // only root can make one
  Link(dir_ / "inner", "foreign");
  ASSERT_EQ(lchown((dir_ / "foreign").c_str(), 12345, 12345), 0);
  EXPECT_EQ(ErrorOf(dir_ / "foreign/file"), ELOOP);
  EXPECT_TRUE(Opens(dir_ / "foreign", dir_ / "foreign"));
  Link(dir_ / "foreign", "trusted");
  EXPECT_EQ(ErrorOf(dir_ / "trusted/file"), ELOOP) << "nor behind a link of its own";
}

TEST_F(PathOpen, GivesUpInACircle) {
  Link("b", "a");
  Link("a", "b");
  Link("self/x", "self");
  EXPECT_EQ(ErrorOf(dir_ / "a/file"), ELOOP);
  EXPECT_EQ(ErrorOf(dir_ / "self/file"), ELOOP);
}

TEST_F(PathOpen, FollowsAsManyLinksAsTheSystem) {
  Link("inner", "0");
  for (int i = 1; i <= 40; ++i) Link(std::to_string(i - 1), std::to_string(i));
  EXPECT_TRUE(Opens(dir_ / "39/file", dir_ / "inner/file"));
  EXPECT_EQ(ErrorOf(dir_ / "40/file"), ELOOP);
}

TEST_F(PathOpen, NamesAreOfAnyBytes) {
  const std::string name = dir_ / "\xFF\xC3\n\x01\\ *";
  test::WriteFile(name, "x");
  EXPECT_TRUE(Opens(name, name));
}

// A path far longer than the system takes in one call.
TEST_F(PathOpen, PathsAreOfAnyLength) {
  const std::string name(200, 'd');
  std::string path = dir_.path();
  UniqueFd place(open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  for (int depth = 0; depth < 40; ++depth) {
    ASSERT_EQ(mkdirat(place.get(), name.c_str(), 0700), 0);
    place = UniqueFd(openat(place.get(), name.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    path += "/" + name;
  }
  ASSERT_GT(path.size(), std::size_t{PATH_MAX});
  struct stat found {};
  struct stat wanted {};
  ASSERT_EQ(fstat(OpenPlace(path).get(), &found), 0);
  ASSERT_EQ(fstat(place.get(), &wanted), 0);
  EXPECT_EQ(found.st_ino, wanted.st_ino);
  EXPECT_EQ(ErrorOf(path + "/none"), ENOENT);
}

TEST_F(PathOpen, NeverBlocksOnSpecialFiles) {
  ASSERT_EQ(mkfifo((dir_ / "fifo").c_str(), 0600), 0);
  EXPECT_TRUE(Opens(dir_ / "fifo", dir_ / "fifo"));
  const UniqueFd socket_fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const sockaddr_un address = daemon::SocketAddress(dir_ / "socket");
  ASSERT_EQ(bind(socket_fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  EXPECT_TRUE(Opens(dir_ / "socket", dir_ / "socket"));
  EXPECT_TRUE(Opens("/dev/null", "/dev/null"));
}

TEST_F(PathOpen, ReadsTheFileThatWasFoundWhateverHasItsNameNow) {
  const UniqueFd place = OpenPlace(dir_ / "inner/file");
  std::filesystem::remove(dir_ / "inner/file");
  test::WriteFile(dir_ / "inner/file", "others");
  const UniqueFd file = OpenForReading(place.get());
  char text[16] = {};
  EXPECT_EQ(read(file.get(), text, sizeof(text)), 5);
  EXPECT_STREQ(text, "words");
  EXPECT_EQ(write(file.get(), "x", 1), -1);
  EXPECT_EQ(fcntl(file.get(), F_GETFD) & FD_CLOEXEC, FD_CLOEXEC);
}

TEST_F(PathOpen, ReadingLeavesTheTimeOfLastAccess) {
  const std::string path = dir_ / "inner/file";
  const timespec times[2] = {{1000, 0}, {2000, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
  char byte = 0;
  ASSERT_EQ(read(OpenForReading(OpenPlace(path).get()).get(), &byte, 1), 1);
  struct stat status {};
  ASSERT_EQ(stat(path.c_str(), &status), 0);
  EXPECT_EQ(status.st_atim.tv_sec, 1000);
}

TEST_F(PathOpen, FailsToReadWithoutAPlace) {
  EXPECT_FALSE(OpenForReading(-1).valid());
  EXPECT_EQ(errno, ENOENT);
}

}  // namespace
}  // namespace quarry::extract
