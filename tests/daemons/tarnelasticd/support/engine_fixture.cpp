#include "tests/daemons/tarnelasticd/support/engine_fixture.h"

#include <utility>

#include "common/file_util.h"
#include "common/json.h"

namespace quarry::engine {

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

Json::Value ShareMappings() {
  return Parse(
#include "comm/index_mappings.inc"
  );
}

Json::Value FileDocument(const std::string& path, const std::string& text) {
  Json::Value document;
  document["TARNMDPath"] = path;
  document["TARNMDParent"] = Dirname(path);
  document["TARNMDFSName"] = Basename(path);
  document["TARNMDSearchFileName"] = Basename(path);
  document["TARNMDDisplayName"] = Basename(path);
  document["TARNMDExtension"] = GetFileExtension(path, true);
  document["TARNMDIsDir"] = false;
  document["TARNMDFSSize"] = static_cast<Json::UInt64>(text.size());
  document["TARNMDFSContentChangeDate"] = 1700000000;
  document["QuarryAttributeStamp"] = "1:2:3";
  if (!text.empty()) document["TARNMDTextContent"] = text;
  return document;
}

Json::Value MakeRequest(const std::string& command, const Json::Value& data) {
  Json::Value request;
  request["command"] = command;
  request["data"] = data;
  return request;
}

Json::Value CreateRequest(const std::string& id, const std::string& path) {
  Json::Value data;
  data["id"] = id;
  data["path"] = path;
  data["settings"] = Json::Value(Json::objectValue);
  data["mappings"] = ShareMappings();
  data["event_handler"]["lib_path"] = "/nowhere/handler.so";
  return MakeRequest("index_create", data);
}

Json::Value UpsertRequest(const std::string& id, const Json::Value& document) {
  Json::Value data;
  data["id"] = id;
  data["doc_id"] = document["TARNMDPath"];
  data["data"] = document;
  return MakeRequest("document_upsert_by_id", data);
}

EngineTest::EngineTest() {
  options_.registry_path = dir_ / "engine/indexes.json";
  engine_ = std::make_unique<Engine>(options_);
}

void EngineTest::Restart() {
  engine_.reset();
  engine_ = std::make_unique<Engine>(options_);
}

Json::Value EngineTest::Ask(const std::string& command, const Json::Value& data) {
  const Json::Value response = engine_->Handle(MakeRequest(command, data));
  EXPECT_TRUE(response["success"].asBool()) << command << ": " << toString(response);
  return response["data"];
}

int EngineTest::AskError(const std::string& command, const Json::Value& data) {
  const Json::Value response = engine_->Handle(MakeRequest(command, data));
  if (response["success"].asBool()) return 0;
  EXPECT_TRUE(response["error"]["msg"].isString());
  return response["error"]["code"].asInt();
}

void EngineTest::Create(const std::string& id) {
  Ask("index_create", CreateRequest(id, DirectoryOf(id))["data"]);
}

void EngineTest::Upsert(const Json::Value& document, const std::string& id) {
  Ask("document_upsert_by_id", UpsertRequest(id, document)["data"]);
}

void EngineTest::Commit(const std::string& id) {
  Json::Value data;
  data["id"] = id;
  Ask("commit", data);
}

void EngineTest::Add(const std::string& path, const std::string& text, const std::string& id) {
  Upsert(FileDocument(path, text), id);
  Commit(id);
}

Json::Value EngineTest::Search(const std::string& query, Json::Value more) {
  more["query"] = query;
  return Ask("search", more);
}

std::vector<std::string> EngineTest::Paths(const std::string& query, Json::Value more) {
  if (!more.isMember("limit")) more["limit"] = 1000;
  std::vector<std::string> paths;
  const Json::Value found = Search(query, std::move(more));
  for (const Json::Value& hit : found["hits"]) {
    paths.push_back(hit["path"].asString());
  }
  return paths;
}

int EngineTest::SearchError(const std::string& query) {
  Json::Value data;
  data["query"] = query;
  return AskError("search", data);
}

std::vector<std::string> EngineTest::Below(const std::string& prefix, const std::string& id) {
  Json::Value data;
  data["id"] = id;
  data["query"]["qsl"]["prefix"]["TARNMDPath"] = prefix;
  data["query"]["load_field"].append("TARNMDPath");
  std::vector<std::string> paths;
  const Json::Value found = Ask("document_get_by_query", data);
  for (const Json::Value& document : found) {
    paths.push_back(document["TARNMDPath"].asString());
  }
  return paths;
}

Json::Value EngineTest::Get(const std::string& path, const std::string& id) {
  Json::Value data;
  data["id"] = id;
  data["query"]["qsl"]["term"]["TARNMDPath"] = path;
  const Json::Value with_attributes = Ask("document_get_by_query", data);
  if (with_attributes.empty()) return {};
  Json::Value document = with_attributes[0];
  const Json::Value fields = ShareMappings()["properties"];
  for (const std::string& name : fields.getMemberNames()) data["query"]["load_field"].append(name);
  const Json::Value with_texts = Ask("document_get_by_query", data)[0];
  for (const std::string& name : with_texts.getMemberNames()) document[name] = with_texts[name];
  return document;
}

}  // namespace quarry::engine
