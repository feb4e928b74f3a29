// Made-up events, in the bytes in which the kernel would deliver them, and what was told of them.

#ifndef QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_FANOTIFY_BYTES_H_
#define QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_FANOTIFY_BYTES_H_

#include <sys/fanotify.h>

#include <cstdint>
#include <cstring>
#include <map>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "daemons/tarnotifyd/change_source.h"
#include "daemons/tarnotifyd/directory_tree.h"
#include "fileindex/queue/event.h"

namespace quarry::notify {

template <typename T>
std::string BytesOf(const T& value) {
  return std::string(reinterpret_cast<const char*>(&value), sizeof(value));
}

// A handle as the units know it: a type and some bytes.
inline std::string HandleOf(const std::string& bytes) {
  return BytesOf(std::int32_t{1}) + bytes;
}

// One record: `bytes` is the handle without its type, `name` comes with its end.
inline std::string Record(std::uint8_t type, const std::string& bytes,
                          const std::string& name = std::string()) {
  std::string rest = std::string(8, 'f') + BytesOf(static_cast<std::uint32_t>(bytes.size())) +
                     HandleOf(bytes) + name;
  if (!name.empty()) rest += '\0';
  rest.resize((rest.size() + 3) / 4 * 4);
  fanotify_event_info_header header{};
  header.info_type = type;
  header.len = static_cast<std::uint16_t>(sizeof(header) + rest.size());
  return BytesOf(header) + rest;
}

inline std::string RawEvent(std::uint64_t mask, const std::string& records, int process = 7) {
  fanotify_event_metadata metadata{};
  metadata.event_len = static_cast<std::uint32_t>(sizeof(metadata) + records.size());
  metadata.vers = FANOTIFY_METADATA_VERSION;
  metadata.metadata_len = sizeof(metadata);
  metadata.mask = mask;
  metadata.fd = FAN_NOFD;
  metadata.pid = process;
  return BytesOf(metadata) + records;
}

// An event about `name` in the directory of the handle `directory`.
inline std::string EntryEvent(std::uint64_t mask, const std::string& directory,
                              const std::string& name, const std::string& target = "",
                              int process = 7) {
  std::string records = Record(FAN_EVENT_INFO_TYPE_DFID_NAME, directory, name);
  if (!target.empty()) records += Record(FAN_EVENT_INFO_TYPE_FID, target);
  return RawEvent(mask, records, process);
}

inline std::string RenameEvent(const std::string& from, const std::string& from_name,
                               const std::string& to, const std::string& to_name,
                               const std::string& target, std::uint64_t flags = 0) {
  return RawEvent(FAN_RENAME | flags, Record(FAN_EVENT_INFO_TYPE_OLD_DFID_NAME, from, from_name) +
                                          Record(FAN_EVENT_INFO_TYPE_NEW_DFID_NAME, to, to_name) +
                                          Record(FAN_EVENT_INFO_TYPE_FID, target));
}

// A file system that holds what a test says. Handles are given without their type.
class FakeLookup : public DirectoryLookup {
 public:
  Answer Find(std::string_view handle, DirectoryPlace* place) override {
    ++asked;
    return Answered(places, handle, place);
  }
  Answer FindFile(std::string_view handle, DirectoryPlace* place) override {
    return Answered(files, handle, place);
  }

  void Put(const std::string& handle, const std::string& parent, const std::string& name) {
    places[handle] = {parent.empty() ? "" : HandleOf(parent), name};
  }

  std::map<std::string, DirectoryPlace> places;
  std::map<std::string, DirectoryPlace> files;
  bool fails = false;
  int asked = 0;

 private:
  Answer Answered(const std::map<std::string, DirectoryPlace>& known, std::string_view handle,
                  DirectoryPlace* place) const {
    if (fails) return Answer::kFailed;
    const auto found = known.find(std::string(handle.substr(sizeof(std::int32_t))));
    if (found == known.end()) return Answer::kGone;
    *place = found->second;
    return Answer::kFound;
  }
};

// One line for each thing that was told.
class TellingSink : public ChangeSink {
 public:
  void OnChange(const Change& change) override {
    const std::map<std::uint32_t, std::string> kinds = {{fileindex::EVENT_MODIFY, "modify"},
                                                        {fileindex::EVENT_ATTR, "attr"},
                                                        {fileindex::EVENT_CREATE, "create"},
                                                        {fileindex::EVENT_DELETE, "delete"},
                                                        {fileindex::EVENT_RENAME, "rename"}};
    std::string line = kinds.at(change.kind) + (change.is_dir ? " dir " : " ");
    if (!change.path_old.empty()) line += change.path_old + " -> ";
    told.push_back(line + change.path + (change.in_progress ? " ..." : ""));
  }
  void OnDoubt(const std::string& directory) override { told.push_back("doubt " + directory); }

  // What was told since the last call.
  std::vector<std::string> Take() { return std::exchange(told, {}); }

  std::vector<std::string> told;
};

}  // namespace quarry::notify

#endif  // QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_FANOTIFY_BYTES_H_
