// The index of a share in the search engine.

#ifndef QUARRY_DAEMONS_FILEINDEXD_ELASTIC_INDEX_H_
#define QUARRY_DAEMONS_FILEINDEXD_ELASTIC_INDEX_H_

#include <json/json.h>

#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "comm/comm.h"
#include "daemons/common/client.h"
#include "daemons/fileindexd/gate.h"
#include "daemons/fileindexd/index.h"

namespace quarry::fileindexd {

// Asks an engine that does not run once and fails, instead of waiting for it: the worker does that.
// An engine that says it is busy is asked again for as long as it takes, sooner than the library
// would by itself; that wait ends when the gate stops, with Interrupted.
class ElasticIndex : public Index {
 public:
  // The gate must outlive the index.
  ElasticIndex(const std::string& share, Gate& gate);

  std::string Epoch() override;
  void Create() override;
  void Commit() override;
  std::uint64_t Count() override;
  void Upsert(const std::string& path, bool need_meta) override;
  std::vector<bool> UpsertMany(const std::vector<Wish>& wishes) override;
  void SetAttributes(const std::string& path) override;
  void Delete(const std::string& path) override;
  void DeleteBelow(const std::string& dir) override;
  void Rename(const std::string& new_path, const std::string& old_path) override;
  std::optional<Document> Find(const std::string& path) override;
  std::vector<Document> Children(const std::string& dir, const std::string& after,
                                 std::size_t limit) override;
  std::vector<std::string> PathsBelow(const std::string& dir, const std::string& after,
                                      std::size_t limit) override;
  bool CanRead() override;

 private:
  Json::Value EngineStatus();
  bool AskQuickly(const Json::Value& request, Json::Value* response);
  std::vector<Document> Query(const char* kind, const char* field, const std::string& value,
                              const std::string& after, std::size_t limit);

  const std::string share_;
  const std::string id_;
  const Gate& gate_;
  const fileindex::elastic::BusyWait::Function rest_;
  std::mutex mutex_;
  std::optional<daemon::Client> engine_;  // for questions, one at a time
};

// Where the engine and the reader of files listen.
const std::string& EngineSocketPath();
const std::string& ExtractorSocketPath();

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_ELASTIC_INDEX_H_
