// An engine with one filled index, for the life of a fuzzing process.

#ifndef QUARRY_FUZZ_ENGINE_FUZZ_PLACE_H_
#define QUARRY_FUZZ_ENGINE_FUZZ_PLACE_H_

#include <json/json.h>

#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>

#include "common/json.h"
#include "daemons/tarnelasticd/engine.h"

namespace quarry::engine {

class FuzzPlace {
 public:
  FuzzPlace() {
    std::string pattern = (std::filesystem::temp_directory_path() / "quarry_fuzz_XXXXXX").string();
    if (mkdtemp(pattern.data()) == nullptr) std::abort();
    dir_ = pattern;
    EngineOptions options;
    options.registry_path = dir_ + "/indexes.json";
    engine_ = std::make_unique<Engine>(options);
    Fill();
  }
  ~FuzzPlace() {
    engine_.reset();
    std::filesystem::remove_all(dir_);
  }
  FuzzPlace(const FuzzPlace&) = delete;
  FuzzPlace& operator=(const FuzzPlace&) = delete;

  Engine& engine() { return *engine_; }

 private:
  static constexpr const char* kMappings =
#include "comm/index_mappings.inc"
      ;

  void Run(const std::string& command, const Json::Value& data) {
    Json::Value request;
    request["command"] = command;
    request["data"] = data;
    request["data"]["id"] = "a";
    if (!engine_->Handle(request)["success"].asBool()) std::abort();
  }
  void Fill() {
    Json::Value data;
    data["path"] = dir_ + "/index";
    if (!fromString(data["mappings"], kMappings)) std::abort();
    Run("index_create", data);
    data.clear();
    for (const char* name : {"report.pdf", "one two.txt", "\xC3\xA9t\xC3\xA9", "x"}) {
      data["doc_id"] = std::string("/s/") + name;
      data["data"]["TARNMDFSName"] = name;
      data["data"]["TARNMDTextContent"] = "one two three words AND OR NOT";
      Run("document_upsert_by_id", data);
    }
    Run("commit", Json::objectValue);
  }

  std::string dir_;
  std::unique_ptr<Engine> engine_;
};

}  // namespace quarry::engine

#endif  // QUARRY_FUZZ_ENGINE_FUZZ_PLACE_H_
