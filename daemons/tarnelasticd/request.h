// Reading the properties of a request, with errors that name them.

#ifndef QUARRY_DAEMONS_TARNELASTICD_REQUEST_H_
#define QUARRY_DAEMONS_TARNELASTICD_REQUEST_H_

#include <json/json.h>

#include <cstdint>
#include <optional>
#include <set>
#include <string>

namespace quarry::engine {

// Each throws Error kMalformedRequest when the property is missing (unless optional), of another
// type or out of range. `object` may be any value.
const Json::Value& ObjectProperty(const Json::Value& object, const char* key);
std::string StringProperty(const Json::Value& object, const char* key);
// The same for a string that names something: not empty, without NUL bytes.
std::string NameProperty(const Json::Value& object, const char* key);
// An array of strings, each once.
std::set<std::string> NamesProperty(const Json::Value& object, const char* key);
std::optional<std::int64_t> OptionalNumber(const Json::Value& object, const char* key,
                                           std::int64_t least, std::int64_t most);

// Throws the Error for a request that cannot be understood.
[[noreturn]] void FailMalformed(const std::string& why);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_REQUEST_H_
