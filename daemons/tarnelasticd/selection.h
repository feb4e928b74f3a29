// Which documents a document_*_by_query command means.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SELECTION_H_
#define QUARRY_DAEMONS_TARNELASTICD_SELECTION_H_

#include <json/json.h>

#include <cstdint>
#include <optional>
#include <set>
#include <string>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/schema.h"

namespace quarry::engine {

struct Selection {
  enum class Kind { kPathPrefix, kPathTerm, kParentTerm };
  Kind kind = Kind::kPathTerm;
  std::string value;
  std::string end;  // for a prefix: PrefixEnd(value)
  // The fields to give; without a value all but full text.
  std::optional<std::set<std::string>> load_fields;
  // At most so many documents, in order of paths, and only those behind the path `after`.
  std::optional<std::int64_t> limit;
  std::optional<std::string> after;
};

// Reads the "query" of a request. Throws Error kMalformedRequest, saying what is wrong.
Selection ParseSelection(const Schema& schema, const Json::Value& query);

// A statement over the selected rows of docs, in order of their paths, that gives `columns`, at
// most `limit` rows of them. `selection` must outlive it.
Statement SelectRows(const Schema& schema, const Selection& selection, const std::string& columns,
                     std::int64_t limit, Database* db);

// The smallest byte string that is greater than all those that begin with `prefix`; empty when
// there is none.
std::string PrefixEnd(std::string prefix);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SELECTION_H_
