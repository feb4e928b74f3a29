#include "daemons/tarnelasticd/selection.h"

#include <algorithm>
#include <limits>
#include <utility>

#include "daemons/tarnelasticd/attributes.h"
#include "daemons/tarnelasticd/field_names.h"
#include "daemons/tarnelasticd/request.h"

namespace quarry::engine {
namespace {

void ParsePrefix(const Schema& schema, const Json::Value& prefix, Selection* selection) {
  if (!prefix.isObject() || prefix.size() != 1 || !prefix.isMember(schema.path_field())) {
    FailMalformed("A prefix must be of " + schema.path_field());
  }
  selection->kind = Selection::Kind::kPathPrefix;
  selection->value = NameProperty(prefix, schema.path_field().c_str());
  selection->end = PrefixEnd(selection->value);
}

bool HasParents(const Schema& schema) {
  const Field* parent = schema.Find(kFieldParent);
  return parent != nullptr && parent->storage == Storage::kString;
}

void ParseTerm(const Schema& schema, const Json::Value& term, Selection* selection) {
  if (!term.isObject() || term.size() != 1) FailMalformed("A term must have one field");
  const std::string field = term.begin().name();
  if (field == schema.path_field()) {
    selection->kind = Selection::Kind::kPathTerm;
  } else if (field == kFieldParent && HasParents(schema)) {
    selection->kind = Selection::Kind::kParentTerm;
  } else {
    FailMalformed("There is no query by this field: " + field);
  }
  selection->value = StringProperty(term, field.c_str());
}

std::string RangeSql(const Schema& schema) {
  return "SELECT " + DocsColumns(schema) + " FROM docs WHERE path>=?1 ORDER BY path";
}

std::string OddSql(const Schema& schema) {
  return "SELECT " + DocsColumns(schema) +
         " FROM docs WHERE odd_parent=?1 AND path>=?2 ORDER BY path";
}

// What comes next behind a text.
std::string Behind(std::string text) {
  text.push_back('\0');
  return text;
}

std::string FolderPrefix(std::string_view folder) {
  return folder == "/" ? "/" : std::string(folder) + '/';
}

std::string FirstPath(const Selection& selection, const std::string& folder) {
  const bool is_folder = selection.kind == Selection::Kind::kParentTerm;
  const std::string& first = is_folder ? folder : selection.value;
  return selection.after ? std::max(first, Behind(*selection.after)) : first;
}

std::string EndPath(const Selection& selection, const std::string& folder) {
  switch (selection.kind) {
    case Selection::Kind::kPathPrefix:
      return selection.end;
    case Selection::Kind::kPathTerm:
      return Behind(selection.value);
    default:
      return PrefixEnd(folder);
  }
}

std::string_view PathOf(const Statement& row) {
  return row.Text(1);
}

}  // namespace

std::string PrefixEnd(std::string prefix) {
  while (!prefix.empty() && static_cast<unsigned char>(prefix.back()) == 0xff) prefix.pop_back();
  if (!prefix.empty()) prefix.back() = static_cast<char>(prefix.back() + 1);
  return prefix;
}

Selection ParseSelection(const Schema& schema, const Json::Value& query) {
  Selection selection;
  const Json::Value& qsl = ObjectProperty(query, "qsl");
  if (qsl.size() != 1) FailMalformed("qsl must have one member");
  if (qsl.isMember("prefix")) {
    ParsePrefix(schema, qsl["prefix"], &selection);
  } else if (qsl.isMember("term")) {
    ParseTerm(schema, qsl["term"], &selection);
  } else {
    FailMalformed("There is no query of this kind: " + qsl.begin().name());
  }
  if (query.isMember("load_field")) selection.load_fields = NamesProperty(query, "load_field");
  selection.limit = OptionalNumber(query, "limit", 0, std::numeric_limits<std::int64_t>::max());
  if (query.isMember("after")) selection.after = StringProperty(query, "after");
  return selection;
}

bool IsChild(std::string_view folder, std::string_view path) {
  if (folder.empty()) return false;
  const std::string begin = FolderPrefix(folder);
  return path.substr(0, begin.size()) == begin &&
         path.find('/', begin.size()) == std::string_view::npos;
}

SelectedRows::SelectedRows(const Schema& schema, const Selection& selection, std::int64_t limit,
                           Database* db)
    : selection_(selection),
      left_(limit),
      rows_(db->Prepare(RangeSql(schema))),
      folder_(FolderPrefix(selection.value)),
      from_(FirstPath(selection, folder_)),
      end_(EndPath(selection, folder_)) {
  rows_.Bind(1, std::string_view(from_));
  if (selection.kind != Selection::Kind::kParentTerm) return;
  odd_.emplace(db->Prepare(OddSql(schema)));
  if (selection.after) after_ = Behind(*selection.after);
  odd_->Bind(1, std::string_view(selection.value)).Bind(2, std::string_view(after_));
  has_row_ = !selection.value.empty() && StepBelow();
  has_odd_ = odd_->Step();
}

bool SelectedRows::Step() {
  if (left_ <= 0) return false;
  --left_;
  if (odd_) return StepChild();
  current_ = &rows_;
  return StepRange();
}

bool SelectedRows::StepRange() {
  return rows_.Step() && (end_.empty() || PathOf(rows_) < end_);
}

// The statement that gave the last row moves on first: what it gave was valid until now.
bool SelectedRows::StepChild() {
  if (current_ == &rows_) has_row_ = StepBelow();
  if (current_ == &*odd_) has_odd_ = odd_->Step();
  if (!has_row_ && !has_odd_) return false;
  const bool is_odd = !has_row_ || (has_odd_ && PathOf(*odd_) < PathOf(rows_));
  current_ = is_odd ? &*odd_ : &rows_;
  return true;
}

// Moves to the next child. What is below a child is skipped at once: it may be the whole share.
bool SelectedRows::StepBelow() {
  while (StepRange()) {
    const std::string_view path = PathOf(rows_);
    const std::size_t slash = path.find('/', folder_.size());
    if (slash == std::string_view::npos) {
      if (rows_.IsNull(2)) return true;
    } else {
      SkipTo(PrefixEnd(std::string(path.substr(0, slash + 1))));
    }
  }
  return false;
}

void SelectedRows::SkipTo(std::string path) {
  rows_.Reset();
  from_ = std::move(path);
  rows_.Bind(1, std::string_view(from_));
}

}  // namespace quarry::engine
