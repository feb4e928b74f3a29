#include "daemons/tarncontentextractd/source.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include "tests/daemons/tarncontentextractd/support/extract_support.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

class SourceTest : public ::testing::Test {
 protected:
  UniqueFd FileOf(const std::string& text) {
    test::WriteFile(dir_ / "file", text);
    return OpenToRead(dir_ / "file");
  }

  test::TempDir dir_;
};

TEST_F(SourceTest, ReadsFilesOfAnySizeUpToItsBounds) {
  for (const std::size_t size :
       {std::size_t{0}, std::size_t{1}, kHeadBytes - 1, kHeadBytes, kHeadBytes + 1,
        (std::size_t{1} << 20) + 1, kMaxFileBytes, kMaxFileBytes + 1}) {
    const std::string text(size, 'x');
    const UniqueFd file = FileOf(text);
    Source read(file.get(), "txt");
    Source held = Source::OfBytes(text, "txt");
    for (Source* source : {&read, &held}) {
      EXPECT_EQ(source->Head(), std::string_view(text).substr(0, kHeadBytes)) << size;
      EXPECT_TRUE(source->Bytes() == std::string_view(text).substr(0, kMaxFileBytes)) << size;
      EXPECT_EQ(source->Head(), std::string_view(text).substr(0, kHeadBytes)) << size;
      EXPECT_EQ(source->extension(), "txt");
    }
  }
}

TEST_F(SourceTest, LeavesTheOffsetOfTheFile) {
  const UniqueFd file = FileOf("some words");
  ASSERT_EQ(lseek(file.get(), 5, SEEK_SET), 5);
  Source source(file.get(), "");
  EXPECT_EQ(source.Bytes(), "some words");
  EXPECT_EQ(lseek(file.get(), 0, SEEK_CUR), 5);
}

TEST_F(SourceTest, AFileThatCannotBeReadSeemsToEnd) {
  EXPECT_EQ(Source(-1, "").Bytes(), "");
  const UniqueFd directory = OpenToRead(dir_.path());
  EXPECT_EQ(Source(directory.get(), "").Bytes(), "");
}

TEST_F(SourceTest, AFileThatGrowsIsReadOn) {
  const UniqueFd file = FileOf(std::string(2 * kHeadBytes, 'x'));
  Source source(file.get(), "");
  EXPECT_EQ(source.Head().size(), kHeadBytes);
  const std::string more(std::size_t{3} << 20, 'y');
  test::WriteFile(dir_ / "file", std::string(2 * kHeadBytes, 'x') + more);
  EXPECT_TRUE(source.Bytes() == std::string(2 * kHeadBytes, 'x') + more);
}

TEST_F(SourceTest, AFileThatShrinksEndsWhereItEnds) {
  const UniqueFd file = FileOf(std::string(2 * kHeadBytes, 'x'));
  Source source(file.get(), "");
  EXPECT_EQ(source.Head().size(), kHeadBytes);
  ASSERT_EQ(truncate((dir_ / "file").c_str(), kHeadBytes + 1), 0);
  EXPECT_EQ(source.Bytes().size(), kHeadBytes + 1);
}

}  // namespace
}  // namespace quarry::extract
