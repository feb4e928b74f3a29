// Typed reading, merging, parsing and writing of JSON documents. Texts are bytes, UTF-8 by custom.
// None of these functions keeps state or logs; all may be called from any thread, on documents that
// no other thread changes. What they throw is Error 120, where it is said.

#ifndef QUARRY_COMMON_JSON_H_
#define QUARRY_COMMON_JSON_H_

#include <json/json.h>

#include <string>
#include <vector>

#include "common/export.h"

namespace quarry {

// Parses one JSON value of any kind. Returns false, and leaves `out` null, when `text` is not JSON
// or holds anything behind the value but white space; comments, trailing commas and NUL bytes are
// refused, and so is nesting too deep for the parser. Bytes that are not UTF-8 are kept.
QUARRY_EXPORT bool fromString(Json::Value& out, const std::string& text);

// The compact text of `value`, without a trailing newline. Every byte of a string is kept.
QUARRY_EXPORT std::string toString(const Json::Value& value);

// Parses the whole file as fromString does. Returns false, and leaves `out` null, when the file is
// not a regular file (after links), is larger than 64 MiB, cannot be read or is not JSON. Errno is
// set, but stays as it was when the text is the reason and on success.
QUARRY_EXPORT bool fromFile(Json::Value& out, const std::string& path);

// Replaces the file by the text of `value`, whole and durably: readers see the old or the new text,
// also after a power failure. The file keeps its permissions; a symbolic link is followed, but
// replaced where it leads to nothing; a new file gets mode 0666 less the process's umask. Blocks
// until the disk has it. Returns true with errno as it was, or false, with errno set and the old
// file untouched, on failure; only when the directory could not be synced at the end the new text
// is there already.
QUARRY_EXPORT bool toFile(const Json::Value& value, const std::string& path);

// Whether `value` has members to ask for: an object, or null, which is an object without members.
QUARRY_EXPORT bool isObject(const Json::Value& value);

// Whether `value` may be read as T: std::string, bool, int, unsigned int, long long or double.
// All but long long follow the JSON library's conversions; long long takes stored integers only.
template <typename T>
bool isJsonType(const Json::Value& value);

// `value` as T. Throws Error 120, "Not a string" + AppendData(value), when the library cannot
// convert it, as it can where isJsonType<T> holds and the number is in T's range.
template <typename T>
T asJsonType(const Json::Value& value);

// Reads json[key] into `out`, for Json::Value (any kind) and the types above. An optional key that
// is absent or of the wrong type leaves `out` untouched. Throws Error 120: "Not an object" (even
// for an optional key), "Missing property: " + key, or "Not a string" for a required value of the
// wrong type, whatever T is; each followed by AppendData(json).
template <typename T>
void GetJsonValue(T& out, const Json::Value& json, const std::string& key, bool required);

// Merges `changes`, which is no part of `target`, into `target`: null removes a key, objects are
// merged, all else replaces. Changes that are no object change nothing. Throws Error 120 when
// `target`, or a member that changes are to be merged into, is neither an object nor null; what was
// merged before stays.
QUARRY_EXPORT void JsonApplyChanges(Json::Value& target, const Json::Value& changes);

// ", data=" + the text of `json`, to end a reason with.
QUARRY_EXPORT std::string AppendData(const Json::Value& json);

// The strings as a JSON array, in order; empty when there are none.
template <typename T>
Json::Value Vec2JsonArr(const std::vector<T>& values);

// The elements of `array` that are convertible to T, in order; others are skipped.
template <typename T>
std::vector<T> JsonArr2Vec(const Json::Value& array);

#define QUARRY_JSON_TYPE(T)                                                                    \
  template <>                                                                                  \
  QUARRY_EXPORT bool isJsonType<T>(const Json::Value& value);                                  \
  template <>                                                                                  \
  QUARRY_EXPORT T asJsonType<T>(const Json::Value& value);                                     \
  template <>                                                                                  \
  QUARRY_EXPORT void GetJsonValue<T>(T & out, const Json::Value& json, const std::string& key, \
                                     bool required);
QUARRY_JSON_TYPE(std::string)
QUARRY_JSON_TYPE(bool)
QUARRY_JSON_TYPE(int)
QUARRY_JSON_TYPE(unsigned int)
QUARRY_JSON_TYPE(long long)
QUARRY_JSON_TYPE(double)
#undef QUARRY_JSON_TYPE

template <>
QUARRY_EXPORT void GetJsonValue<Json::Value>(Json::Value& out, const Json::Value& json,
                                             const std::string& key, bool required);
template <>
QUARRY_EXPORT Json::Value Vec2JsonArr<std::string>(const std::vector<std::string>& values);
template <>
QUARRY_EXPORT std::vector<std::string> JsonArr2Vec<std::string>(const Json::Value& array);

}  // namespace quarry

#endif  // QUARRY_COMMON_JSON_H_
