// Which documents a document_*_by_query command means.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SELECTION_H_
#define QUARRY_DAEMONS_TARNELASTICD_SELECTION_H_

#include <json/json.h>

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <string_view>

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

// Whether a document at `path` is found as one of the folder's by its path alone: it is the
// folder's path and one part more. Of others "odd_parent" tells the parent, where a document says
// that it has one, or is kNoParent.
bool IsChild(std::string_view folder, std::string_view path);
constexpr std::int64_t kNoParent = 0;

// The selected rows of docs with their DocsColumns(), in order of their paths, at most `limit`.
// `selection` and `db` must outlive it, and the rows must stay as they are meanwhile. Throws Error
// as Database does.
class SelectedRows {
 public:
  SelectedRows(const Schema& schema, const Selection& selection, std::int64_t limit, Database* db);

  // Moves to the next row; false when there is none.
  bool Step();
  const Statement& row() const { return *current_; }

 private:
  bool StepRange();
  bool StepChild();
  bool StepBelow();
  void SkipTo(std::string path);

  const Selection& selection_;
  std::int64_t left_;
  Statement rows_;                // those whose paths lie between from_ and end_
  std::optional<Statement> odd_;  // beside them, for a folder: those of which only odd_parent tells
  std::string folder_;            // with a "/" at its end
  std::string from_;
  std::string end_;
  std::string after_;
  bool has_row_ = false;  // of a folder: whether the statements stand at rows that come next
  bool has_odd_ = false;
  Statement* current_ = nullptr;
};

// The smallest byte string that is greater than all those that begin with `prefix`; empty when
// there is none.
std::string PrefixEnd(std::string prefix);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SELECTION_H_
