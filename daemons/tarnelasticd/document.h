// A document between the JSON that peers send and the rows that the index keeps.

#ifndef QUARRY_DAEMONS_TARNELASTICD_DOCUMENT_H_
#define QUARRY_DAEMONS_TARNELASTICD_DOCUMENT_H_

#include <json/json.h>

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/schema.h"

namespace quarry::engine {

// A value of one of docs' own columns.
using Cell = std::variant<std::monostate, std::int64_t, double, std::string>;

// What the file name and the fields that are not listed are found by.
struct Labels {
  std::string name;
  std::string extra;
  bool operator==(const Labels& other) const = default;
};

// What an index keeps of a document beside its full text.
struct DocumentRow {
  std::string path;
  std::vector<Cell> cells;  // one per field that is neither the path nor full text
  std::string extra;        // a JSON object, or empty
};

struct StoredDocument {
  DocumentRow row;
  Labels labels;
  std::string body;  // the packed full text; empty when there is none
};

// `document`, an object, as rows under `path`. A value that does not fit the column of its field is
// kept among the fields that are not listed, so nothing is lost; null is as if absent. Whatever the
// document says of its path, `path` counts. Throws Error kMalformedRequest when it is no object.
StoredDocument MakeDocument(const Schema& schema, std::string_view path,
                            const Json::Value& document);

// The fields of a document. With `only`, which may be null, no others. Full text is not among them.
// Throws Error kDamagedIndex when the row is broken.
Json::Value ReadRow(const Schema& schema, const DocumentRow& row,
                    const std::set<std::string>* only);

// What the row's document is found by beside its full text.
Labels ReadLabels(const Schema& schema, const DocumentRow& row);

// Adds the fields of a packed full text to `document` that it does not have already.
void AddTexts(const Schema& schema, std::string_view packed, const std::set<std::string>* only,
              Json::Value* document);

// The texts in a packed full text, one per column of the schema; the others are empty. The views
// are valid as long as `packed`. Throws Error kDamagedIndex when it is broken.
std::vector<std::string_view> UnpackTexts(const Schema& schema, std::string_view packed);

// Whether setting these fields changes full text.
bool TouchesText(const Schema& schema, const Json::Value& changes);

// The bytes of a JSON string, without copying them.
std::string_view ViewOf(const Json::Value& text);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_DOCUMENT_H_
