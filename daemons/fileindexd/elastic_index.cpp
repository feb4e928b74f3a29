#include "daemons/fileindexd/elastic_index.h"

#include <utility>

#include "comm/comm.h"
#include "comm/elastic_control.h"
#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "daemons/common/client.h"
#include "daemons/tarncontentextractd/stamp.h"

namespace quarry::fileindexd {
namespace {

namespace elastic = fileindex::elastic;

constexpr char kIsDirField[] = "TARNMDIsDir";

// The library waits a quarter of a minute for a missing socket and logs each second of it; a worker
// has better things to do.
void RequireEngine() {
  if (!daemon::IsListening(EngineSocketPath())) {
    throw Error(kErrorEngineRequest, "The search engine (tarnelasticd) is not running");
  }
}

Document ToDocument(const Json::Value& fields) {
  Document document;
  GetJsonValue<std::string>(document.path, fields, elastic::kFieldPath, true);
  GetJsonValue<bool>(document.is_dir, fields, kIsDirField, false);
  GetJsonValue<std::string>(document.attribute_stamp, fields, extract::kAttributeStampField, false);
  GetJsonValue<std::string>(document.content_stamp, fields, extract::kContentStampField, false);
  return document;
}

}  // namespace

const std::string& EngineSocketPath() {
  static const std::string path = RootedPath("/var/run/tarnelasticd.sock");
  return path;
}

const std::string& ExtractorSocketPath() {
  static const std::string path = RootedPath("/var/run/tarncontentextractd.sock");
  return path;
}

ElasticIndex::ElasticIndex(const std::string& share)
    : share_(share), id_(elastic::GetFileIndexID(share)) {}

Json::Value ElasticIndex::EngineStatus() {
  RequireEngine();
  Json::Value request;
  request["command"] = "engine_status";
  request["data"] = Json::Value(Json::objectValue);
  Json::Value response;
  elastic::SendRequest(response, request);
  return response["data"];
}

std::string ElasticIndex::Epoch() {
  std::string epoch;
  GetJsonValue<std::string>(epoch, EngineStatus(), "epoch", true);
  return epoch;
}

std::uint64_t ElasticIndex::Count() {
  Json::Value indexes;
  GetJsonValue<Json::Value>(indexes, EngineStatus(), "indexes", true);
  for (const Json::Value& index : indexes) {
    std::string id;
    long long documents = 0;
    GetJsonValue<std::string>(id, index, "id", true);
    GetJsonValue<long long>(documents, index, "documents", true);
    if (id == id_) return static_cast<std::uint64_t>(documents);
  }
  return 0;
}

void ElasticIndex::Create() {
  RequireEngine();
  elastic::ShareIndexCreate(share_);
}

void ElasticIndex::Commit() {
  RequireEngine();
  elastic::IndexCommit(share_);
}

void ElasticIndex::Upsert(const std::string& path, bool need_meta) {
  elastic::IndexUpsert(share_, path, need_meta);
}

void ElasticIndex::SetAttributes(const std::string& path) {
  elastic::IndexAttr(share_, path);
}

void ElasticIndex::Delete(const std::string& path) {
  elastic::IndexDel(share_, path);
}

void ElasticIndex::DeleteBelow(const std::string& dir) {
  elastic::IndexDelDir(share_, dir);
}

void ElasticIndex::Rename(const std::string& new_path, const std::string& old_path) {
  elastic::IndexRename(share_, new_path, old_path);
}

std::vector<Document> ElasticIndex::Query(const char* kind, const char* field,
                                          const std::string& value, const std::string& after,
                                          std::size_t limit) {
  Json::Value request;
  request["command"] = "document_get_by_query";
  Json::Value& data = request["data"];
  data["id"] = id_;
  data["query"]["qsl"][kind][field] = value;
  data["query"]["limit"] = Json::UInt64(limit);
  if (!after.empty()) data["query"]["after"] = after;
  for (const char* name : {elastic::kFieldPath, kIsDirField, extract::kAttributeStampField,
                           extract::kContentStampField}) {
    data["query"]["load_field"].append(name);
  }
  Json::Value response;
  elastic::SendRequest(response, request);
  if (!response["data"].isArray()) {
    throw Error(kErrorEngineQuery, "The search engine's list of documents is malformed");
  }
  std::vector<Document> documents;
  for (const Json::Value& fields : response["data"]) documents.push_back(ToDocument(fields));
  return documents;
}

std::optional<Document> ElasticIndex::Find(const std::string& path) {
  std::vector<Document> found = Query("term", elastic::kFieldPath, path, "", 1);
  if (found.empty()) return std::nullopt;
  return found.front();
}

std::vector<Document> ElasticIndex::Children(const std::string& dir, const std::string& after,
                                             std::size_t limit) {
  return Query("term", elastic::kFieldParent, dir, after, limit);
}

std::vector<std::string> ElasticIndex::PathsBelow(const std::string& dir, const std::string& after,
                                                  std::size_t limit) {
  std::vector<std::string> paths;
  for (Document& document : Query("prefix", elastic::kFieldPath, dir + "/", after, limit)) {
    paths.push_back(std::move(document.path));
  }
  return paths;
}

bool ElasticIndex::CanRead() {
  return daemon::IsListening(ExtractorSocketPath());
}

}  // namespace quarry::fileindexd
