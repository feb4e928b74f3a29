#include "daemons/tarncontentextractd/service.h"

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>
#include <variant>
#include <vector>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/json_text.h"
#include "daemons/common/reply.h"
#include "daemons/tarncontentextractd/path_open.h"
#include "daemons/tarncontentextractd/stamp.h"

namespace quarry::extract {
namespace {

// Room is made at once for as many documents of such a size as are asked for.
constexpr std::size_t kUsualBytes = std::size_t{8} << 10;

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

void AppendValue(const FieldValue& value, std::string* out) {
  if (const auto* text = std::get_if<std::string>(&value)) {
    AppendJsonString(out, *text);
  } else if (const auto* whole = std::get_if<std::int64_t>(&value)) {
    *out += std::to_string(*whole);
  } else {
    *out += Json::valueToString(std::get<double>(value));
  }
}

void AppendMember(std::string_view name, const FieldValue& value, std::string* out) {
  *out += ',';
  AppendJsonString(out, name);
  *out += ':';
  AppendValue(value, out);
}

// Whether an earlier field has the name of the one at `at`: the first counts.
bool IsRepeated(const std::vector<Field>& fields, std::size_t at) {
  const auto end = fields.begin() + static_cast<std::ptrdiff_t>(at);
  return std::any_of(fields.begin(), end,
                     [&](const Field& field) { return field.name == fields[at].name; });
}

// Whether an object, as we write it, has a member of that name: a quotation mark and a colon follow
// each other nowhere else, as marks within strings have a backslash before them.
bool HasMember(const std::string& object, const std::string& name) {
  return object.find('"' + name + "\":") != std::string::npos;
}

// A file whose content may be read by now.
bool IsWanted(const Json::Value& data) {
  Json::Value options;
  bool need_meta = false;
  GetJsonValue(options, data, "options", false);
  GetJsonValue(need_meta, options, "need_meta", isObject(options) && options.isMember("need_meta"));
  return need_meta;
}

}  // namespace

// A document in the making.
struct ExtractService::Draft {
  bool good = false;  // whether there will be one
  std::string path;
  Attributes attributes;
  UniqueFd file;       // where content is still to be read
  bool dealt = false;  // whether that has been dealt with, for good or ill, and need not be again
  std::vector<Field> fields;

