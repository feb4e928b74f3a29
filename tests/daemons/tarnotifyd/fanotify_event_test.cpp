#include "daemons/tarnotifyd/fanotify_event.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <random>
#include <string>

#include "tests/daemons/tarnotifyd/support/fanotify_bytes.h"

namespace quarry::notify {
namespace {

// Parses `bytes` in a buffer of exactly their size, so that a sanitizer sees what is read beyond.
FanotifyParsing ParseAll(const std::string& bytes, int* events) {
  const std::vector<char> exact(bytes.begin(), bytes.end());
  std::string_view rest(exact.data(), exact.size());
  *events = 0;
  for (;;) {
    FanotifyEvent event;
    const FanotifyParsing parsing = TakeFanotifyEvent(&rest, &event);
    if (parsing != FanotifyParsing::kEvent) return parsing;
    ++*events;
  }
}

std::string Sample() {
  return EntryEvent(FAN_CREATE | FAN_ONDIR, "parent", "name", "target", 42) +
         RenameEvent("from", "a", "to", "b", "target") +
         RawEvent(FAN_MODIFY, Record(FAN_EVENT_INFO_TYPE_FID, "lonely"));
}

TEST(FanotifyEvent, NothingIsTheEnd) {
  std::string_view nothing;
  FanotifyEvent event;
  EXPECT_EQ(TakeFanotifyEvent(&nothing, &event), FanotifyParsing::kEnd);
}

TEST(FanotifyEvent, EntryWithItsDirectoryAndWhatItLeadsTo) {
  const std::string bytes = Sample();
  std::string_view rest(bytes);
  FanotifyEvent event;
  ASSERT_EQ(TakeFanotifyEvent(&rest, &event), FanotifyParsing::kEvent);
  EXPECT_EQ(event.mask, std::uint64_t{FAN_CREATE | FAN_ONDIR});
  EXPECT_EQ(event.process, 42);
  EXPECT_EQ(event.entry.directory, HandleOf("parent"));
  EXPECT_EQ(event.entry.name, "name");
  EXPECT_EQ(event.target, HandleOf("target"));
  EXPECT_EQ(event.new_entry.directory, "");
}

TEST(FanotifyEvent, RenameHasBothPlaces) {
  const std::string bytes = RenameEvent("from", "a", "to", "b", "target");
  std::string_view rest(bytes);
  FanotifyEvent event;
  ASSERT_EQ(TakeFanotifyEvent(&rest, &event), FanotifyParsing::kEvent);
  EXPECT_EQ(event.entry.directory, HandleOf("from"));
  EXPECT_EQ(event.entry.name, "a");
  EXPECT_EQ(event.new_entry.directory, HandleOf("to"));
  EXPECT_EQ(event.new_entry.name, "b");
  EXPECT_EQ(event.target, HandleOf("target"));
  EXPECT_TRUE(rest.empty());
}

TEST(FanotifyEvent, WhatAnEventDoesNotBringIsEmptyAgain) {
  const std::string bytes = Sample();
  std::string_view rest(bytes);
  FanotifyEvent event;
  for (int i = 0; i < 3; ++i) {
    ASSERT_EQ(TakeFanotifyEvent(&rest, &event), FanotifyParsing::kEvent);
  }
  EXPECT_EQ(event.entry.directory, "");
  EXPECT_EQ(event.entry.name, "");
  EXPECT_EQ(event.new_entry.name, "");
  EXPECT_EQ(event.target, HandleOf("lonely"));
}

TEST(FanotifyEvent, EmptyHandleIsNone) {
  const std::string bytes = RawEvent(FAN_DELETE | FAN_ONDIR, Record(FAN_EVENT_INFO_TYPE_FID, ""));
  std::string_view rest(bytes);
  FanotifyEvent event;
  ASSERT_EQ(TakeFanotifyEvent(&rest, &event), FanotifyParsing::kEvent);
  EXPECT_TRUE(event.target.empty());
}

TEST(FanotifyEvent, NameOfAnyBytes) {
  const std::string bytes = EntryEvent(FAN_DELETE, "d", "\xff\n\x01");
  std::string_view rest(bytes);
  FanotifyEvent event;
  ASSERT_EQ(TakeFanotifyEvent(&rest, &event), FanotifyParsing::kEvent);
  EXPECT_EQ(event.entry.name, "\xff\n\x01");
}

TEST(FanotifyEvent, RecordsOfLaterKernelsAreSkipped) {
  const std::string bytes =
      RawEvent(FAN_DELETE, Record(99, "x") + Record(FAN_EVENT_INFO_TYPE_DFID_NAME, "d", "n"));
  std::string_view rest(bytes);
  FanotifyEvent event;
  ASSERT_EQ(TakeFanotifyEvent(&rest, &event), FanotifyParsing::kEvent);
  EXPECT_EQ(event.entry.name, "n");
}

TEST(FanotifyEvent, LongerHeaderOfALaterKernel) {
  std::string bytes = EntryEvent(FAN_DELETE, "d", "n");
  bytes.insert(sizeof(fanotify_event_metadata), 8, '?');
  fanotify_event_metadata metadata{};
  std::memcpy(&metadata, bytes.data(), sizeof(metadata));
  metadata.event_len += 8;
  metadata.metadata_len = static_cast<std::uint16_t>(metadata.metadata_len + 8);
  bytes.replace(0, sizeof(metadata), BytesOf(metadata));
  std::string_view rest(bytes);
  FanotifyEvent event;
  ASSERT_EQ(TakeFanotifyEvent(&rest, &event), FanotifyParsing::kEvent);
  EXPECT_EQ(event.entry.name, "n");
}

TEST(FanotifyEvent, OtherVersionIsNotRead) {
  std::string bytes = Sample();
  bytes[offsetof(fanotify_event_metadata, vers)] = FANOTIFY_METADATA_VERSION + 1;
  int events = 0;
  EXPECT_EQ(ParseAll(bytes, &events), FanotifyParsing::kMalformed);
  EXPECT_EQ(events, 0);
}

TEST(FanotifyEvent, RecordsThatAreTooShortOrTooLong) {
  for (const int length : {0, 1, 3, 4, 12, 19, 60000}) {
    std::string record = Record(FAN_EVENT_INFO_TYPE_DFID_NAME, "directory", "name");
    fanotify_event_info_header header{};
    header.info_type = FAN_EVENT_INFO_TYPE_DFID_NAME;
    header.len = static_cast<std::uint16_t>(length);
    record.replace(0, sizeof(header), BytesOf(header));
    int events = 0;
    EXPECT_EQ(ParseAll(RawEvent(FAN_DELETE, record), &events), FanotifyParsing::kMalformed)
        << length;
  }
}

TEST(FanotifyEvent, HandleLongerThanItsRecord) {
  std::string record = Record(FAN_EVENT_INFO_TYPE_FID, "handle");
  record.replace(12, 4, BytesOf(std::uint32_t{0xffffffff}));
  int events = 0;
  EXPECT_EQ(ParseAll(RawEvent(FAN_DELETE, record), &events), FanotifyParsing::kMalformed);
}

TEST(FanotifyEvent, CutAtEveryByte) {
  const std::string whole = Sample();
  const std::size_t first = EntryEvent(FAN_CREATE, "parent", "name", "target").size();
  const std::size_t second = first + RenameEvent("from", "a", "to", "b", "target").size();
  for (std::size_t size = 0; size <= whole.size(); ++size) {
    int events = 0;
    const bool is_end = size == 0 || size == first || size == second || size == whole.size();
    EXPECT_EQ(ParseAll(whole.substr(0, size), &events),
              is_end ? FanotifyParsing::kEnd : FanotifyParsing::kMalformed)
        << size;
    EXPECT_EQ(events, (size >= first) + (size >= second) + (size >= whole.size())) << size;
  }
}

TEST(FanotifyEvent, GarbageIsReadWithinItsBounds) {
  std::mt19937 random(1);
  for (int round = 0; round < 20000; ++round) {
    std::string bytes = Sample();
    for (int changes = 1 + static_cast<int>(random() % 4); changes > 0; --changes) {
      bytes[random() % bytes.size()] = static_cast<char>(random());
    }
    int events = 0;
    ParseAll(bytes, &events);
    EXPECT_LE(events, 3);
  }
}

}  // namespace
}  // namespace quarry::notify
