#include "daemons/tarncontentextractd/service.h"

#include <cerrno>
#include <system_error>
#include <utility>
#include <variant>
#include <vector>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "daemons/common/reply.h"
#include "daemons/tarncontentextractd/path_open.h"
#include "daemons/tarncontentextractd/stamp.h"

namespace quarry::extract {
namespace {

std::string ErrnoText() {
  return std::generic_category().message(errno);
}

// The path as documents name it.
std::string CheckedPath(std::string path) {
  if (path.empty() || path[0] != '/') {
    throw Error(kErrorBadParameter, "Not an absolute path: " + path);
  }
  if (path.find('\0') != std::string::npos) {
    throw Error(kErrorBadParameter, "A path cannot hold a NUL byte");
  }
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

Json::Value ToJson(const FieldValue& value) {
  if (const auto* text = std::get_if<std::string>(&value)) return *text;
  if (const auto* whole = std::get_if<std::int64_t>(&value)) return Json::Int64{*whole};
  return std::get<double>(value);
}

// What the file system says is never overruled by what a parser says.
void AddFields(const std::vector<Field>& fields, Json::Value& document) {
  for (const Field& field : fields) {
    if (!document.isMember(field.name)) document[field.name] = ToJson(field.value);
  }
}

}  // namespace

// Returns whether the content has been dealt with, for good or ill; if not it is to be tried again
// another time.
bool ExtractService::AddContent(const std::string& path, int place, const Attributes& attributes,
                                Json::Value& document) {
  if (!S_ISREG(attributes.status.st_mode) || attributes.status.st_size == 0) return true;
  const std::string stamp = AttributeStamp(attributes.status);
  if (bad_files_.Contains(path, stamp)) return true;
  const UniqueFd file = OpenForReading(place);
  // Whatever else stands in the way (a lease, a full table of files, a lost server) may pass.
  if (!file.valid()) return errno == EACCES || errno == EPERM;
  std::vector<Field> fields;
  switch (pool_.Parse(file.get(), GetFileExtension(path, true), path, &fields)) {
    case PoolOutcome::kDone:
      AddFields(fields, document);
      return true;
    case PoolOutcome::kBadFile:
      bad_files_.Add(path, stamp);
      return true;
    case PoolOutcome::kBroken:
      return false;
    case PoolOutcome::kStopped:
      break;
  }
  throw Error(kErrorSystem, "The extractor is stopping");
}

Json::Value ExtractService::ParseFile(const std::string& given_path, bool need_meta) {
  const std::string path = CheckedPath(given_path);
  const UniqueFd place = OpenPlace(path);
  Attributes attributes;
  if (!place.valid() || !ReadAttributes(place.get(), &attributes)) {
    throw Error(kErrorParseDocument, "Cannot open " + path + ": " + ErrnoText());
  }
  Json::Value document = AttributeDocument(path, attributes);
  if (need_meta && AddContent(path, place.get(), attributes, document)) {
    document[kContentStampField] = ContentStamp(attributes.status);
  }
  return document;
}

Json::Value ExtractService::ParseAsked(const Json::Value& data) {
  std::string path;
  Json::Value options;
  bool need_meta = false;
  GetJsonValue(path, data, "path", true);
  GetJsonValue(options, data, "options", false);
  GetJsonValue(need_meta, options, "need_meta", isObject(options) && options.isMember("need_meta"));
  return ParseFile(path, need_meta);
}

std::string ExtractService::ParseMany(const Json::Value& data) {
  Json::Value files;
  GetJsonValue(files, data, "files", true);
  if (!files.isArray()) throw Error(kErrorBadParameter, "Not an array: files");
  const auto end = std::chrono::steady_clock::now() + kManyTime;
  std::string documents;
  for (const Json::Value& file : files) {
    if (!documents.empty()) documents += ',';
    try {
      documents += toString(ParseAsked(file));
    } catch (const Error& error) {
      if (error.code() == kErrorSystem) throw;
      documents += "null";
    }
    if (documents.size() >= kManyBytes || std::chrono::steady_clock::now() >= end) break;
  }
  return "{\"data\":[" + documents + "],\"success\":true}";
}

std::string ExtractService::Answer(const Json::Value& request) {
  std::string command;
  Json::Value data;
  GetJsonValue(command, request, "command", true);
  if (command != "parse" && command != "parse_many") {
    throw Error(kErrorBadParameter, "Unknown command: " + command);
  }
  GetJsonValue(data, request, "data", true);
  if (command == "parse_many") return ParseMany(data);
  return toString(daemon::SuccessReply(ParseAsked(data)));
}

std::string ExtractService::Handle(const std::string& request) {
  try {
    Json::Value json;
    if (!fromString(json, request)) throw Error(kErrorBadParameter, "The request is not JSON");
    return Answer(json);
  } catch (const Error& error) {
    return toString(daemon::FailureReply(error.code(), error.reason()));
  }
}

}  // namespace quarry::extract
