// Files of any size and depth, in a worker with its bounds of memory.

#include <gtest/gtest.h>
#include <unistd.h>

#include "daemons/tarncontentextractd/sandbox.h"
#include "daemons/tarncontentextractd/source.h"
#include "daemons/tarncontentextractd/worker_process.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

std::string Repeated(const std::string& piece, std::size_t bytes) {
  std::string text;
  text.reserve(bytes + piece.size());
  while (text.size() < bytes) text += piece;
  return text;
}

class LargeFile : public ::testing::Test {
 protected:
  // The text that a worker finds, which must survive it.
  std::string Parse(const std::string& extension) {
    const UniqueFd file = OpenToRead(dir_ / "file");
    std::vector<std::vector<Field>> answers;
    EXPECT_EQ(worker_.Parse({{file.get(), extension}}, std::chrono::minutes(4), &answers),
              WorkerOutcome::kDone);
    return answers.empty() ? std::string() : ToMap(answers[0])["TARNMDTextContent"];
  }
  std::string TextOfFile(const std::string& bytes, const std::string& extension) {
    test::WriteFile(dir_ / "file", bytes);
    return Parse(extension);
  }

  test::TempDir dir_;
  WorkerProcess worker_{RealWorker(), std::chrono::minutes(1), -1};
};

TEST_F(LargeFile, TextIsReadUpToItsBound) {
  const std::string text = TextOfFile(Repeated("some words ", kMaxFileBytes + 100), "txt");
  EXPECT_EQ(text.size(), kMaxTextBytes);
  EXPECT_EQ(text.substr(0, 10), "some words");
}

TEST_F(LargeFile, TextInOtherEncodingsIsReadUpToItsBound) {
  const std::string piece = Encode("sch\xC3\xB6nes Wetter in M\xC3\xBCnchen. ", "UTF-16LE");
  EXPECT_GT(TextOfFile(Repeated(piece, kMaxFileBytes + 100), "txt").size(), kMaxTextBytes - 8);
}

TEST_F(LargeFile, AHoleIsNoText) {
  test::WriteFile(dir_ / "file", "some words");
  ASSERT_EQ(truncate((dir_ / "file").c_str(), off_t{1} << 40), 0);
  EXPECT_EQ(Parse("txt"), "");
}

TEST_F(LargeFile, HtmlOfAnySizeFitsIntoMemory) {
  const std::string tags = Repeated("<p class='a'></p>", kMaxFileBytes + 100);
  EXPECT_EQ(TextOfFile("<!doctype html>" + tags, "html"), "");
}

TEST_F(LargeFile, XmlOfAnySizeFitsIntoMemory) {
  const std::string tags = Repeated("<b c='d'></b>", kMaxFileBytes + 100);
  EXPECT_EQ(TextOfFile("<?xml version='1.0'?><a>" + tags, "xml").substr(0, 3), "d\nd");
}

TEST_F(LargeFile, MarkdownOfAnySizeFitsIntoMemory) {
  EXPECT_EQ(TextOfFile(Repeated("words *a*\n\n", kMaxFileBytes + 100), "md").substr(0, 7),
            "words a");
}

TEST_F(LargeFile, MarkdownOfMoreMarksThanFitIsReadAsItStands) {
  // Workers that are built with a sanitizer have all the memory that there is.
  const std::string text = TextOfFile(Repeated("**a** ", kMaxFileBytes + 100), "md");
  EXPECT_EQ(text.substr(0, 5), kSandboxed ? "**a**" : "a a a");
}

TEST_F(LargeFile, DepthCostsNoStack) {
  const std::size_t size = std::size_t{1} << 20;
  EXPECT_EQ(TextOfFile("<!doctype html>" + Repeated("<div>", size) + "x", "html"), "x");
  EXPECT_EQ(TextOfFile("<?xml version='1.0'?>" + Repeated("<a>", size) + "x", "xml"), "x");
  EXPECT_EQ(TextOfFile(Repeated("> ", size) + "x", "md"), "x");
  EXPECT_EQ(TextOfFile(Repeated("[", size / 16) + "x", "md").back(), 'x');
  EXPECT_EQ(TextOfFile(Repeated("{[", size) + "x", "json").back(), 'x');
}

TEST_F(LargeFile, OneLineMayBeAllThereIs) {
  EXPECT_EQ(TextOfFile(std::string(kMaxFileBytes, 'x'), "txt").size(), kMaxTextBytes);
  EXPECT_EQ(TextOfFile(std::string(std::size_t{4} << 20, 'x'), "md").size(), std::size_t{4} << 20);
}

}  // namespace
}  // namespace quarry::extract
