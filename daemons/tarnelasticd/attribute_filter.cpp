#include "daemons/tarnelasticd/attribute_filter.h"

#include <algorithm>

#include "daemons/tarnelasticd/field_names.h"
#include "daemons/tarnelasticd/selection.h"
#include "fileindex/util/file_type.h"

namespace quarry::engine {
namespace {

// Looking a document up takes many times as long as passing it in the order of an index, and
// filters mostly let many pass.
constexpr std::size_t kFewOf = 100;

int TypeOf(const std::string& name) {
  if (name == "document") return fileindex::kDocument;
  if (name == "audio") return fileindex::kAudio;
  if (name == "video") return fileindex::kVideo;
  return fileindex::kImage;
}

// Whether files of that name are of one of the types.
bool IsAmong(const std::string& file_name, const std::vector<std::string>& types) {
  const int type = fileindex::GetFileTypeByFullPath("/" + file_name);
  return std::any_of(types.begin(), types.end(),
                     [type](const std::string& name) { return TypeOf(name) == type; });
}

constexpr const char* kNoExtension = "x";

bool IsInside(std::string_view path, std::string_view folder) {
  if (path == folder) return true;
  if (folder == "/") return !path.empty() && path.front() == '/';
  return path.size() > folder.size() && path[folder.size()] == '/' &&
         path.substr(0, folder.size()) == folder;
}

std::string ColumnOr(const std::string& column, const char* fallback) {
  return column.empty() ? fallback : column;
}

}  // namespace

bool IsAttributeFilter(const QueryTerm& term) {
  return term.kind == QueryTerm::Kind::kInside || term.kind == QueryTerm::Kind::kExtension ||
         term.kind == QueryTerm::Kind::kType;
}

AttributeFilter::AttributeFilter(const Schema& schema, IndexReader* reader)
    : reader_(reader),
      db_(&reader->db()),
      extension_(schema.ColumnOf(kFieldExtension)),
      is_dir_(schema.ColumnOf(kFieldIsDir)) {}

DocSet AttributeFilter::Find(const QueryTerm& term) {
  if (term.kind == QueryTerm::Kind::kInside) return Inside(term.text);
  if (extension_.empty()) return {};
  return term.kind == QueryTerm::Kind::kType ? ByType(term.values) : ByExtension(term.values);
}

void AttributeFilter::Apply(const QueryTerm& term, DocSet* documents) {
  if (IsFew(*documents)) {
    LookAtEach(term, documents);
  } else if (term.negated) {
    documents->Subtract(Find(term));
  } else {
    documents->Intersect(Find(term));
  }
}

DocSet AttributeFilter::All() {
  Statement rows = db_->Prepare("SELECT count(quarry_add(id)) FROM docs");
  return Gather(&rows);
}

bool AttributeFilter::IsFew(const DocSet& documents) {
  Statement count = db_->Prepare("SELECT value FROM meta WHERE key='documents'");
  const std::int64_t all = count.Step() ? std::max<std::int64_t>(count.Int(0), 0) : 0;
  return documents.Count() <= static_cast<std::size_t>(all) / kFewOf;
}

// Folders have neither a type nor, for a filter, an extension.
bool AttributeFilter::Answers(const QueryTerm& term, const Attributes& attributes) {
  if (term.kind == QueryTerm::Kind::kInside) return IsInside(attributes.path, term.text);
  if (attributes.is_dir) return false;
  const std::string extension(attributes.extension);
  if (term.kind == QueryTerm::Kind::kType) {
    return IsAmong(attributes.has_extension ? "x." + extension : kNoExtension, term.values);
  }
  return attributes.has_extension &&
         std::find(term.values.begin(), term.values.end(), extension) != term.values.end();
}

void AttributeFilter::LookAtEach(const QueryTerm& term, DocSet* documents) {
  if (term.kind != QueryTerm::Kind::kInside && extension_.empty()) {
    if (!term.negated) *documents = {};
    return;
  }
  Statement row = db_->Prepare("SELECT path," + ColumnOr(extension_, "NULL") + "," +
                               ColumnOr(is_dir_, "0") + " IS 1 FROM docs WHERE id=?1");
  DocSet kept;
  documents->ForEach([&](std::int64_t id) {
    row.Bind(1, id);
    if (row.Step()) {
      const Attributes attributes{row.Text(0), row.Text(1), !row.IsNull(1), row.Int(2) != 0};
      if (Answers(term, attributes) != term.negated) kept.Add(id);
    }
    row.Reset();
  });
  *documents = std::move(kept);
}

// `rows` calls quarry_add: leaving a statement for each row costs as much as finding it.
DocSet AttributeFilter::Gather(Statement* rows) {
  DocSet found;
  CountContext context{{}, &found, nullptr};
  const IndexReader::Counting counting(reader_, &context);
  rows->Run();
  return found;
}

DocSet AttributeFilter::ByExtension(const std::vector<std::string>& extensions) {
  DocSet found;
  for (const std::string& extension : extensions) {
    Statement rows = db_->Prepare("SELECT count(quarry_add(id)) FROM docs WHERE " + extension_ +
                                  "=?1" + FilesOnly());
    rows.Bind(1, std::string_view(extension));
    found.Unite(Gather(&rows));
  }
  return found;
}

// All extensions that are there are asked for their types.
DocSet AttributeFilter::ByType(const std::vector<std::string>& types) {
  std::vector<std::string> extensions;
  Statement next =
      db_->Prepare("SELECT min(" + extension_ + ") FROM docs WHERE " + extension_ + ">=?1");
  std::string at;
  for (;;) {
    next.Bind(1, std::string_view(at));
    if (!next.Step() || next.IsNull(0)) break;
    const std::string extension(next.Text(0));
    next.Reset();
    if (IsAmong("x." + extension, types)) extensions.push_back(extension);
    at = extension + '\0';
  }
  DocSet found = ByExtension(extensions);
  if (IsAmong(kNoExtension, types)) found.Unite(WithoutExtension());
  return found;
}

DocSet AttributeFilter::WithoutExtension() {
  Statement rows = db_->Prepare("SELECT count(quarry_add(id)) FROM docs WHERE " + extension_ +
                                " IS NULL" + FilesOnly());
  return Gather(&rows);
}

DocSet AttributeFilter::Inside(const std::string& path) {
  const std::string begin = path == "/" ? path : path + '/';
  const std::string end = PrefixEnd(begin);
  Statement at = db_->Prepare("SELECT count(quarry_add(id)) FROM docs WHERE path=?1");
  at.Bind(1, std::string_view(path));
  DocSet found = Gather(&at);
  Statement below =
      db_->Prepare("SELECT count(quarry_add(id)) FROM docs WHERE path>=?1 AND path<?2");
  below.Bind(1, std::string_view(begin)).Bind(2, std::string_view(end));
  found.Unite(Gather(&below));
  return found;
}

std::string AttributeFilter::FilesOnly() const {
  return is_dir_.empty() ? "" : " AND " + is_dir_ + " IS NOT 1";
}

}  // namespace quarry::engine
