// What a worker does, without the process around it.

#include "daemons/tarncontentextractd/worker.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <stdexcept>
#include <thread>

#include "daemons/tarncontentextractd/markup.h"
#include "daemons/tarncontentextractd/worker_protocol.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

constexpr int kSeconds = 60;

class Breaking : public Extractor {
 public:
  const char* Name() const override { return "breaking"; }
  bool Recognizes(std::string_view) const override { return false; }
  bool Claims(std::string_view extension) const override { return extension == "break"; }
  void Extract(Source&, Extraction& out) const override {
    out.Set(kTitleField, "found before");
    throw std::runtime_error("broken file");
  }
};

TEST(ParseFile, KeepsWhatWasFoundBeforeAFormatGaveUp) {
  Registry registry;
  registry.Add(std::make_unique<Breaking>());
  Source source = Source::OfBytes("x", "break");
  EXPECT_EQ(ToMap(ParseFile(registry, source)), (Fields{{"TARNMDTitle", "found before"}}));
  Source other = Source::OfBytes("x", "other");
  EXPECT_TRUE(ParseFile(registry, other).empty());
}

class WorkerTest : public ::testing::Test {
 protected:
  WorkerTest() {
    int ends[2] = {-1, -1};
    EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    daemon_.Reset(ends[0]);
    worker_.Reset(ends[1]);
  }

  std::string Receive() {
    std::uint32_t size = 0;
    EXPECT_EQ(recv(daemon_.get(), &size, sizeof(size), MSG_WAITALL), 4);
    std::string text(size, '\0');
    // (To wait for nothing would be to wait for what comes next.)
    if (size > 0) {
      EXPECT_EQ(recv(daemon_.get(), text.data(), size, MSG_WAITALL), static_cast<ssize_t>(size));
    }
    return text;
  }
  Fields Ask(const std::string& bytes, const std::string& extension) {
    test::WriteFile(dir_ / "file", bytes);
    EXPECT_TRUE(SendRequest(daemon_.get(), 5, extension, OpenToRead(dir_ / "file").get()));
    std::vector<Field> fields;
    EXPECT_TRUE(ReadAnswer(Receive(), 5, &fields));
    return ToMap(fields);
  }

  test::TempDir dir_;
  UniqueFd daemon_;
  UniqueFd worker_;
};

TEST_F(WorkerTest, AnnouncesItself) {
  EXPECT_TRUE(Announce(worker_.get(), ""));
  EXPECT_EQ(Receive(), "ready");
  EXPECT_FALSE(Announce(worker_.get(), "a gap"));
  EXPECT_EQ(Receive(), "a gap");
}

TEST_F(WorkerTest, ServesFileAfterFileUntilTheChannelCloses) {
  std::thread worker([this] { ServeFiles(StandardRegistry(), worker_.get(), kSeconds); });
  EXPECT_EQ(Ask("<!doctype html><title>t</title><p>words", "txt"),
            (Fields{{"TARNMDTitle", "t"}, {"TARNMDTextContent", "words"}}));
  EXPECT_EQ(Ask("plain", "txt"), (Fields{{"TARNMDTextContent", "plain"}}));
  EXPECT_EQ(Ask("# h\n\n*p*", "md"), (Fields{{"TARNMDTitle", "h"}, {"TARNMDTextContent", "h\np"}}));
  EXPECT_EQ(Ask("", "txt"), Fields());
  daemon_.Reset();
  worker.join();
}

TEST_F(WorkerTest, AnswersWhatWaitsInItsOrder) {
  for (std::uint32_t number = 0; number < 20; ++number) {
    test::WriteFile(dir_ / "file", "words of " + std::to_string(number));
    const UniqueFd file = OpenToRead(dir_ / "file");
    ASSERT_TRUE(SendRequest(daemon_.get(), number, "txt", file.get()));
    ASSERT_EQ(unlink((dir_ / "file").c_str()), 0);
  }
  std::thread worker([this] { ServeFiles(StandardRegistry(), worker_.get(), kSeconds); });
  for (std::uint32_t number = 0; number < 20; ++number) {
    std::vector<Field> fields;
    EXPECT_TRUE(ReadAnswer(Receive(), number, &fields));
    EXPECT_EQ(ToMap(fields)["TARNMDTextContent"], "words of " + std::to_string(number));
  }
  daemon_.Reset();
  worker.join();
}

TEST_F(WorkerTest, EndsAtARequestThatIsNone) {
  const std::string request = MakeMessage("1234txt");
  ASSERT_GT(send(daemon_.get(), request.data(), request.size(), MSG_NOSIGNAL), 0);
  ServeFiles(StandardRegistry(), worker_.get(), kSeconds);
  EXPECT_EQ(send(daemon_.get(), "", 0, MSG_NOSIGNAL), 0);
}

}  // namespace
}  // namespace quarry::extract
