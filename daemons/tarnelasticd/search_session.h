// One question to indexes that may move, break or vanish meanwhile.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SEARCH_SESSION_H_
#define QUARRY_DAEMONS_TARNELASTICD_SEARCH_SESSION_H_

#include <json/json.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "daemons/tarnelasticd/index.h"
#include "daemons/tarnelasticd/search.h"

namespace quarry::engine {

// One index that is out of use must not hide what the others hold: it is left out, and the answer
// says so. One thread.
class SearchSession {
 public:
  // What runs past `deadline` is given up.
  explicit SearchSession(std::chrono::steady_clock::time_point deadline) : deadline_(deadline) {}

  // Lets an index take part, as it stands now. Never waits for one that is being moved.
  void Add(const std::string& id, const std::shared_ptr<Index>& index);
  // Tells that an index takes no part.
  void Skip(const std::string& id, const Error& why);

  // What is asked of the indexes that take part. Returns an object.
  using Question = std::function<Json::Value(const std::vector<SearchedIndex>& indexes)>;

  // Returns the answer, with "skipped" where an index took no part. Asks again without the indexes
  // that are at fault when it fails. Throws Error as the question does, and the first index's own
  // error when none could take part.
  Json::Value Ask(const Question& question);

 private:
  // An index and its reader. Members are given back in reverse.
  struct Part {
    Part(std::string name, std::shared_ptr<Index> shared,
         std::chrono::steady_clock::time_point deadline);
    SearchedIndex Searched() const { return {id, access.schema(), &*reader}; }

    std::string id;
    std::shared_ptr<Index> index;
    Index::Access access;
    ReaderPool::Lease reader;
  };

  Json::Value AskParts(const Question& question) const;
  bool DropBroken(const Question& question);

  const std::chrono::steady_clock::time_point deadline_;
  std::vector<std::unique_ptr<Part>> parts_;
  std::vector<std::pair<std::string, Error>> skipped_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SEARCH_SESSION_H_
