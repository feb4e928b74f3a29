#include "daemons/tarnelasticd/fts_buffer.h"

#include <algorithm>
#include <utility>

#include "daemons/tarnelasticd/text_lengths.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kEntryBytes = 160;

std::size_t SizeOf(const std::string& text) {
  return text.size();
}
std::size_t SizeOf(const std::optional<Labels>& labels) {
  return labels ? labels->name.size() + labels->extra.size() : 0;
}

template <typename Map, typename State>
std::size_t Merge(Map* changes, std::int64_t id, State old, State now) {
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

}  // namespace

std::string MarkedName(const TextTokenizer& tokenizer, std::string_view name) {
  return kNameBegin + tokenizer.Fold(name) + kNameEnd;
}

// "INSERT INTO table(table,rowid,columns) VALUES('delete',?,...)" removes from a table without
// content what the same values have put there.
FtsBuffer::Table FtsBuffer::MakeTable(const std::string& name, const std::string& columns,
                                      std::size_t count) {
  std::string values = "?1";
  for (std::size_t i = 0; i < count; ++i) values += ",?" + std::to_string(i + 2);
  return {"INSERT INTO " + name + "(" + name + ",rowid," + columns + ") VALUES('delete'," + values +
              ")",
          "INSERT INTO " + name + "(rowid," + columns + ") VALUES(" + values + ")"};
}

FtsBuffer::FtsBuffer(const Schema& schema, Database* db, const TextTokenizer& tokenizer)
    : schema_(schema),
      db_(db),
      tokenizer_(tokenizer),
      body_(
          MakeTable("body", Schema::ColumnList("t", schema.text_columns()), schema.text_columns())),
      label_(MakeTable("labels", "name,extra", 2)),
      name_(MakeTable("names", "name", 1)) {}

void FtsBuffer::Run(const std::string& sql, std::int64_t id,
                    const std::vector<std::string_view>& texts) {
  Statement statement = db_->Prepare(sql);
  statement.Bind(1, id);
  int index = 2;
  for (const std::string_view text : texts) statement.Bind(index++, text);
  statement.Run();
}

void FtsBuffer::RunBody(const std::string& sql, std::int64_t id, std::string_view body) {
  if (body.empty()) return;
  Run(sql, id, UnpackTexts(schema_, body));
}

void FtsBuffer::InsertLabels(std::int64_t doc, const Labels& labels) {
  Run(label_.insert, doc, {labels.name, labels.extra});
  Run(name_.insert, doc, {MarkedName(tokenizer_, labels.name)});
}

void FtsBuffer::InsertBody(std::int64_t text, std::string_view body) {
  RunBody(body_.insert, text, body);
}

void FtsBuffer::ChangeBody(std::int64_t text, std::string old, std::string now) {
  bytes_ += Merge(&bodies_, text, std::move(old), std::move(now));
}

void FtsBuffer::NoteText(std::int64_t doc) {
  noted_.push_back(doc);
  bytes_ += sizeof doc;
}

void FtsBuffer::ChangeLabels(std::int64_t id, std::optional<Labels> old,
                             std::optional<Labels> now) {
  bytes_ += Merge(&labels_, id, std::move(old), std::move(now));
}

void FtsBuffer::FlushLabels(std::int64_t id, const Change<std::optional<Labels>>& change) {
  const auto& [old, now] = change;
  if (old) Run(label_.remove, id, {old->name, old->extra});
  if (now) Run(label_.insert, id, {now->name, now->extra});
  if (old && now && old->name == now->name) return;
  if (old) Run(name_.remove, id, {MarkedName(tokenizer_, old->name)});
  if (now) Run(name_.insert, id, {MarkedName(tokenizer_, now->name)});
}

void FtsBuffer::Flush() {
  for (const auto& [id, change] : bodies_) {
    RunBody(body_.remove, id, change.old);
    RunBody(body_.insert, id, change.now);
  }
  for (const auto& [id, change] : labels_) FlushLabels(id, change);
  FlushLengths();
  Clear();
}

void FtsBuffer::FlushLengths() {
  std::sort(noted_.begin(), noted_.end());
  noted_.erase(std::unique(noted_.begin(), noted_.end()), noted_.end());
  UpdateTextLengths(db_, noted_);
}

void FtsBuffer::Clear() {
  noted_.clear();
  bodies_.clear();
  labels_.clear();
  bytes_ = 0;
}

}  // namespace quarry::engine
