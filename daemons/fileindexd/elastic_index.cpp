#include "daemons/fileindexd/elastic_index.h"

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <utility>

#include "comm/elastic_control.h"
#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "daemons/common/client.h"
#include "daemons/fileindexd/document_carrier.h"
#include "daemons/tarncontentextractd/stamp.h"

namespace quarry::fileindexd {
namespace {

namespace elastic = fileindex::elastic;

constexpr char kIsDirField[] = "TARNMDIsDir";

// Between two questions to an engine that is busy.
constexpr std::chrono::milliseconds kFirstRest = std::chrono::seconds(1);
constexpr std::chrono::milliseconds kLongestRest = std::chrono::minutes(1);
constexpr unsigned int kMostDoublings = 6;

Error NotRunning() {
  return Error(kErrorEngineRequest, "The search engine (tarnelasticd) is not running");
}

// To be asked before what would otherwise be the first to fail.
void RequireEngine() {
  if (!daemon::IsListening(EngineSocketPath())) throw NotRunning();
}

// Lives as long as a request to the engine. The library waits a quarter of a minute for a missing
// socket, and a quarter of an hour for a busy engine; a worker has better things to do.
class Exchange {
 public:
  explicit Exchange(const elastic::BusyWait::Function& rest) : wait_(rest) {
    if (access(EngineSocketPath().c_str(), F_OK) != 0) throw NotRunning();
  }

 private:
  const elastic::BusyWait wait_;
};

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

ElasticIndex::ElasticIndex(const std::string& share, Gate& gate)
    : share_(share),
      id_(elastic::GetFileIndexID(share)),
      gate_(gate),
      rest_([&gate](unsigned int attempt) {
        gate.Rest(std::min(kFirstRest * (1 << std::min(attempt, kMostDoublings)), kLongestRest));
      }) {}

Json::Value ElasticIndex::EngineStatus() {
  RequireEngine();
  Json::Value request;
  request["command"] = "engine_status";
  request["data"] = Json::Value(Json::objectValue);
  Json::Value response;
  const Exchange exchange(rest_);
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
  const Exchange exchange(rest_);
  elastic::ShareIndexCreate(share_);
}

void ElasticIndex::Commit() {
  RequireEngine();
  const Exchange exchange(rest_);
  elastic::IndexCommit(share_);
}

void ElasticIndex::Upsert(const std::string& path, bool need_meta) {
  const Exchange exchange(rest_);
  elastic::IndexUpsert(share_, path, need_meta);
}

std::vector<bool> ElasticIndex::UpsertMany(const std::vector<Wish>& wishes) {
  static const DocumentCarrier::Sockets sockets{ExtractorSocketPath(), EngineSocketPath()};
  thread_local DocumentCarrier carrier(sockets);
  // Slow files one after the other are not to hold up a stop or a pause.
  return carrier.Carry(id_, wishes, [this] { return !gate_.Stopping() && !gate_.Paused(); });
}

void ElasticIndex::SetAttributes(const std::string& path) {
  const Exchange exchange(rest_);
  elastic::IndexAttr(share_, path);
}

void ElasticIndex::Delete(const std::string& path) {
  const Exchange exchange(rest_);
  elastic::IndexDel(share_, path);
}

void ElasticIndex::DeleteBelow(const std::string& dir) {
  const Exchange exchange(rest_);
  elastic::IndexDelDir(share_, dir);
}

void ElasticIndex::Rename(const std::string& new_path, const std::string& old_path) {
  const Exchange exchange(rest_);
  elastic::IndexRename(share_, new_path, old_path);
}

// Asks a question that changes nothing on a connection that is kept, since a walk has one for each
// directory. Returns whether there is an answer: an engine that is busy, or does not answer, is to
// be asked again by somebody with more patience. Throws what a refusal says.
bool ElasticIndex::AskQuickly(const Json::Value& request, Json::Value* response) {
  bool success = false;
  int code = kErrorEngineBusy;
  std::string message;
  try {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (!engine_) engine_.emplace("The search engine (tarnelasticd)", EngineSocketPath());
    *response = engine_->Request(request);
    GetJsonValue(success, *response, "success", true);
    if (success) return true;
    GetJsonValue(code, (*response)["error"], "code", true);
    GetJsonValue(message, (*response)["error"], "msg", true);
  } catch (const Error&) {
    return false;
  }
  if (code == kErrorEngineBusy || code == kErrorEngineBusyMemory) return false;
  throw Error(code, "Request failed, msg=" + message);
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
  if (!AskQuickly(request, &response)) {
    const Exchange exchange(rest_);
    elastic::SendRequest(response, request);
  }
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
