#include "daemons/tarncontentextractd/worker_protocol.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <cstring>
#include <limits>
#include <random>
#include <thread>

#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

std::vector<Field> Sample() {
  return {{"TARNMDTitle", std::string("caf\xC3\xA9")},
          {"TARNMDTextContent", std::string()},
          {"TARNMDRecordingYear", std::int64_t{-5}},
          {"TARNMDDurationSecond", 2.5}};
}

bool Decodes(const std::vector<Field>& fields) {
  std::vector<Field> out{{"TARNMDStale", std::string()}};
  const bool good = DecodeFields(EncodeFields(fields), &out);
  EXPECT_EQ(out.size(), good ? fields.size() : 0);
  return good;
}

TEST(Fields, AreReadAsTheyWereWritten) {
  std::vector<Field> out;
  ASSERT_TRUE(DecodeFields(EncodeFields(Sample()), &out));
  EXPECT_EQ(ToMap(out), ToMap(Sample()));
  EXPECT_TRUE(DecodeFields("", &out));
  EXPECT_TRUE(out.empty());
}

TEST(Fields, CutAnywhereAreRefusedOrFewer) {
  const std::string whole = EncodeFields(Sample());
  for (std::size_t size = 0; size < whole.size(); ++size) {
    std::vector<Field> out;
    if (DecodeFields(whole.substr(0, size), &out)) {
      EXPECT_LT(out.size(), Sample().size());
    } else {
      EXPECT_TRUE(out.empty());
    }
  }
}

TEST(Fields, WithNamesOfNoFieldAreRefused) {
  for (const char* name : {"", "title", "tarnmdTitle", "TARNMDTi tle", "TARNMD1", "XTARNMDTitle",
                           "TARNMDTitle_", "QuarryAttributeStamp"}) {
    EXPECT_FALSE(Decodes({{name, std::string("x")}})) << name;
  }
  EXPECT_TRUE(Decodes({{"TARNMD" + std::string(58, 'x'), std::string("x")}}));
  EXPECT_FALSE(Decodes({{"TARNMD" + std::string(59, 'x'), std::string("x")}}));
}

TEST(Fields, WithTextThatIsNoneAreRefused) {
  for (const char* text : {"\xFF", "\xC3", "\xED\xA0\x80", "\xC0\x80"}) {
    EXPECT_FALSE(Decodes({{"TARNMDTitle", std::string(text)}}));
  }
  EXPECT_FALSE(Decodes({{"TARNMDTitle", std::string("\0", 1)}}));
}

TEST(Fields, WithNumbersThatAreNoneAreRefused) {
  EXPECT_FALSE(Decodes({{"TARNMDDurationSecond", std::numeric_limits<double>::quiet_NaN()}}));
  EXPECT_FALSE(Decodes({{"TARNMDDurationSecond", std::numeric_limits<double>::infinity()}}));
  EXPECT_TRUE(Decodes({{"TARNMDISOSpeed", std::numeric_limits<std::int64_t>::min()}}));
}

TEST(Fields, AreBoundedInNumberAndSize) {
  // The text comes on top of the other fields.
  EXPECT_TRUE(Decodes(std::vector<Field>(kMaxFields + 1, {"TARNMDTitle", std::int64_t{1}})));
  EXPECT_FALSE(Decodes(std::vector<Field>(kMaxFields + 2, {"TARNMDTitle", std::int64_t{1}})));
  EXPECT_TRUE(Decodes({{"TARNMDTextContent", std::string(kMaxTextBytes, 'x')}}));
  EXPECT_FALSE(Decodes({{"TARNMDTextContent", std::string(kMaxTextBytes + 1, 'x')}}));
}

TEST(Fields, OfUnknownKindAreRefused) {
  std::string bytes = EncodeFields({{"TARNMDTitle", std::int64_t{1}}});
  const std::size_t kind = sizeof(std::uint32_t) + std::strlen("TARNMDTitle");
  for (int value = 3; value < 256; ++value) {
    bytes[kind] = static_cast<char>(value);
    std::vector<Field> out;
    EXPECT_FALSE(DecodeFields(bytes, &out)) << value;
  }
}

TEST(Fields, ChangedAtRandomNeverBreakTheReader) {
  std::mt19937 random(7);
  const std::string whole = EncodeFields(Sample());
  for (int round = 0; round < 20000; ++round) {
    std::string bytes = whole;
    for (auto changes = 1 + random() % 4; changes > 0; --changes) {
      bytes[random() % bytes.size()] = static_cast<char>(random());
    }
    std::vector<Field> out;
    if (!DecodeFields(bytes, &out)) continue;
    for (const auto& [name, value] : ToMap(out)) {
      EXPECT_EQ(name.substr(0, 6), "TARNMD");
      EXPECT_TRUE(IsValidUtf8(value));
    }
  }
}

TEST(Answer, IsReadByItsNumberOnly) {
  const std::string message = MakeAnswer(3, Sample());
  const std::string_view answer = std::string_view(message).substr(sizeof(std::uint32_t));
  EXPECT_EQ(message, MakeMessage(answer));
  std::vector<Field> out;
  ASSERT_TRUE(ReadAnswer(answer, 3, &out));
  EXPECT_EQ(ToMap(out), ToMap(Sample()));
  EXPECT_FALSE(ReadAnswer(answer, 4, &out));
  EXPECT_TRUE(out.empty());
  for (const char* bad : {"", "123", "3\0\0\0x"}) EXPECT_FALSE(ReadAnswer(bad, 3, &out));
  EXPECT_TRUE(ReadAnswer(std::string_view("\3\0\0\0", 4), 3, &out));
}

