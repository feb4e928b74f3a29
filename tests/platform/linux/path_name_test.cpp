#include "platform/linux/path_name.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <map>
#include <random>
#include <string>

#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

TEST(PlainPathTest, IsAbsoluteAndInItsShortestForm) {
  for (const char* good :
       {"/a", "/a/b", "/...", "/a b", "/.a", "/a.", "/..a/b..", "/volume1/photo", "/\xff\x01"}) {
    EXPECT_TRUE(IsPlainAbsolutePath(good)) << good;
  }
  for (const char* bad : {"", "/", "a", "a/b", "//", "//a", "/a/", "/a//b", "/.", "/..", "/a/.",
                          "/a/..", "/./a", "/a/../b", "./a"}) {
    EXPECT_FALSE(IsPlainAbsolutePath(bad)) << bad;
  }
}

TEST(SameOrBelowTest, DoesNotTakeALongerNameForAPlaceBelow) {
  EXPECT_TRUE(IsSameOrBelow("/a", "/a"));
  EXPECT_TRUE(IsSameOrBelow("/a/b", "/a"));
  EXPECT_FALSE(IsSameOrBelow("/ab", "/a"));
  EXPECT_FALSE(IsSameOrBelow("/a", "/a/b"));
  EXPECT_FALSE(IsSameOrBelow("", "/a"));
  EXPECT_TRUE(IsSameOrBelow("/a", "/"));
  EXPECT_TRUE(IsSameOrBelow("/", "/"));
  EXPECT_FALSE(IsSameOrBelow("a", "/"));
}

TEST(NameForPathTest, IsReadable) {
  EXPECT_EQ(NameForPath("/volume1/photo"), "volume1+photo");
  EXPECT_EQ(NameForPath("/a"), "a");
  EXPECT_EQ(NameForPath("/\xc3\xa4/b"), "\xc3\xa4+b");
}

TEST(NameForPathTest, EscapesWhatWouldBeAmbiguousOrHidden) {
  EXPECT_EQ(NameForPath("/a+b"), "a%2Bb");
  EXPECT_EQ(NameForPath("/a%2Bb"), "a%252Bb");
  EXPECT_EQ(NameForPath("/.a/.b"), "%2Ea+.b");
  EXPECT_EQ(NameForPath("/a b\n~\x7f"), "a%20b%0A%7E%7F");
}

TEST(NameForPathTest, IsAlwaysOneShortComponent) {
  for (std::size_t size = 1; size <= 4000; size += 7) {
    const std::string name = NameForPath("/" + std::string(size, ' '));
    EXPECT_LE(name.size(), 240u);
    EXPECT_EQ(name.find('/'), std::string::npos);
    EXPECT_EQ(name.find('~') != std::string::npos, 3 * size > 240);
  }
}

TEST(NameForPathTest, TellsAllPathsApart) {
  std::mt19937 random(3);
  const std::string alphabet = "ab/+%~. 2BFE";
  std::map<std::string, std::string> names;
  for (int i = 0; i < 50000; ++i) {
    std::string path = "/";
    const std::size_t size = 1 + random() % (i % 100 == 0 ? 2000 : 8);
    while (path.size() <= size) path += alphabet[random() % alphabet.size()];
    if (!IsPlainAbsolutePath(path)) continue;
    const auto [it, inserted] = names.emplace(NameForPath(path), path);
    EXPECT_EQ(it->second, path);
  }
  EXPECT_GT(names.size(), 10000u);
}

TEST(ResolvedPathTest, HasNoLinksAndExists) {
  test::TempDir dir;
  test::MakeDirs(dir / "a/b");
  ASSERT_EQ(symlink("a", (dir / "link").c_str()), 0);
  EXPECT_EQ(ResolvedPath(dir / "link/b/../b/."), dir / "a/b");
  EXPECT_EQ(ResolvedPath(dir / "missing"), "");
  EXPECT_EQ(errno, ENOENT);
}

TEST(NameForPathTest, TellsLongPathsApartByTheirLastByte) {
  const std::string path = "/" + std::string(300, 'a');
  EXPECT_NE(NameForPath(path + "b"), NameForPath(path + "c"));
  EXPECT_NE(NameForPath(path), NameForPath(path + "a"));
}

}  // namespace
}  // namespace quarry::platform
