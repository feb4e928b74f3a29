#include "comm/elastic_control.h"

#include <exception>
#include <stdexcept>
#include <utility>

#include "comm/built_in.h"
#include "comm/comm.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/log.h"
#include "common/paths.h"
#include "common/sdk/share.h"
#include "fileindex/config/status_mgr.h"
#include "platform/include/content_extract.h"

namespace quarry::fileindex::elastic {
namespace {

// Keeps a batch below what the engine takes in one message (64 MiB), whatever the paths' lengths.
constexpr Json::ArrayIndex kBatchMax = 4000;

// The same for the fields of a suggestion batch, which is sent whole unless it is very long: a
// byte of a field may take six in JSON.
constexpr std::size_t kSuggestionBatchBytes = std::size_t{8} << 20;

constexpr char kNoArray[] = "!res.isMember(\"data\") || !res[\"data\"].isArray()";

const char kMappings[] =
#include "comm/index_mappings.inc"
    ;

const char kEventHandler[] =
    R"({"lib_path": "/var/packages/Quarry/target/handler/fileindex_event_handler.so"})";

Json::Value IndexData(const std::string& share) {
  Json::Value data(Json::objectValue);
  data["id"] = GetFileIndexID(share);
  return data;
}

Json::Value MakeRequest(const char* command, Json::Value data) {
  Json::Value request(Json::objectValue);
  request["command"] = command;
  request["data"] = std::move(data);
  return request;
}

Json::Value EmptyBatch() {
  Json::Value batch(Json::objectValue);
  batch["compound"] = Json::Value(Json::arrayValue);
  return batch;
}

void Send(const char* command, Json::Value data) {
  Json::Value response;
  SendRequest(response, MakeRequest(command, std::move(data)));
}

// What a document command carries; "data" is left out where `document` is null.
Json::Value DocumentData(const std::string& id, const std::string& path, Json::Value document) {
  Json::Value data(Json::objectValue);
  data["id"] = id;
  data["doc_id"] = path;
  if (!document.isNull()) data["data"] = std::move(document);
  return data;
}

// Matches what lies below `dir`, but neither `dir` itself nor a neighbour that begins like it.
Json::Value BelowQuery(const std::string& dir) {
  Json::Value query(Json::objectValue);
  query["qsl"]["prefix"][kFieldPath] = dir + "/";
  return query;
}

Json::Value QueryBelow(const std::string& id, const std::string& dir,
                       const std::vector<std::string>& fields) {
  Json::Value data(Json::objectValue);
  data["id"] = id;
  data["query"] = BelowQuery(dir);
  data["query"]["load_field"] = Vec2JsonArr(fields);
  Json::Value response;
  SendRequest(response, MakeRequest("document_get_by_query", std::move(data)));
  return response;
}

bool HasArray(const Json::Value& response) {
  return response.isMember("data") && response["data"].isArray();
}

std::string Field(const Json::Value& document, const char* name) {
  std::string value;
  GetJsonValue(value, document, name, true);
  return value;
}

// The extractor is foreign code: whatever it throws means that the file cannot be read.
Json::Value Extract(const std::string& path, bool need_meta) {
  Json::Value document;
  try {
    Json::Value options(Json::objectValue);
    options[kOptionNeedMeta] = need_meta;
    TARN_CONTENT_EXTRACT_ParseFile(path, options, document);
    if (!isObject(document)) throw std::runtime_error("not an object");
  } catch (...) {
    throw Error(kErrorParseDocument, "Parse failed, path=" + path);
  }
  const Json::Value name = document[kFieldFSName];
  document[kFieldSearchFileName] = name;
  return document;
}

Json::Value RenamedFields(const std::string& new_path) {
  const std::string name = Basename(new_path);
  const std::string extension = GetFileExtension(name, true);
  Json::Value fields(Json::objectValue);
  fields[kFieldPath] = new_path;
  fields[kFieldParent] = Dirname(new_path);
  fields[kFieldFSName] = name;
  fields[kFieldSearchFileName] = name;
  fields[kFieldDisplayName] = name;
  fields[kFieldKind] = extension;
  fields[kFieldExtension] = extension;
  return fields;
}

bool IsInside(const std::string& path, const std::string& dir) {
  return StringStartWith(path + "/", dir + "/");
}

// Where the parent of a document below `old_path` is now. A parent that does not lie there is no
// guide (it is stale); the document's own path is.
std::string MovedParent(const std::string& parent, const std::string& path,
                        const std::string& old_path, const std::string& new_path) {
  const std::string from = IsInside(parent, old_path) ? parent : Dirname(path);
  if (!IsInside(from, old_path)) {
    throw Error(kErrorEngineQuery, "Not below " + old_path + ": " + path);
  }
  return new_path + from.substr(old_path.size());
}

Json::Value MoveRequest(const std::string& id, const Json::Value& document,
                        const std::string& new_path, const std::string& old_path) {
  const std::string name = Field(document, kFieldFSName);
  const std::string old_parent = Field(document, kFieldParent);
  const std::string path = Field(document, kFieldPath);
  const std::string parent = MovedParent(old_parent, path, old_path, new_path);
  Json::Value fields(Json::objectValue);
  fields[kFieldParent] = parent;
  fields[kFieldPath] = parent + "/" + name;
  fields[kFieldSearchFileName] = name;
  return MakeRequest("document_set_by_id", DocumentData(id, path, fields));
}

// The batches that move `documents`: at least one, even if nothing is to be moved. All are made
// before any is sent, so that a malformed document moves none.
std::vector<Json::Value> MoveBatches(const std::string& id, const Json::Value& documents,
                                     const std::string& new_path, const std::string& old_path) {
  std::vector<Json::Value> batches{EmptyBatch()};
  for (const Json::Value& document : documents) {
    if (batches.back()["compound"].size() == kBatchMax) batches.push_back(EmptyBatch());
    batches.back()["compound"].append(MoveRequest(id, document, new_path, old_path));
  }
  return batches;
}

Json::Value SuggestionRequest(const std::string& db_name, const std::string& field) {
  Json::Value data(Json::objectValue);
  data["doc_id_field"] = field;
  data["db_name"] = db_name;
  return MakeRequest("update_term_suggestion", std::move(data));
}

}  // namespace

const std::string kContentExtractPidPath = RootedPath("/var/run/tarncontentextractd.pid");
const std::string kContentExtractShmPath = RootedPath("/tmp/tarnce_shm");

std::string GetFileIndexID(const std::string& share) {
  return "fileindex_" + share;
}

Json::Value GetFileIndexSettings() {
  return Json::Value(Json::objectValue);
}

Json::Value GetFileIndexMappings() {
  return ParseBuiltIn(kMappings, QUARRY_SITE_AT("elastic_control", 535),
                      "!ret.fromString(mappings)");
}

Json::Value GetFileIndexEventHandler() {
  return ParseBuiltIn(kEventHandler, QUARRY_SITE_AT("elastic_control", 547),
                      "!ret.fromString(event_handler)");
}

void ShareIndexCreate(const std::string& share) {
  Json::Value data = IndexData(share);
  data["path"] = sdk::SDKShare(share).GetDBPath();
  data["settings"] = GetFileIndexSettings();
  data["mappings"] = GetFileIndexMappings();
  data["event_handler"] = GetFileIndexEventHandler();
  Send("index_create", std::move(data));
}

void ShareIndexDelete(const std::string& share) {
  Send("index_delete", IndexData(share));
}

void ShareIndexPause(const std::string& share) {
  Send("index_pause", IndexData(share));
}

void ShareIndexResume(const std::string& share) {
  Send("index_resume", IndexData(share));
}

void ShareIndexRename(const std::string& old_share, const std::string& new_share,
                      const std::string& new_db_path) {
  Json::Value data = IndexData(old_share);
  data["data"] = IndexData(new_share);
  data["data"]["path"] = new_db_path;
  Send("index_config_set", std::move(data));
}

void ShareIndexMigrate(const std::string& share, const std::string& new_db_path) {
  Json::Value data = IndexData(share);
  data["data"]["path"] = new_db_path;
  Send("index_config_set", std::move(data));
}

void IndexDel(const std::string& share, const std::string& path) {
  Send("document_del_by_id", DocumentData(GetFileIndexID(share), path, Json::Value()));
}

void IndexDelDir(const std::string& share, const std::string& dir) {
  Json::Value data = IndexData(share);
  data["query"] = BelowQuery(dir);
  Send("document_del_by_query", std::move(data));
}

void IndexUpsert(const std::string& share, const std::string& path, bool need_meta) {
  Send("document_upsert_by_id",
       DocumentData(GetFileIndexID(share), path, Extract(path, need_meta)));
}

void IndexAttr(const std::string& share, const std::string& path) {
  Send("document_set_by_id", DocumentData(GetFileIndexID(share), path, Extract(path, false)));
}

void IndexRename(const std::string& share, const std::string& new_path,
                 const std::string& old_path) {
  const std::string id = GetFileIndexID(share);
  Send("document_set_by_id", DocumentData(id, old_path, RenamedFields(new_path)));

  const Json::Value found = QueryBelow(id, old_path, {kFieldPath, kFieldFSName, kFieldParent});
  if (!HasArray(found)) {
    Fail(QUARRY_SITE_AT("elastic_control", 253), kNoArray, kErrorEngineQuery);
  }
  for (const Json::Value& batch : MoveBatches(id, found["data"], new_path, old_path)) {
    Json::Value response;
    SendRequest(response, batch);
  }
}

void IndexGetByPrefixPath(const std::string& id, const std::string& prefix,
                          std::vector<std::string>& out) {
  const Json::Value found = QueryBelow(id, prefix, {kFieldPath});
  if (!HasArray(found)) {
    Fail(QUARRY_SITE_AT("elastic_control", 307), kNoArray, kErrorEngineQuery);
  }
  for (const Json::Value& document : found["data"]) out.push_back(Field(document, kFieldPath));
}

void IndexCommit(const std::string& share) {
  try {
    Send("commit", IndexData(share));
  } catch (const Error&) {
    if (sdk::SDKShare(share).IsSpaceEnough()) throw;
    StatusMgr().SetShareStatus(share, kShareNeedReindex);
    throw Error(kErrorNoSpace, "Share (" + share + ") space not enough");
  }
}

void UpdateTermSuggestion(const std::string& db_name, const std::vector<std::string>& fields) {
  constexpr std::size_t kElementBytes = 100;  // what an element needs beside the two texts
  for (auto field = fields.begin(); field != fields.end();) {
    Json::Value batch = EmptyBatch();
    std::size_t bytes = 0;
    for (; field != fields.end() && bytes < kSuggestionBatchBytes; ++field) {
      batch["compound"].append(SuggestionRequest(db_name, *field));
      bytes += kElementBytes + db_name.size() + field->size();
    }
    Json::Value response;
    SendRequest(response, batch);
  }
}

}  // namespace quarry::fileindex::elastic
