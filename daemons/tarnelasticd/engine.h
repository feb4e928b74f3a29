// The search engine: requests in, answers out, as docs/engine-protocol.md describes them.

#ifndef QUARRY_DAEMONS_TARNELASTICD_ENGINE_H_
#define QUARRY_DAEMONS_TARNELASTICD_ENGINE_H_

#include <json/json.h>

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/catalog.h"
#include "daemons/tarnelasticd/memory_budget.h"

namespace quarry::engine {

class SearchSession;

struct EngineOptions {
  // The list of indexes.
  std::string registry_path;
  WriterLimits writer;
  // A search that takes longer is given up.
  std::chrono::steady_clock::duration search_time = std::chrono::seconds(30);
  // What the documents in requests at work may take in memory together.
  std::size_t memory_bytes = std::size_t{512} << 20;
  // How long a request waits for others to free memory before it is answered as busy.
  std::chrono::steady_clock::duration memory_wait = std::chrono::seconds(30);
};

// Knows nothing of sockets. Any thread; requests that change one index wait for each other,
// searches do not.
class Engine {
 public:
  // Opens all indexes. Throws Error kErrorLoadFile when the list of indexes cannot be read.
  explicit Engine(const EngineOptions& options);
  // What is not committed is committed.
  ~Engine();
  Engine(const Engine&) = delete;
  Engine& operator=(const Engine&) = delete;

  // Answers one request, or a batch. Never throws; blocks as long as the work takes. Documents of a
  // batch are let go of when they have been made ready to be stored, before they wait for that.
  Json::Value Handle(Json::Value request);
  // The same from text to text. What is no JSON is answered with an error.
  std::string HandleText(std::string request);

  // Commits what has been open for too long. To be called every second or so.
  void Tick();
  // Commits everything that is open. Failures are logged.
  void CommitAll();

 private:
  struct Command {
    Json::Value (Engine::*run)(const Json::Value& data);
    // Such a command must not answer busy: whoever sends it cannot wait a quarter of an hour.
    bool never_busy;
  };
  static const std::map<std::string, Command>& Commands();

  Json::Value HandleOne(const Json::Value& request);
  std::vector<Json::Value> UpsertAll(const std::vector<Json::Value*>& requests);
  Json::Value UpsertInto(const std::vector<Json::Value*>& requests,
                         std::vector<Json::Value>* answers);
  Json::Value HandleBatch(Json::Value* elements);
  Json::Value RunCommand(const std::string& name, const Json::Value& request);

  Json::Value IndexCreate(const Json::Value& data);
  Json::Value IndexDelete(const Json::Value& data);
  Json::Value IndexPause(const Json::Value& data);
  Json::Value IndexResume(const Json::Value& data);
  Json::Value IndexConfigSet(const Json::Value& data);
  Json::Value IndexCheck(const Json::Value& data);
  Json::Value DocumentUpsert(const Json::Value& data);
  Json::Value DocumentSet(const Json::Value& data);
  Json::Value DocumentDelete(const Json::Value& data);
  Json::Value DocumentDeleteByQuery(const Json::Value& data);
  Json::Value DocumentGetByQuery(const Json::Value& data);
  Json::Value Commit(const Json::Value& data);
  Json::Value UpdateTermSuggestion(const Json::Value& data);
  Json::Value Search(const Json::Value& data);
  Json::Value Complete(const Json::Value& data);
  Json::Value Status(const Json::Value& data);

  std::string Epoch() const;
  void AddIndexes(const Json::Value& data, SearchSession* session) const;

  const EngineOptions options_;
  const std::string life_;
  std::atomic<std::uint64_t> losses_{0};
  MemoryBudget memory_;
  Catalog catalog_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_ENGINE_H_
