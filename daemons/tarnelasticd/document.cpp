#include "daemons/tarnelasticd/document.h"

#include <algorithm>
#include <deque>
#include <utility>

#include "common/file_util.h"
#include "common/json.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/field_names.h"
#include "daemons/tarnelasticd/varint.h"

namespace quarry::engine {
namespace {

// The strings in a value, one below the other. An explicit stack, since depth is the peer's choice.
std::string TextOf(const Json::Value& value) {
  std::string text;
  std::vector<const Json::Value*> pending{&value};
  while (!pending.empty()) {
    const Json::Value* current = pending.back();
    pending.pop_back();
    if (current->isString()) {
      if (!text.empty()) text += '\n';
      text += ViewOf(*current);
    } else if (current->isArray() || current->isObject()) {
      for (auto item = current->end(); item != current->begin();) pending.push_back(&*--item);
    }
  }
  return text;
}

bool FitsInt(const Json::Value& value) {
  return value.isInt64() && value.type() != Json::realValue;
}

// The column's value, or nothing when `value` cannot be given back from there as it came.
Cell MakeCell(Storage storage, const Json::Value& value) {
  switch (storage) {
    case Storage::kString:
      if (value.isString()) return value.asString();
      break;
    case Storage::kInt:
      if (FitsInt(value)) return static_cast<std::int64_t>(value.asInt64());
      break;
    case Storage::kDouble:
      if (value.type() == Json::realValue) return value.asDouble();
      if (FitsInt(value)) return static_cast<std::int64_t>(value.asInt64());
      break;
    case Storage::kBool:
      if (value.isBool()) return static_cast<std::int64_t>(value.asBool() ? 1 : 0);
      break;
    default:
      break;
  }
  return {};
}

[[noreturn]] void FailDamaged() {
  throw Error(kDamagedIndex, "A stored document is damaged");
}

// Full texts by columns. They are large: what is a string in the document is not copied.
struct Texts {
  std::vector<std::string_view> columns;
  std::deque<std::string> made;  // the others, which do not move
};

// Packed: for each text that is not empty its column, its length and its bytes.
std::string Pack(const std::vector<std::string_view>& texts) {
  constexpr std::size_t kMostNumbers = 20;
  std::size_t most = 0;
  for (const std::string_view text : texts) most += text.empty() ? 0 : text.size() + kMostNumbers;
  std::string packed;
  packed.reserve(most);
  for (std::size_t i = 0; i < texts.size(); ++i) {
    if (texts[i].empty()) continue;
    AppendNumber(&packed, i);
    AppendNumber(&packed, texts[i].size());
    packed += texts[i];
  }
  return packed;
}

bool IsSearched(const Schema& schema, const std::string& name) {
  return schema.search_unlisted() && name.rfind(kBookkeepingPrefix, 0) != 0;
}

std::string NameOf(const Schema& schema, const Json::Value& document, const std::string& path) {
  if (!schema.name_field().empty()) {
    const Json::Value& name = document[schema.name_field()];
    if (name.isString()) return name.asString();
  }
  return Basename(path);
}

// The texts of fields that are not listed. What only repeats the file name is left out: it is found
// by that already.
std::string ExtraLabel(const Schema& schema, const Json::Value& extra, const std::string& name) {
  std::string label;
  for (auto field = extra.begin(); field != extra.end(); ++field) {
    if (schema.Find(field.name()) != nullptr || !IsSearched(schema, field.name())) continue;
    const std::string text = TextOf(*field);
    if (text.empty() || text == name) continue;
    if (!label.empty()) label += '\n';
    label += text;
  }
  return label;
}

// Sorts one field into the document's parts.
void StoreField(const Field* field, const Json::Value& value, const std::string& name,
                StoredDocument* document, Texts* texts, Json::Value* extra) {
  if (field == nullptr) {
    (*extra)[name] = value;
    return;
  }
  if (field->storage == Storage::kPath) return;
  if (field->storage == Storage::kText) {
    if (value.isString()) {
      texts->columns[field->column] = ViewOf(value);
    } else {
      texts->columns[field->column] = texts->made.emplace_back(TextOf(value));
      (*extra)[name] = value;
    }
    return;
  }
  Cell cell = MakeCell(field->storage, value);
  if (std::holds_alternative<std::monostate>(cell)) (*extra)[name] = value;
  document->row.cells[field->column] = std::move(cell);
}

Json::Value JsonString(std::string_view text) {
  return Json::Value(text.data(), text.data() + text.size());
}

Json::Value ReadCell(const Field& field, const DocumentRow& row) {
  const Cell& cell = row.cells[field.column];
  if (const auto* number = std::get_if<std::int64_t>(&cell)) {
    if (field.storage == Storage::kBool) return *number != 0;
    return Json::Int64{*number};
  }
  if (const auto* real = std::get_if<double>(&cell)) return *real;
  if (const auto* text = std::get_if<std::string>(&cell)) return JsonString(*text);
  return {};
}

Json::Value ReadExtra(const DocumentRow& row) {
  Json::Value extra(Json::objectValue);
  if (row.extra.empty()) return extra;
  if (!fromString(extra, row.extra) || !extra.isObject()) FailDamaged();
  return extra;
}

bool HasAll(const Json::Value& document, const std::set<std::string>& names) {
  return std::all_of(names.begin(), names.end(),
                     [&](const std::string& name) { return document.isMember(name); });
}

}  // namespace

std::string_view ViewOf(const Json::Value& text) {
  const char* begin = nullptr;
  const char* end = nullptr;
  if (!text.getString(&begin, &end)) return {};
  return {begin, static_cast<std::size_t>(end - begin)};
}

StoredDocument MakeDocument(const Schema& schema, std::string_view path,
                            const Json::Value& document) {
  if (!document.isObject()) throw Error(kMalformedRequest, "A document must be an object");
  StoredDocument stored;
  stored.row.path = path;
  stored.row.cells.resize(schema.row_columns());
  Texts texts;
  texts.columns.resize(schema.text_columns());
  Json::Value extra(Json::objectValue);
  for (auto item = document.begin(); item != document.end(); ++item) {
    if (item->isNull()) continue;
    const std::string name = item.name();
    StoreField(schema.Find(name), *item, name, &stored, &texts, &extra);
  }
  stored.body = Pack(texts.columns);
  if (!extra.empty()) stored.row.extra = toString(extra);
  stored.labels.name = NameOf(schema, document, stored.row.path);
  stored.labels.extra = ExtraLabel(schema, extra, stored.labels.name);
  return stored;
}

Json::Value ReadRow(const Schema& schema, const DocumentRow& row,
                    const std::set<std::string>* only) {
  Json::Value document(Json::objectValue);
  const auto wanted = [only](const std::string& name) {
    return only == nullptr || only->count(name) > 0;
  };
  if (wanted(schema.path_field())) document[schema.path_field()] = JsonString(row.path);
  for (const auto& [name, field] : schema.fields()) {
    if (field.storage == Storage::kPath || field.storage == Storage::kText || !wanted(name)) {
      continue;
    }
    Json::Value value = ReadCell(field, row);
    if (!value.isNull()) document[name] = std::move(value);
  }
  // Parsing what is not listed costs more than all else, and is seldom asked for.
  if (only != nullptr && HasAll(document, *only)) return document;
  const Json::Value extra = ReadExtra(row);
  for (auto field = extra.begin(); field != extra.end(); ++field) {
    if (wanted(field.name())) document[field.name()] = *field;
  }
  return document;
}

Labels ReadLabels(const Schema& schema, const DocumentRow& row) {
  Labels labels;
  Json::Value document(Json::objectValue);
  if (const Field* field = schema.Find(schema.name_field()); field != nullptr) {
    document[field->name] = ReadCell(*field, row);
  }
  labels.name = NameOf(schema, document, row.path);
  labels.extra = ExtraLabel(schema, ReadExtra(row), labels.name);
  return labels;
}

std::vector<std::string_view> UnpackTexts(const Schema& schema, std::string_view packed) {
  std::vector<std::string_view> texts(schema.text_columns());
  while (!packed.empty()) {
    const std::uint64_t column = TakeNumber(&packed);
    if (column >= texts.size()) FailDamaged();
    texts[column] = TakeCounted(&packed);
  }
  return texts;
}

void AddTexts(const Schema& schema, std::string_view packed, const std::set<std::string>* only,
              Json::Value* document) {
  const std::vector<std::string_view> texts = UnpackTexts(schema, packed);
  for (const auto& [name, field] : schema.fields()) {
    if (field.storage != Storage::kText || document->isMember(name)) continue;
    if (only != nullptr && only->count(name) == 0) continue;
    const std::string_view text = texts[field.column];
    if (!text.empty()) (*document)[name] = Json::Value(text.data(), text.data() + text.size());
  }
}

bool TouchesText(const Schema& schema, const Json::Value& changes) {
  for (auto change = changes.begin(); change != changes.end(); ++change) {
    const Field* field = schema.Find(change.name());
    if (field != nullptr && field->storage == Storage::kText) return true;
  }
  return false;
}

}  // namespace quarry::engine
