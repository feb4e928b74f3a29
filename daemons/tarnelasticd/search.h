// Searching: from a query over several indexes to one page of hits.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SEARCH_H_
#define QUARRY_DAEMONS_TARNELASTICD_SEARCH_H_

#include <json/json.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/index_reader.h"
#include "daemons/tarnelasticd/matcher.h"
#include "daemons/tarnelasticd/query.h"
#include "daemons/tarnelasticd/schema.h"

namespace quarry::engine {

enum class SortOrder {
  kDefault,  // by score; by path where nothing is ranked
  kScore,    // the best first
  kPath,
  kTime,  // the latest change of content first
};

struct SearchRequest {
  std::string query;
  std::string inside;  // only at and below this full path, unless it is empty
  std::size_t offset = 0;
  std::size_t limit = 10;
  SortOrder sort = SortOrder::kDefault;
  std::size_t snippet_length = 200;  // in bytes, 0 for none
};

constexpr std::int64_t kMaxSearchLimit = 1000;
constexpr std::int64_t kMaxSearchOffset = 100000;
constexpr std::int64_t kMaxSnippetLength = 4096;

// Reads the "data" of a search request, but for "ids". Throws Error kMalformedRequest.
SearchRequest ParseSearchRequest(const Json::Value& data);

// One index that takes part in a search. What it refers to must outlive the search.
struct SearchedIndex {
  std::string id;
  std::shared_ptr<const Schema> schema;
  IndexReader* reader = nullptr;  // between Begin() and End()
};

// Runs a search over indexes that stand still. Word weights are those of all indexes together, so
// that scores can be compared. Returns {"total", "hits"} as the protocol says, and "suggestion"
// when few are found and another spelling of the query finds more. Throws Error kQuerySyntax,
// kSearchTooLong, or as Database does.
Json::Value Search(const SearchRequest& request, const std::vector<SearchedIndex>& indexes);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SEARCH_H_
