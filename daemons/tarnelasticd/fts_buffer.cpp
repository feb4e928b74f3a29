#include "daemons/tarnelasticd/fts_buffer.h"

#include <utility>
#include <vector>

#include "daemons/tarnelasticd/compression.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kEntryBytes = 160;

std::size_t SizeOf(const std::optional<std::string>& text) {
  return text ? text->size() : 0;
}
std::size_t SizeOf(const std::optional<Labels>& labels) {
  return labels ? labels->name.size() + labels->extra.size() : 0;
}

template <typename Map, typename Old, typename Now>
std::size_t Merge(Map* changes, std::int64_t id, Old old, Now now) {
  const auto [entry, is_new] = changes->try_emplace(id);
  auto& change = entry->second;
  std::size_t added = SizeOf(now);
  if (is_new) {
    added += kEntryBytes + SizeOf(old);
    change.old = std::move(old);
  }
  change.now = std::move(now);
  return added;
}

// "INSERT INTO table(table,rowid,columns) VALUES('delete',?,...)" removes from a table without
// content what the same values have put there.
std::string DeleteSql(const std::string& table, const std::string& columns, std::size_t count) {
  std::string sql =
      "INSERT INTO " + table + "(" + table + ",rowid," + columns + ") VALUES('delete',?1";
  for (std::size_t i = 0; i < count; ++i) sql += ",?" + std::to_string(i + 2);
  return sql + ")";
}

std::string InsertSql(const std::string& table, const std::string& columns, std::size_t count) {
  std::string sql = "INSERT INTO " + table + "(rowid," + columns + ") VALUES(?1";
  for (std::size_t i = 0; i < count; ++i) sql += ",?" + std::to_string(i + 2);
  return sql + ")";
}

void RunWithTexts(Statement* statement, std::int64_t id,
                  const std::vector<std::string_view>& texts) {
  statement->Bind(1, id);
  int index = 2;
  for (const std::string_view text : texts) statement->Bind(index++, text);
  statement->Run();
}

// The pair of statements that change rows of one table.
class Table {
 public:
  Table(Database* db, const std::string& name, const std::string& columns, std::size_t count)
      : remove_(db->Prepare(DeleteSql(name, columns, count))),
        insert_(db->Prepare(InsertSql(name, columns, count))) {}
  void Remove(std::int64_t id, const std::vector<std::string_view>& texts) {
    RunWithTexts(&remove_, id, texts);
  }
  void Insert(std::int64_t id, const std::vector<std::string_view>& texts) {
    RunWithTexts(&insert_, id, texts);
  }

 private:
  Statement remove_;
  Statement insert_;
};

}  // namespace

std::string MarkedName(const TextTokenizer& tokenizer, std::string_view name) {
  return kNameBegin + tokenizer.Fold(name) + kNameEnd;
}

void FtsBuffer::ChangeBody(std::int64_t id, std::optional<std::string> old,
                           std::optional<std::string> now) {
  bytes_ += Merge(&bodies_, id, std::move(old), std::move(now));
}

void FtsBuffer::ChangeLabels(std::int64_t id, std::optional<Labels> old,
                             std::optional<Labels> now) {
  bytes_ += Merge(&labels_, id, std::move(old), std::move(now));
}

void FtsBuffer::Flush(const Schema& schema, Database* db, const TextTokenizer& tokenizer) {
  if (!bodies_.empty()) {
    const std::size_t count = schema.text_columns();
    Table body(db, "body", Schema::ColumnList("t", count), count);
    for (const auto& [id, change] : bodies_) {
      if (change.old) body.Remove(id, UnpackTexts(schema, Decompress(*change.old)));
      if (change.now) body.Insert(id, UnpackTexts(schema, *change.now));
    }
  }
  Table labels(db, "labels", "name,extra", 2);
  Table names(db, "names", "name", 1);
  for (const auto& [id, change] : labels_) {
    if (change.old) labels.Remove(id, {change.old->name, change.old->extra});
    if (change.now) labels.Insert(id, {change.now->name, change.now->extra});
    if (change.old && change.now && change.old->name == change.now->name) continue;
    if (change.old) names.Remove(id, {MarkedName(tokenizer, change.old->name)});
    if (change.now) names.Insert(id, {MarkedName(tokenizer, change.now->name)});
  }
  Clear();
}

void FtsBuffer::Clear() {
  bodies_.clear();
  labels_.clear();
  bytes_ = 0;
}

}  // namespace quarry::engine