class Channel : public ::testing::Test {
 protected:
  Channel() {
    int ends[2] = {-1, -1};
    EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    daemon_.Reset(ends[0]);
    worker_.Reset(ends[1]);
  }
  void Write(const std::string& bytes) {
    ASSERT_EQ(write(daemon_.get(), bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
  }
  bool Send(const std::string& extension, std::uint32_t number = 7) {
    return SendRequest(daemon_.get(), number, extension, null_.get());
  }
  bool Receive() { return ReceiveRequest(worker_.get(), true, &request_) == Received::kRequest; }

  UniqueFd daemon_;
  UniqueFd worker_;
  UniqueFd null_ = OpenToRead("/dev/null");
  Request request_;
};

TEST_F(Channel, ARequestBringsTheFileItself) {
  ASSERT_TRUE(Send("txt"));
  ASSERT_TRUE(Receive());
  EXPECT_EQ(request_.extension, "txt");
  EXPECT_EQ(request_.number, 7u);
  struct stat sent {};
  struct stat received {};
  ASSERT_EQ(fstat(null_.get(), &sent), 0);
  ASSERT_EQ(fstat(request_.file.get(), &received), 0);
  EXPECT_EQ(sent.st_rdev, received.st_rdev);
  EXPECT_EQ(fcntl(request_.file.get(), F_GETFD) & FD_CLOEXEC, FD_CLOEXEC);
}

TEST_F(Channel, ExtensionsAreOfAnyBytesAndCutAtTheirBound) {
  for (const std::string& extension :
       {std::string(), std::string("\xFF\0\n", 3), std::string(kMaxExtensionBytes, 'x')}) {
    ASSERT_TRUE(Send(extension));
    ASSERT_TRUE(Receive());
    EXPECT_EQ(request_.extension, extension);
  }
  ASSERT_TRUE(Send(std::string(1000, 'x')));
  ASSERT_TRUE(Receive());
  EXPECT_EQ(request_.extension, std::string(kMaxExtensionBytes, 'x'));
}

TEST_F(Channel, ARequestWithoutAFileIsNone) {
  Write(MakeMessage("1234txt"));
  EXPECT_FALSE(Receive());
}

TEST_F(Channel, ARequestWithoutANumberIsNone) {
  Write(MakeMessage("123"));
  EXPECT_FALSE(Receive());
}

TEST_F(Channel, AWorkerThatNeedNotWaitIsToldThatThereIsNothingYet) {
  EXPECT_EQ(ReceiveRequest(worker_.get(), false, &request_), Received::kNothing);
  ASSERT_TRUE(Send("txt"));
  EXPECT_EQ(ReceiveRequest(worker_.get(), false, &request_), Received::kRequest);
  EXPECT_TRUE(request_.file.valid());
  EXPECT_EQ(ReceiveRequest(worker_.get(), false, &request_), Received::kNothing);
  EXPECT_FALSE(request_.file.valid()) << "a file is held no longer than for its answer";
  daemon_.Reset();
  EXPECT_EQ(ReceiveRequest(worker_.get(), false, &request_), Received::kEnd);
}

TEST_F(Channel, RequestsThatWaitAreTakenOneByOne) {
  for (std::uint32_t number = 0; number < 20; ++number) {
    ASSERT_TRUE(Send(std::string(number, 'x'), number));
  }
  for (std::uint32_t number = 0; number < 20; ++number) {
    ASSERT_TRUE(Receive());
    EXPECT_EQ(request_.number, number);
    EXPECT_EQ(request_.extension, std::string(number, 'x'));
  }
}

TEST_F(Channel, ARequestThatIsTooLongIsNone) {
  Write(MakeMessage(std::string(kMaxExtensionBytes + 5, 'x')));
  EXPECT_FALSE(Receive());
}

TEST_F(Channel, ARequestThatEndsEarlyIsNone) {
  Write(MakeMessage("txt").substr(0, 6));
  daemon_.Reset();
  EXPECT_FALSE(Receive());
  EXPECT_FALSE(Receive());
}

TEST_F(Channel, AWorkerThatTakesNothingDoesNotHoldTheDaemonUp) {
  int sent = 0;
  while (sent < 1000000 && Send("txt")) ++sent;
  EXPECT_GT(sent, 0);
  EXPECT_LT(sent, 1000000);
}

TEST_F(Channel, AWorkerThatIsGoneIsNoticed) {
  worker_.Reset();
  EXPECT_FALSE(Send("txt"));
}

TEST_F(Channel, ALongAnswerArrivesWhole) {
  const std::string text(std::size_t{4} << 20, 'x');
  std::thread sender([&] { EXPECT_TRUE(SendMessage(worker_.get(), MakeMessage(text))); });
  std::string received(text.size() + sizeof(std::uint32_t), '\0');
  EXPECT_EQ(recv(daemon_.get(), received.data(), received.size(), MSG_WAITALL),
            static_cast<ssize_t>(received.size()));
  sender.join();
  EXPECT_TRUE(received == MakeMessage(text));
}

}  // namespace
}  // namespace quarry::extract
