#include "daemons/tarnelasticd/engine.h"

#include <sys/random.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <new>
#include <optional>
#include <utility>
#include <vector>

#include "common/json.h"
#include "daemons/common/log.h"
#include "daemons/common/reply.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/index_files.h"
#include "daemons/tarnelasticd/request.h"
#include "daemons/tarnelasticd/search.h"
#include "daemons/tarnelasticd/search_session.h"
#include "daemons/tarnelasticd/selection.h"
#include "daemons/tarnelasticd/suggestion.h"

namespace quarry::engine {
namespace {

using daemon::FailureReply;
using daemon::SuccessReply;

// A number that no other life of this process has had.
std::string RandomId() {
  std::array<unsigned char, 16> bytes{};
  if (getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
    throw Error(kErrorSystem, "The system gives no random numbers");
  }
  std::string id;
  for (const unsigned char byte : bytes) {
    std::array<char, 3> hex{};
    std::snprintf(hex.data(), hex.size(), "%02x", byte);
    id += hex.data();
  }
  return id;
}

// What the administrator must know of; mistakes of peers are theirs.
void LogFailure(const std::string& command, const Error& error) {
  switch (static_cast<int>(error.code())) {
    case kErrorEngineBusy:
    case kErrorEngineBusyMemory:
    case kDamagedIndex:
    case kDiskFull:
    case kStorageFailed:
    case kInternalFailure:
    case kOutOfMemory:
      daemon::LogError(command + " failed: " + error.reason());
      break;
    default:
      break;
  }
}

std::optional<std::string> OptionalName(const Json::Value& data, const char* key) {
  if (!data.isMember(key)) return std::nullopt;
  return NameProperty(data, key);
}

const std::string kUpsert = "document_upsert_by_id";

// The requests from `element` on that store documents in the same index.
std::vector<Json::Value*> UpsertsOfOneIndex(Json::Value::iterator element,
                                            Json::Value::iterator end) {
  std::vector<Json::Value*> upserts;
  const Json::Value* id = nullptr;
  for (; element != end; ++element) {
    const Json::Value& request = *element;
    if (!request.isObject() || request["command"] != kUpsert) break;
    const Json::Value& data = request["data"];
    if (!data.isObject() || (id != nullptr && data["id"] != *id)) break;
    id = &data["id"];
    upserts.push_back(&*element);
  }
  return upserts;
}

// Runs `action`, whose want of memory is an Error like others.
template <typename Action>
auto ReportingMemory(Action action) {
  try {
    return action();
  } catch (const std::bad_alloc&) {
    throw Error(kErrorEngineBusyMemory, "Out of memory");
  }
}

// The answer to a request that `action` makes the data of. `name` is the command, or becomes it.
template <typename Action>
Json::Value Answer(const std::string& name, Action action) {
  try {
    return SuccessReply(action());
  } catch (const Error& error) {
    LogFailure(name, error);
    return FailureReply(error.code(), error.reason());
  } catch (const Json::Exception& failure) {
    return FailureReply(kMalformedRequest, failure.what());
  } catch (const std::exception& failure) {
    LogFailure(name, Error(kInternalFailure, failure.what()));
    return FailureReply(kInternalFailure, failure.what());
  }
}

// Runs what nobody waits for, and which must not end the process either.
template <typename Action, typename... Arguments>
void EnduringWant(Action action, Arguments... arguments) noexcept {
  try {
    action(arguments...);
  } catch (const std::bad_alloc&) {
    // Not even for the log is there memory.
  }
}

void CommitLogging(Index* index) {
  try {
    ReportingMemory([index] { index->Commit(); });
  } catch (const Error& error) {
    if (!index->Problem()) daemon::LogError("Commit failed: " + error.reason());
  }
}

// Damage that shows up during work is remembered, so that the next index_create repairs it.
template <typename Action>
auto NotingDamage(Index* index, Action action) {
  try {
    return action();
  } catch (const Error& error) {
    index->NoteDamage(error);
    throw;
  }
}

}  // namespace

Engine::Engine(const EngineOptions& options)
    : options_(options),
      life_(RandomId()),
      memory_(options.memory_bytes, options.memory_wait),
      catalog_(options.registry_path, options.writer, [this] { ++losses_; }) {}

Engine::~Engine() {
  CommitAll();
}

const std::map<std::string, Engine::Command>& Engine::Commands() {
  static const std::map<std::string, Command> commands = {
      {"index_create", {&Engine::IndexCreate, true}},
      {"index_delete", {&Engine::IndexDelete, true}},
      {"index_pause", {&Engine::IndexPause, true}},
      {"index_resume", {&Engine::IndexResume, true}},
      {"index_config_set", {&Engine::IndexConfigSet, true}},
      {"index_check", {&Engine::IndexCheck, false}},
      {kUpsert, {&Engine::DocumentUpsert, false}},
      {"document_set_by_id", {&Engine::DocumentSet, false}},
      {"document_del_by_id", {&Engine::DocumentDelete, false}},
      {"document_del_by_query", {&Engine::DocumentDeleteByQuery, false}},
      {"document_get_by_query", {&Engine::DocumentGetByQuery, false}},
      {"commit", {&Engine::Commit, false}},
      {"update_term_suggestion", {&Engine::UpdateTermSuggestion, false}},
      {"search", {&Engine::Search, false}},
      {"complete", {&Engine::Complete, false}},
      {"engine_status", {&Engine::Status, true}},
  };
  return commands;
}

std::string Engine::HandleText(std::string text) {
  try {
    Json::Value request;
    if (!fromString(request, text)) {
      return toString(FailureReply(kMalformedRequest, "The request is no JSON"));
    }
    std::string().swap(text);
    return toString(Handle(std::move(request)));
  } catch (const std::bad_alloc&) {
    // Which command it was is not known, and some must never be answered as busy.
    return toString(FailureReply(kOutOfMemory, "Out of memory"));
  }
}

Json::Value Engine::Handle(Json::Value request) {
  if (request.isObject() && request.isMember("compound")) return HandleBatch(&request["compound"]);
  return HandleOne(request);
}

Json::Value Engine::HandleBatch(Json::Value* elements) {
  if (!elements->isArray()) return FailureReply(kMalformedRequest, "Not an array: compound");
  Json::Value response = SuccessReply(Json::Value(Json::arrayValue));
  response["has_fail"] = false;
  for (auto element = elements->begin(); element != elements->end();) {
    const std::vector<Json::Value*> upserts = UpsertsOfOneIndex(element, elements->end());
    std::vector<Json::Value> answers;
    if (!upserts.empty()) {
      answers = UpsertAll(upserts);
    } else {
      answers.push_back(HandleOne(*element));
    }
    for (Json::Value& answer : answers) {
      if (!answer["success"].asBool()) response["has_fail"] = true;
      response["data"].append(std::move(answer));
      ++element;
    }
  }
  return response;
}

Json::Value Engine::HandleOne(const Json::Value& request) {
  std::string name = "A request";
  return Answer(name, [&] {
    name = StringProperty(request, "command");
    return RunCommand(name, request);
  });
}

// Documents in a row cost the writer one turn, and are made ready before it. Each is answered as it
// would be by itself.
std::vector<Json::Value> Engine::UpsertAll(const std::vector<Json::Value*>& requests) {
  std::vector<Json::Value> answers(requests.size());
  const Json::Value all = Answer(
      kUpsert, [&] { return ReportingMemory([&] { return UpsertInto(requests, &answers); }); });
  if (all["success"].asBool()) return answers;
  for (Json::Value& answer : answers) {
    if (answer.isNull() || answer["success"].asBool()) answer = all;
  }
  return answers;
}

Json::Value Engine::UpsertInto(const std::vector<Json::Value*>& requests,
                               std::vector<Json::Value>* answers) {
  const auto answer = [answers](std::size_t i, auto action) {
    (*answers)[i] = Answer(kUpsert, [&] {
      return ReportingMemory([&] {
        action();
        return Json::Value();
      });
    });
  };
  const auto data_of = [&](std::size_t i) -> const Json::Value& {
    return std::as_const(*requests[i])["data"];
  };
  const std::shared_ptr<Index> index = catalog_.Find(NameProperty(data_of(0), "id"));
  std::vector<std::optional<std::string>> paths(requests.size());  // none: refused
  std::size_t bytes = 0;
  for (std::size_t i = 0; i < requests.size(); ++i) {
    answer(i, [&] {
      const std::string path = NameProperty(data_of(i), "doc_id");
      bytes += EstimateMemory(ObjectProperty(data_of(i), "data"));
      paths[i] = path;
    });
    if (!paths[i]) *requests[i] = Json::Value();
  }
  if (std::none_of(paths.begin(), paths.end(), [](const auto& path) { return path.has_value(); })) {
    return {};
  }
  const MemoryBudget::Share memory(&memory_, bytes);
  Index::Access access(index.get());
  std::vector<std::optional<StoredDocument>> documents(requests.size());
  for (std::size_t i = 0; i < requests.size(); ++i) {
    if (!paths[i]) continue;
    answer(i,
           [&] { documents[i] = MakeDocument(*access.schema(), *paths[i], data_of(i)["data"]); });
    *requests[i] = Json::Value();
  }
  access.Write([&](IndexWriter& writer) {
    for (std::size_t i = 0; i < requests.size(); ++i) {
      if (!documents[i]) continue;
      answer(i,
             [&] { NotingDamage(index.get(), [&] { writer.Upsert(std::move(*documents[i])); }); });
    }
  });
  return {};
}

Json::Value Engine::RunCommand(const std::string& name, const Json::Value& request) {
  const auto command = Commands().find(name);
  if (command == Commands().end()) throw Error(kUnknownCommand, "There is no command " + name);
  static const Json::Value none(Json::objectValue);
  const bool has_data = name != "engine_status" || request.isMember("data");
  try {
    return ReportingMemory([&] {
      return (this->*command->second.run)(has_data ? ObjectProperty(request, "data") : none);
    });
  } catch (const Error& error) {
    if (!command->second.never_busy || error.code() != kErrorEngineBusyMemory) throw;
    throw Error(kOutOfMemory, error.reason());
  }
}

Json::Value Engine::IndexCreate(const Json::Value& data) {
  IndexRecord record;
  record.id = NameProperty(data, "id");
  record.path = NameProperty(data, "path");
  CheckDirectory(record.path);
  record.settings = data["settings"];
  record.mappings = data["mappings"];
  record.event_handler = data["event_handler"];
  catalog_.Create(record);
  return {};
}

Json::Value Engine::IndexDelete(const Json::Value& data) {
  catalog_.Delete(NameProperty(data, "id"));
  return {};
}

Json::Value Engine::IndexPause(const Json::Value& data) {
  catalog_.SetPaused(NameProperty(data, "id"), true);
  return {};
}

Json::Value Engine::IndexResume(const Json::Value& data) {
  catalog_.SetPaused(NameProperty(data, "id"), false);
  return {};
}

Json::Value Engine::IndexConfigSet(const Json::Value& data) {
  const std::string id = NameProperty(data, "id");
  const Json::Value& changes = ObjectProperty(data, "data");
  const std::optional<std::string> new_path = OptionalName(changes, "path");
  if (new_path) CheckDirectory(*new_path);
  Json::Value result;
  result["found"] = catalog_.Configure(id, OptionalName(changes, "id"), new_path);
  return result;
}

Json::Value Engine::DocumentUpsert(const Json::Value& data) {
  const std::shared_ptr<Index> index = catalog_.Find(NameProperty(data, "id"));
  const std::string path = NameProperty(data, "doc_id");
  const Json::Value& document = ObjectProperty(data, "data");
  const MemoryBudget::Share memory(&memory_, EstimateMemory(document));
  Index::Access access(index.get());
  StoredDocument stored = MakeDocument(*access.schema(), path, document);
  NotingDamage(index.get(), [&] {
    access.Write([&](IndexWriter& writer) { writer.Upsert(std::move(stored)); });
  });
  return {};
}

Json::Value Engine::DocumentSet(const Json::Value& data) {
  const std::shared_ptr<Index> index = catalog_.Find(NameProperty(data, "id"));
  const std::string path = NameProperty(data, "doc_id");
  const Json::Value& changes = ObjectProperty(data, "data");
  const MemoryBudget::Share memory(&memory_, EstimateMemory(changes));
  Index::Access access(index.get());
  Json::Value result;
  result["found"] = NotingDamage(index.get(), [&] {
    return access.Write([&](IndexWriter& writer) { return writer.Set(path, changes); });
  });
  return result;
}

Json::Value Engine::DocumentDelete(const Json::Value& data) {
  const std::shared_ptr<Index> index = catalog_.Find(NameProperty(data, "id"));
  const std::string path = NameProperty(data, "doc_id");
  Index::Access access(index.get());
  Json::Value result;
  result["found"] = NotingDamage(index.get(), [&] {
    return access.Write([&](IndexWriter& writer) { return writer.Delete(path); });
  });
  return result;
}

Json::Value Engine::DocumentDeleteByQuery(const Json::Value& data) {
  const std::shared_ptr<Index> index = catalog_.Find(NameProperty(data, "id"));
  Index::Access access(index.get());
  const Selection selection = ParseSelection(*access.schema(), ObjectProperty(data, "query"));
  Json::Value result;
  result["deleted"] = Json::Int64{NotingDamage(index.get(), [&] {
    return access.Write([&](IndexWriter& writer) { return writer.DeleteSelected(selection); });
  })};
  return result;
}

Json::Value Engine::DocumentGetByQuery(const Json::Value& data) {
  const std::shared_ptr<Index> index = catalog_.Find(NameProperty(data, "id"));
  Index::Access access(index.get());
  const Selection selection = ParseSelection(*access.schema(), ObjectProperty(data, "query"));
  return NotingDamage(index.get(), [&] {
    return access.UseWriter([&](IndexWriter& writer) { return writer.Find(selection); });
  });
}

Json::Value Engine::Commit(const Json::Value& data) {
  const std::shared_ptr<Index> index = catalog_.Find(NameProperty(data, "id"));
  NotingDamage(index.get(), [&] { index->Commit(); });
  return {};
}

Json::Value Engine::UpdateTermSuggestion(const Json::Value& data) {
  const std::shared_ptr<Index> index = catalog_.Find(NameProperty(data, "db_name"));
  StringProperty(data, "doc_id_field");
  // What a paused index suggests cannot have changed.
  if (index->paused()) return {};
  Index::Access access(index.get());
  NotingDamage(index.get(),
               [&] { access.Write([](IndexWriter& writer) { writer.RequestTerms(); }); });
  return {};
}

void Engine::AddIndexes(const Json::Value& data, SearchSession* session) const {
  if (!data.isMember("ids")) {
    for (const auto& [id, index] : catalog_.All()) session->Add(id, index);
    return;
  }
  for (const std::string& id : NamesProperty(data, "ids")) {
    try {
      session->Add(id, catalog_.Find(id));
    } catch (const Error& error) {
      session->Skip(id, error);
    }
  }
}

Json::Value Engine::Search(const Json::Value& data) {
  const SearchRequest request = ParseSearchRequest(data);
  ParseQuery(request.query);
  SearchSession session(std::chrono::steady_clock::now() + options_.search_time);
  AddIndexes(data, &session);
  return session.Ask([&request](const std::vector<SearchedIndex>& indexes) {
    return quarry::engine::Search(request, indexes);
  });
}

Json::Value Engine::Complete(const Json::Value& data) {
  const CompletionRequest request = ParseCompletionRequest(data);
  SearchSession session(std::chrono::steady_clock::now() + options_.search_time);
  AddIndexes(data, &session);
  return session.Ask([&request](const std::vector<SearchedIndex>& indexes) {
    return CompleteWord(request, indexes);
  });
}

Json::Value Engine::Status(const Json::Value& /*data*/) {
  Json::Value status;
  status["epoch"] = Epoch();
  status["indexes"] = Json::Value(Json::arrayValue);
  for (const auto& [id, index] : catalog_.All()) {
    Json::Value entry;
    entry["id"] = id;
    entry["documents"] = Json::Int64{index->documents()};
    entry["paused"] = index->paused();
    if (const auto problem = index->Problem()) entry["problem"] = problem->reason();
    status["indexes"].append(std::move(entry));
  }
  return status;
}

// Work that was not committed is gone with this process, and also when the engine had to undo it.
std::string Engine::Epoch() const {
  return life_ + '.' + std::to_string(losses_.load());
}

void Engine::Tick() {
  EnduringWant([this] {
    for (const auto& [id, index] : catalog_.All()) index->CommitIfOld();
  });
}

void Engine::CommitAll() {
  EnduringWant([this] {
    for (const auto& [id, index] : catalog_.All()) EnduringWant(CommitLogging, index.get());
  });
}

}  // namespace quarry::engine
