#include "daemons/tarnelasticd/request.h"

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

const Json::Value& Property(const Json::Value& object, const char* key) {
  if (!object.isObject() || !object.isMember(key)) {
    FailMalformed(std::string("Missing property: ") + key);
  }
  return object[key];
}

}  // namespace

void FailMalformed(const std::string& why) {
  throw Error(kMalformedRequest, why);
}

const Json::Value& ObjectProperty(const Json::Value& object, const char* key) {
  const Json::Value& value = Property(object, key);
  if (!value.isObject()) FailMalformed(std::string("Not an object: ") + key);
  return value;
}

std::string StringProperty(const Json::Value& object, const char* key) {
  const Json::Value& value = Property(object, key);
  if (!value.isString()) FailMalformed(std::string("Not a string: ") + key);
  return value.asString();
}

std::string NameProperty(const Json::Value& object, const char* key) {
  std::string value = StringProperty(object, key);
  if (value.empty()) FailMalformed(std::string("Empty: ") + key);
  if (value.find('\0') != std::string::npos) FailMalformed(std::string("NUL byte in: ") + key);
  return value;
}

std::set<std::string> NamesProperty(const Json::Value& object, const char* key) {
  const Json::Value& values = Property(object, key);
  if (!values.isArray()) FailMalformed(std::string("Not an array: ") + key);
  std::set<std::string> names;
  for (const Json::Value& value : values) {
    if (!value.isString()) FailMalformed(std::string("Not a string: ") + key);
    names.insert(value.asString());
  }
  return names;
}

std::optional<std::int64_t> OptionalNumber(const Json::Value& object, const char* key,
                                           std::int64_t least, std::int64_t most) {
  if (!object.isObject() || !object.isMember(key)) return std::nullopt;
  const Json::Value& value = object[key];
  if (!value.isInt64()) FailMalformed(std::string("Not an integer: ") + key);
  const std::int64_t number = value.asInt64();
  if (number < least || number > most) {
    FailMalformed(std::string(key) + " must be from " + std::to_string(least) + " to " +
                  std::to_string(most));
  }
  return number;
}

}  // namespace quarry::engine