  // The document as text, at the end of `out`.
  void AppendTo(std::string* out) const {
    const std::string text = AttributeText(path, attributes);
    out->reserve(std::max(out->capacity(), out->size() + text.size() + TextBytes(fields) * 9 / 8));
    out->append(text, 0, text.size() - 1);
    for (std::size_t i = 0; i < fields.size(); ++i) {
      // What the file system says is never overruled by what a parser says.
      if (HasMember(text, fields[i].name) || IsRepeated(fields, i)) continue;
      AppendMember(fields[i].name, fields[i].value, out);
    }
    if (dealt) AppendMember(kContentStampField, ContentStamp(attributes.status), out);
    *out += '}';
  }
};

// Sets what there is to read, or that there is nothing.
void ExtractService::OpenContent(int place, Draft* draft) {
  const struct stat& status = draft->attributes.status;
  draft->dealt = !S_ISREG(status.st_mode) || status.st_size == 0 ||
                 bad_files_.Contains(draft->path, AttributeStamp(status));
  if (draft->dealt) return;
  draft->file = OpenForReading(place);
  // Whatever else stands in the way (a lease, a full table of files, a lost server) may pass.
  if (!draft->file.valid()) draft->dealt = errno == EACCES || errno == EPERM;
}

// Throws Error 120 for a path that is none, and 914 when nothing can be said about it.
ExtractService::Draft ExtractService::Begin(const std::string& path, bool need_meta) {
  Draft draft;
  draft.path = CheckedPath(path);
  const UniqueFd place = OpenPlace(draft.path);
  if (!place.valid() || !ReadAttributes(place.get(), &draft.attributes)) {
    throw Error(kErrorParseDocument, "Cannot open " + draft.path + ": " + ErrnoText());
  }
  if (need_meta) OpenContent(place.get(), &draft);
  draft.good = true;
  return draft;
}

ExtractService::Draft ExtractService::BeginAsked(const Json::Value& data) {
  std::string path;
  GetJsonValue(path, data, "path", true);
  return Begin(path, IsWanted(data));
}

// Throws Error 502 when the daemon is stopping.
void ExtractService::TakeContent(PoolResult result, Draft* draft) {
  if (result.outcome == PoolOutcome::kStopped) {
    throw Error(kErrorSystem, "The extractor is stopping");
  }
  if (result.outcome == PoolOutcome::kBadFile) {
    bad_files_.Add(draft->path, AttributeStamp(draft->attributes.status));
  }
  draft->dealt = result.outcome != PoolOutcome::kBroken;
  draft->fields = std::move(result.fields);
}

// Returns how many of the first drafts are complete.
std::size_t ExtractService::ReadContents(std::vector<Draft>* drafts) {
  std::vector<PoolFile> files;
  for (const Draft& draft : *drafts) {
    if (!draft.file.valid()) continue;
    files.push_back({draft.file.get(), GetFileExtension(draft.path, true), draft.path});
  }
  if (files.empty()) return drafts->size();
  std::vector<PoolResult> results = pool_.Parse(files);
  std::size_t taken = 0;
  for (std::size_t i = 0; i < drafts->size(); ++i) {
    if (!drafts->at(i).file.valid()) continue;
    if (taken == results.size()) return i;
    TakeContent(std::move(results[taken++]), &drafts->at(i));
  }
  return drafts->size();
}

std::string ExtractService::ParseOne(Draft draft) {
  std::vector<Draft> drafts;
  drafts.push_back(std::move(draft));
  ReadContents(&drafts);
  std::string text;
  drafts[0].AppendTo(&text);
  return text;
}

Json::Value ExtractService::ParseFile(const std::string& path, bool need_meta) {
  Json::Value document;
  fromString(document, ParseOne(Begin(path, need_meta)));
  return document;
}

// As many files as are worth giving away at once, from `begin` on. Returns behind the last of them.
Json::ArrayIndex ExtractService::ParseSome(const Json::Value& files, Json::ArrayIndex begin,
                                           std::string* out) {
  std::vector<Draft> drafts;
  std::int64_t bytes = 0;
  for (Json::ArrayIndex i = begin;
       i < files.size() && drafts.size() < kFilesTogether && bytes < kBytesTogether; ++i) {
    try {
      drafts.push_back(BeginAsked(files[i]));
      if (drafts.back().file.valid()) bytes += drafts.back().attributes.status.st_size;
    } catch (const Error&) {
      drafts.emplace_back();
    }
  }
  const std::size_t complete = ReadContents(&drafts);
  for (std::size_t i = 0; i < complete; ++i) {
    if (i > 0) *out += ',';
    if (drafts[i].good) {
      drafts[i].AppendTo(out);
    } else {
      *out += "null";
    }
  }
  return begin + static_cast<Json::ArrayIndex>(complete);
}

std::string ExtractService::ParseMany(const Json::Value& data) {
  Json::Value files;
  GetJsonValue(files, data, "files", true);
  if (!files.isArray()) throw Error(kErrorBadParameter, "Not an array: files");
  const auto end = std::chrono::steady_clock::now() + kManyTime;
  std::string answer;
  answer.reserve(std::min(files.size() * kUsualBytes, kManyBytes));
  answer = "{\"data\":[";
  for (Json::ArrayIndex at = 0; at < files.size();) {
    if (at > 0) answer += ',';
    at = ParseSome(files, at, &answer);
    if (answer.size() >= kManyBytes || std::chrono::steady_clock::now() >= end) break;
  }
  return std::move(answer += "],\"success\":true}");
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
  return "{\"data\":" + ParseOne(BeginAsked(data)) + ",\"success\":true}";
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
