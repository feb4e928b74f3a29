#include "daemons/tarnelasticd/fts_buffer.h"

#include <algorithm>
#include <optional>
#include <utility>

#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/fts_number.h"
#include "daemons/tarnelasticd/segment_merger.h"
#include "daemons/tarnelasticd/text_lengths.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kEntryBytes = 160;

// Texts that wait to be cut into words take no more memory than that.
constexpr std::size_t kCuttingBytes = std::size_t{16} << 20;

constexpr const char* kBody = "body";
constexpr char kMainIndex = '0';
// Leaves that are merged at least, so that small segments do not come to be many.
constexpr std::int64_t kLeastMerge = 16;

std::size_t SizeOf(const std::string& text) {
  return text.size();
}
std::size_t SizeOf(const std::optional<Labels>& labels) {
  return labels ? labels->name.size() + labels->extra.size() : 0;
}

std::string DirectoryOf(Database* db) {
  const std::string path = sqlite3_db_filename(db->handle(), "main");
  return path.substr(0, path.rfind('/') + 1);
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

FtsBuffer::FtsBuffer(const Schema& schema, Database* db, const TextTokenizer& tokenizer,
                     SideWork* work)
    : schema_(schema),
      db_(db),
      tokenizer_(tokenizer),
      body_(
          MakeTable("body", Schema::ColumnList("t", schema.text_columns()), schema.text_columns())),
      label_(MakeTable("labels", "name,extra", 2)),
      name_(MakeTable("names", "name", 1)),
      has_own_segments_(ReadStructure(db, kBody).has_value()),
      work_(work),
      cutters_(std::make_shared<WordCutters>()),
      runs_(DirectoryOf(db)),
      listed_words_(schema.text_columns()) {}

FtsBuffer::~FtsBuffer() {
  ClearLists();
}

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

void FtsBuffer::InsertBody(std::int64_t text, const std::shared_ptr<const std::string>& body) {
  if (!has_own_segments_ || body->empty() || text <= last_listed_) {
    RunBody(body_.insert, text, *body);
    return;
  }
  last_listed_ = text;
  LeaveToCut(text, body);
  TakeCut(/*all=*/cutting_bytes_ >= kCuttingBytes);
}

// The task has all that it uses to itself: the buffer may go on, or end, before it is done.
void FtsBuffer::LeaveToCut(std::int64_t id, const std::shared_ptr<const std::string>& body) {
  const auto text = std::make_shared<NewText>();
  text->body = body;
  text->columns = UnpackTexts(schema_, *body);
  cutting_bytes_ += body->size();
  cutting_.push_back({id, text, work_->Add(body->size(), [text, cutters = cutters_] {
                        text->words = cutters->Cut(text->columns);
                      })});
}

// Takes texts that have been cut into the lists, in order, and all that are left if `all`. What the
// lists do not take is for FTS5.
void FtsBuffer::TakeCut(bool all) {
  while (!cutting_.empty() && (all || work_->IsDone(*cutting_.front().task))) {
    const Cutting next = std::move(cutting_.front());
    cutting_.pop_front();
    cutting_bytes_ -= next.text->body->size();
    work_->Finish(next.task);
    if (next.text->words.sizes.empty()) {
      RunBody(body_.insert, next.id, *next.text->body);
    } else {
      AddToLists(next.id, next.text->words);
    }
  }
}

void FtsBuffer::AddToLists(std::int64_t id, const CutText& words) {
  lists_.Add(id, words);
  ++listed_;
  std::string sizes;
  for (std::size_t i = 0; i < words.sizes.size(); ++i) {
    listed_words_[i] += words.sizes[i];
    AppendVarint(&sizes, words.sizes[i]);
  }
  db_->Prepare("INSERT INTO body_docsize(id,sz) VALUES(?1,?2)")
      .Bind(1, id)
      .BindBlob(2, sizes)
      .Run();
}

// Before anything else is done to these rows: a segment holds against those written before.
void FtsBuffer::FlushLists() {
  TakeCut(/*all=*/true);
  if (listed_ == 0) return;
  WriteOutFts(db_, kBody);
  AddToTotals(db_, kBody, listed_, listed_words_);
  std::optional<FtsStructure> structure = ReadStructure(db_, kBody);
  if (!structure) throw Error(kDamagedIndex, "The full text is not as it should be");
  if (!runs_.empty()) runs_.Add(lists_);
  const bool has_words = !runs_.empty() || !lists_.empty();
  const std::int64_t leaves = has_words ? WriteSegment(&*structure) : 0;
  ClearLists();
  if (leaves > 0) MergeFullLevels(db_, kBody, &*structure);
  ForgetFts(db_);
  if (leaves > 0) MergeSegments(*structure, leaves);
}

// What is too large to be merged at once is left to FTS5, which merges of itself when it writes. It
// is asked for as much work as it would do then, so that no commit waits for all of it.
void FtsBuffer::MergeSegments(const FtsStructure& structure, std::int64_t written) {
  const bool is_due = std::any_of(
      structure.levels.begin(), structure.levels.end(), [](const FtsStructure::Level& level) {
        return level.merging > 0 || level.segments.size() >= kManySegments;
      });
  if (!is_due) return;
  const auto levels = static_cast<std::int64_t>(structure.levels.size());
  db_->Prepare("INSERT INTO body(body,rank) VALUES('merge',?1)")
      .Bind(1, written * levels + kLeastMerge)
      .Run();
}

// What FTS5 has written counts too: of itself it would merge all of a level in one go, however
// large, when many small changes have come to it.
void FtsBuffer::MergeAfterChanges() {
  WriteOutFts(db_, kBody);
  std::optional<FtsStructure> structure = ReadStructure(db_, kBody);
  if (!structure) return;
  MergeFullLevels(db_, kBody, &*structure);
  ForgetFts(db_);
  MergeSegments(*structure, /*written=*/0);
}

void FtsBuffer::SaveLists() {
  TakeCut(/*all=*/true);
  if (runs_.IsFull()) {
    FlushLists();
    return;
  }
  runs_.Add(lists_);
  lists_.Clear();
}

void FtsBuffer::WriteWords(SegmentWriter* writer) {
  std::string key;
  const auto begin = [&](std::string_view word) {
    key = kMainIndex;
    key += word;
    writer->BeginWord(key);
  };
  if (runs_.empty()) {
    lists_.ForEach([&](std::string_view word, std::string_view list) {
      begin(word);
      writer->AddList(list);
    });
    return;
  }
  runs_.ForEach([&](std::string_view word, const std::vector<std::string_view>& lists) {
    begin(word);
    for (const std::string_view list : lists) writer->AddList(list);
  });
}

// Returns how many leaves it has.
std::int64_t FtsBuffer::WriteSegment(FtsStructure* structure) {
  Segment segment;
  segment.id = structure->FreeSegment();
  if (segment.id == 0) throw Error(kDamagedIndex, "The full text has too many parts");
  segment.first_leaf = 1;
  SegmentWriter writer(db_, kBody, segment.id);
  WriteWords(&writer);
  segment.last_leaf = writer.Finish();
  if (structure->levels.empty()) structure->levels.emplace_back();
  structure->levels.front().segments.push_back(segment);
  structure->leaves_written += segment.last_leaf;
  WriteStructure(db_, kBody, *structure);
  return segment.last_leaf;
}

void FtsBuffer::ClearLists() {
  for (const Cutting& cutting : cutting_) work_->Drop(cutting.task);
  cutting_.clear();
  cutting_bytes_ = 0;
  runs_.Clear();
  lists_.Clear();
  last_listed_ = 0;
  listed_ = 0;
  std::fill(listed_words_.begin(), listed_words_.end(), 0);
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
  FlushLists();
  for (const auto& [id, change] : bodies_) {
    RunBody(body_.remove, id, change.old);
    RunBody(body_.insert, id, change.now);
  }
  if (!bodies_.empty() && has_own_segments_) MergeAfterChanges();
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
  ClearLists();
  noted_.clear();
  bodies_.clear();
  labels_.clear();
  bytes_ = 0;
}

}  // namespace quarry::engine
