// How what is known of a document, beside its full text, is split between its row of docs and its
// text in attributes.
//
// In the text stand: how many cells follow; for each the number of its field, a byte for its type,
// and the value, numbers as their eight bytes, the lowest first; then the fields that are not
// listed.

#ifndef QUARRY_DAEMONS_TARNELASTICD_ATTRIBUTES_H_
#define QUARRY_DAEMONS_TARNELASTICD_ATTRIBUTES_H_

#include <cstdint>
#include <string>
#include <string_view>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/document.h"
#include "daemons/tarnelasticd/schema.h"

namespace quarry::engine {

// docs' columns in the order that the functions below use: "id,path,odd_parent,...".
std::string DocsColumns(const Schema& schema);

// Statements with these columns as parameters.
std::string InsertDocsSql(const Schema& schema);
std::string UpdateDocsSql(const Schema& schema);
// Binds those of such a statement. `row` must outlive its use.
void BindDocs(const Schema& schema, std::int64_t id, const DocumentRow& row, Statement* statement);

// The document's text in attributes.
std::string PackAttributes(const Schema& schema, const DocumentRow& row);

// From the current row of a statement that selects DocsColumns(), and that text. Throws Error
// kDamagedIndex when it is broken.
DocumentRow UnpackRow(const Schema& schema, const Statement& row, std::string_view attributes);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_ATTRIBUTES_H_
