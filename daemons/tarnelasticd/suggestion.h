// What somebody may have meant to type, out of the words of the indexes.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SUGGESTION_H_
#define QUARRY_DAEMONS_TARNELASTICD_SUGGESTION_H_

#include <json/json.h>

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/query.h"
#include "daemons/tarnelasticd/search.h"

namespace quarry::engine {

// With fewer documents a word is rare, and a search has found little.
constexpr std::size_t kFewDocuments = 5;

// `text`, which was parsed and resolved to `query`, with each unknown or rare word replaced by the
// nearest word that far more documents have; all else is kept byte by byte. Nothing when no word
// can be replaced. Words behind a minus or before a star, and filters, stay as they are. Throws
// Error kSearchTooLong, or as Database does.
std::optional<std::string> CorrectQuery(const std::string& text, const Query& query,
                                        const std::vector<SearchedIndex>& indexes);

struct CompletionRequest {
  std::string prefix;
  std::size_t size = 10;
};

constexpr std::int64_t kMaxCompletions = 100;

// Reads the "data" of a completion request, but for "ids". Throws Error kMalformedRequest.
CompletionRequest ParseCompletionRequest(const Json::Value& data);

// Returns {"words"} as the protocol says. Throws Error as CorrectQuery().
Json::Value CompleteWord(const CompletionRequest& request,
                         const std::vector<SearchedIndex>& indexes);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SUGGESTION_H_
