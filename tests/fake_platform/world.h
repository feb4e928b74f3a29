// What the parts of the stand-in platform share with each other.

#ifndef QUARRY_TESTS_FAKE_PLATFORM_WORLD_H_
#define QUARRY_TESTS_FAKE_PLATFORM_WORLD_H_

#include <deque>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "tests/fake_platform/fake_platform.h"

namespace quarry::fake {

struct FailureRules {
  std::map<int, Failure> by_ordinal;
  std::optional<Failure> every;
};

struct World {
  std::mutex mutex;

  std::vector<std::string> calls;
  std::function<void(const std::string&)> call_hook;
  std::map<std::string, int> counts;
  std::map<std::string, FailureRules> failures;
  int outstanding = 0;
  int error_code = 0;
  std::string error_file;
  int error_line = 0;

  std::vector<Share> shares;
  std::vector<User> users;

  std::map<std::string, int> fs_types;
  std::set<int> remote_types;
  std::set<int> image_types;
  std::set<std::string> mount_points;
  std::set<std::string> snapshots;
  std::set<std::string> share_recycles;
  std::map<int, std::set<std::string>> home_recycles;  // by kind of account
  std::set<std::string> hidden_names;
  std::map<std::string, int> acl_bits;
  bool quota_enough = true;
  int quota_error = 0;
  bool spotlight = false;
  std::map<std::string, std::string> queue_paths;
  std::map<std::string, std::string> index_paths;

  std::function<int(const std::vector<std::string>&)> exec;
  std::function<Json::Value(const std::string&, const Json::Value&)> parse_file;
  std::map<std::pair<std::string, std::string>, Json::Value> monitor_queues;

  std::vector<std::string> requests;
  std::deque<std::string> replies;
  std::function<std::optional<std::string>(const Json::Value&)> engine;
  // Requests that wait for their answer to be taken, by connection.
  std::map<const void*, std::deque<std::string>> unanswered;
};

World& TheWorld();
using WorldLock = std::lock_guard<std::mutex>;

// Counts and, unless `text` is empty, records one call, runs the hook, and says whether the call is
// to fail. Errno and the platform's last error are set then.
std::optional<Failure> EnterCall(const std::string& function, const std::string& text);

inline std::string Text(const char* value) {
  return value == nullptr ? "(null)" : value;
}
inline std::string Text(const std::string& value) {
  return value;
}
inline std::string Text(bool value) {
  return value ? "true" : "false";
}
template <typename T>
std::string Text(const T& value) {
  return std::to_string(value);
}

// Enters a call that is recorded as "function(argument, ...)".
template <typename... Arguments>
std::optional<Failure> Called(const std::string& function, const Arguments&... arguments) {
  std::string text = function + "(";
  std::string separator;
  ((text += separator + Text(arguments), separator = ", "), ...);
  return EnterCall(function, text + ")");
}

std::string CompactText(const Json::Value& value);

// Whether `path` is `directory` or lies below it.
bool IsWithin(const std::string& path, const std::string& directory);
bool IsWithinAny(const std::string& path, const std::set<std::string>& directories);

// Copies `text` into a buffer; false when it does not fit.
bool CopyOut(const std::string& text, char* buffer, size_t size);

}  // namespace quarry::fake

#endif  // QUARRY_TESTS_FAKE_PLATFORM_WORLD_H_
