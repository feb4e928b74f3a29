// An engine on directories of its own, and short ways to ask it.

#ifndef QUARRY_TESTS_DAEMONS_TARNELASTICD_SUPPORT_ENGINE_FIXTURE_H_
#define QUARRY_TESTS_DAEMONS_TARNELASTICD_SUPPORT_ENGINE_FIXTURE_H_

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>

#include <memory>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/engine.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "tests/support/temp_dir.h"

namespace quarry::engine {

// The mappings that the library sends for every share.
Json::Value ShareMappings();

Json::Value Parse(const std::string& text);

// A file's document as the extractor makes it: attributes from the path, and the text if any.
Json::Value FileDocument(const std::string& path, const std::string& text = "");

Json::Value MakeRequest(const std::string& command, const Json::Value& data);
Json::Value CreateRequest(const std::string& id, const std::string& path);
Json::Value UpsertRequest(const std::string& id, const Json::Value& document);

class EngineTest : public testing::Test {
 protected:
  EngineTest();

  // Starts the engine anew on the same files, as after a clean stop.
  void Restart();

  // The answer's data; a test failure when it reports one.
  Json::Value Ask(const std::string& command, const Json::Value& data);
  // The code of the error with which the answer fails, 0 when it does not.
  int AskError(const std::string& command, const Json::Value& data);

  void Create(const std::string& id = "a");
  void Upsert(const Json::Value& document, const std::string& id = "a");
  void Commit(const std::string& id = "a");
  // Stores and commits a file with this text.
  void Add(const std::string& path, const std::string& text = "", const std::string& id = "a");
  std::string DirectoryOf(const std::string& id) const { return dir_ / ("index/" + id); }

  Json::Value Search(const std::string& query, Json::Value more = Json::objectValue);
  // The paths of all hits, in order.
  std::vector<std::string> Paths(const std::string& query, Json::Value more = Json::objectValue);
  // The code with which a search fails.
  int SearchError(const std::string& query);
  // The paths below `prefix`, by document_get_by_query.
  std::vector<std::string> Below(const std::string& prefix, const std::string& id = "a");
  // All fields of one document; null without it.
  Json::Value Get(const std::string& path, const std::string& id = "a");

  test::TempDir dir_;
  EngineOptions options_;
  std::unique_ptr<Engine> engine_;
};

}  // namespace quarry::engine

#endif  // QUARRY_TESTS_DAEMONS_TARNELASTICD_SUPPORT_ENGINE_FIXTURE_H_
