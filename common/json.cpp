#include "common/json.h"

#include <cerrno>
#include <memory>

#include "common/error.h"
#include "common/json_text.h"

namespace quarry {
namespace {

// Deeper documents are refused, so that neither reading, copying nor destroying one can exhaust the
// stack.
constexpr int kMaxDepth = 1000;

const Json::CharReaderBuilder& ReaderBuilder() {
  static const Json::CharReaderBuilder* const builder = [] {
    auto* made = new Json::CharReaderBuilder;
    Json::CharReaderBuilder::strictMode(&made->settings_);
    (*made)["collectComments"] = false;
    (*made)["strictRoot"] = false;
    (*made)["rejectDupKeys"] = false;
    (*made)["stackLimit"] = kMaxDepth;
    return made;
  }();
  return *builder;
}

// Whether the text holds what the library overlooks: it takes a NUL byte for the end of the text,
// and lets comments pass in some places even where they are not allowed. Outside strings a "/" can
// only begin a comment.
bool HoldsCommentOrNul(const std::string& text) {
  bool in_string = false;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\0' || (text[i] == '/' && !in_string)) return true;
    if (text[i] == '"') in_string = !in_string;
    if (text[i] == '\\' && in_string && i + 1 < text.size() && text[i + 1] != '\0') ++i;
  }
  return false;
}

bool Parse(Json::Value& out, const std::string& text) {
  try {
    if (ReadPlainJson(text, &out)) return true;
    if (HoldsCommentOrNul(text)) return false;
    const std::unique_ptr<Json::CharReader> reader(ReaderBuilder().newCharReader());
    return reader->parse(text.data(), text.data() + text.size(), &out, nullptr);
  } catch (const Json::Exception&) {
    return false;  // nested too deep, or too long
  }
}

// The member of `json`, or null when it is absent and not required.
const Json::Value* FindMember(const Json::Value& json, const std::string& key, bool required) {
  if (!isObject(json)) throw Error(kErrorBadParameter, "Not an object" + AppendData(json));
  const Json::Value* member = json.find(key.data(), key.data() + key.size());
  if (member == nullptr && required) {
    throw Error(kErrorBadParameter, "Missing property: " + key + AppendData(json));
  }
  return member;
}

// The library's own reading of `value` as T.
template <typename T>
T Raw(const Json::Value& value);
template <>
std::string Raw<std::string>(const Json::Value& value) {
  return value.asString();
}
template <>
bool Raw<bool>(const Json::Value& value) {
  return value.asBool();
}
template <>
int Raw<int>(const Json::Value& value) {
  return value.asInt();
}
template <>
unsigned int Raw<unsigned int>(const Json::Value& value) {
  return value.asUInt();
}
template <>
long long Raw<long long>(const Json::Value& value) {
  return value.asInt64();
}
template <>
double Raw<double>(const Json::Value& value) {
  return value.asDouble();
}

// The same, with the library's own exceptions turned into the one error of a wrong type. `context`
// is the document that the reason shows.
template <typename T>
T Converted(const Json::Value& value, const Json::Value& context) {
  try {
    return Raw<T>(value);
  } catch (const Json::Exception&) {
    throw Error(kErrorBadParameter, "Not a string" + AppendData(context));
  }
}

template <typename T>
void ReadMember(T& out, const Json::Value& json, const std::string& key, bool required) {
  const Json::Value* member = FindMember(json, key, required);
  if (member == nullptr) return;
  if (isJsonType<T>(*member)) {
    out = Converted<T>(*member, json);
  } else if (required) {
    throw Error(kErrorBadParameter, "Not a string" + AppendData(json));
  }
}

// One level of a merge: where it stands in `changes`, and what it merges into.
struct MergeLevel {
  Json::Value* target;
  Json::Value::const_iterator next;
  Json::Value::const_iterator end;
};

void PushLevel(std::vector<MergeLevel>& levels, Json::Value& target, const Json::Value& changes) {
  if (changes.isObject()) levels.push_back({&target, changes.begin(), changes.end()});
}

}  // namespace

bool fromString(Json::Value& out, const std::string& text) {
  const int saved_errno = errno;
  Json::Value parsed;
  const bool ok = Parse(parsed, text);
  if (!ok) parsed = Json::Value();
  out.swap(parsed);
  errno = saved_errno;
  return ok;
}

std::string toString(const Json::Value& value) {
  return WriteJson(value);
}

