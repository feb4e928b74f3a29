#include "daemons/tarnotifyd/fanotify_event.h"

#include <sys/fanotify.h>

#include <cstddef>
#include <cstring>

namespace quarry::notify {
namespace {

// The kernel gives no promise about the alignment of what follows a name.
template <typename T>
bool Peek(std::string_view bytes, T* value) {
  if (bytes.size() < sizeof(T)) return false;
  std::memcpy(value, bytes.data(), sizeof(T));
  return true;
}

// Where the handle begins within a record: behind its header and the number of its file system.
constexpr std::size_t kHandleAt = sizeof(fanotify_event_info_header) + sizeof(__kernel_fsid_t);
// A handle is its length, its type and its bytes; the last two are what tells one from another.
constexpr std::size_t kLengthSize = sizeof(std::uint32_t);
constexpr std::size_t kTypeSize = sizeof(std::int32_t);

// `record` is a whole record of a kind that holds a handle.
bool ParseEntry(std::string_view record, FanotifyEntry* entry) {
  std::uint32_t length = 0;
  if (record.size() < kHandleAt || !Peek(record.substr(kHandleAt), &length)) return false;
  const std::string_view rest = record.substr(kHandleAt + kLengthSize);
  if (rest.size() < kTypeSize || rest.size() - kTypeSize < length) return false;
  // What the file system had no handle for has one of no length.
  if (length > 0) entry->directory = rest.substr(0, kTypeSize + length);
  const std::string_view name = rest.substr(kTypeSize + length);
  entry->name = name.substr(0, name.find('\0'));
  return true;
}

bool ParseRecord(std::string_view record, std::uint8_t type, FanotifyEvent* event) {
  FanotifyEntry target;
  switch (type) {
    case FAN_EVENT_INFO_TYPE_DFID:
    case FAN_EVENT_INFO_TYPE_DFID_NAME:
    case FAN_EVENT_INFO_TYPE_OLD_DFID_NAME:
      return ParseEntry(record, &event->entry);
    case FAN_EVENT_INFO_TYPE_NEW_DFID_NAME:
      return ParseEntry(record, &event->new_entry);
    case FAN_EVENT_INFO_TYPE_FID:
      if (!ParseEntry(record, &target)) return false;
      event->target = target.directory;
      return true;
    default:
      return true;  // something of a later kernel
  }
}

bool ParseRecords(std::string_view records, FanotifyEvent* event) {
  while (!records.empty()) {
    fanotify_event_info_header header;
    if (!Peek(records, &header)) return false;
    if (header.len < sizeof(header) || header.len > records.size()) return false;
    if (!ParseRecord(records.substr(0, header.len), header.info_type, event)) return false;
    records.remove_prefix(header.len);
  }
  return true;
}

}  // namespace

FanotifyParsing TakeFanotifyEvent(std::string_view* bytes, FanotifyEvent* event) {
  if (bytes->empty()) return FanotifyParsing::kEnd;
  fanotify_event_metadata metadata;
  if (!Peek(*bytes, &metadata) || metadata.vers != FANOTIFY_METADATA_VERSION ||
      metadata.metadata_len < sizeof(metadata) || metadata.event_len < metadata.metadata_len ||
      metadata.event_len > bytes->size()) {
    return FanotifyParsing::kMalformed;
  }
  *event = FanotifyEvent{};
  event->mask = metadata.mask;
  event->process = metadata.pid;
  const std::string_view whole = bytes->substr(0, metadata.event_len);
  if (!ParseRecords(whole.substr(metadata.metadata_len), event)) return FanotifyParsing::kMalformed;
  bytes->remove_prefix(metadata.event_len);
  return FanotifyParsing::kEvent;
}

}  // namespace quarry::notify