bool isObject(const Json::Value& value) {
  return value.isNull() || value.isObject();
}

std::string AppendData(const Json::Value& json) {
  return ", data=" + toString(json);
}

void JsonApplyChanges(Json::Value& target, const Json::Value& changes) {
  std::vector<MergeLevel> levels;
  PushLevel(levels, target, changes);
  while (!levels.empty()) {
    MergeLevel& level = levels.back();
    if (level.next == level.end) {
      levels.pop_back();
      continue;
    }
    if (!isObject(*level.target)) {
      throw Error(kErrorBadParameter, "Not an object" + AppendData(*level.target));
    }
    const std::string key = level.next.name();
    const Json::Value& value = *level.next;
    ++level.next;
    if (value.isNull()) {
      // The overloads that take the key alone stop at a NUL byte in it.
      level.target->removeMember(key.data(), key.data() + key.size(), nullptr);
    } else if (value.isObject()) {
      PushLevel(levels, (*level.target)[key], value);
    } else {
      (*level.target)[key] = value;
    }
  }
}

template <>
Json::Value Vec2JsonArr<std::string>(const std::vector<std::string>& values) {
  Json::Value array(Json::arrayValue);
  for (const std::string& value : values) array.append(value);
  return array;
}

template <>
std::vector<std::string> JsonArr2Vec<std::string>(const Json::Value& array) {
  std::vector<std::string> values;
  for (const Json::Value& value : array) {
    if (isJsonType<std::string>(value)) values.push_back(asJsonType<std::string>(value));
  }
  return values;
}

template <>
bool isJsonType<std::string>(const Json::Value& value) {
  return value.isConvertibleTo(Json::stringValue);
}

template <>
bool isJsonType<bool>(const Json::Value& value) {
  return value.isConvertibleTo(Json::booleanValue);
}

template <>
bool isJsonType<int>(const Json::Value& value) {
  return value.isConvertibleTo(Json::intValue);
}

template <>
bool isJsonType<unsigned int>(const Json::Value& value) {
  return value.isConvertibleTo(Json::uintValue);
}

template <>
bool isJsonType<long long>(const Json::Value& value) {
  return value.type() == Json::intValue || value.type() == Json::uintValue;
}

template <>
bool isJsonType<double>(const Json::Value& value) {
  return value.isConvertibleTo(Json::realValue);
}

template <>
std::string asJsonType<std::string>(const Json::Value& value) {
  return Converted<std::string>(value, value);
}

template <>
bool asJsonType<bool>(const Json::Value& value) {
  return Converted<bool>(value, value);
}

template <>
int asJsonType<int>(const Json::Value& value) {
  return Converted<int>(value, value);
}

template <>
unsigned int asJsonType<unsigned int>(const Json::Value& value) {
  return Converted<unsigned int>(value, value);
}

template <>
long long asJsonType<long long>(const Json::Value& value) {
  return Converted<long long>(value, value);
}

template <>
double asJsonType<double>(const Json::Value& value) {
  return Converted<double>(value, value);
}

template <>
void GetJsonValue<Json::Value>(Json::Value& out, const Json::Value& json, const std::string& key,
                               bool required) {
  const Json::Value* member = FindMember(json, key, required);
  if (member == nullptr) return;
  // `out` may be the document itself.
  Json::Value copy = *member;
  out.swap(copy);
}

template <>
void GetJsonValue<std::string>(std::string& out, const Json::Value& json, const std::string& key,
                               bool required) {
  ReadMember(out, json, key, required);
}

template <>
void GetJsonValue<bool>(bool& out, const Json::Value& json, const std::string& key, bool required) {
  ReadMember(out, json, key, required);
}

template <>
void GetJsonValue<int>(int& out, const Json::Value& json, const std::string& key, bool required) {
  ReadMember(out, json, key, required);
}

template <>
void GetJsonValue<unsigned int>(unsigned int& out, const Json::Value& json, const std::string& key,
                                bool required) {
  ReadMember(out, json, key, required);
}

template <>
void GetJsonValue<long long>(long long& out, const Json::Value& json, const std::string& key,
                             bool required) {
  ReadMember(out, json, key, required);
}

template <>
void GetJsonValue<double>(double& out, const Json::Value& json, const std::string& key,
                          bool required) {
  ReadMember(out, json, key, required);
}

}  // namespace quarry
