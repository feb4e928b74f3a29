#include "daemons/tarnelasticd/schema.h"

#include <algorithm>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/field_names.h"
#include "daemons/tarnelasticd/terms.h"
#include "daemons/tarnelasticd/text_lengths.h"
#include "daemons/tarnelasticd/text_sharing.h"
#include "daemons/tarnelasticd/text_store.h"
#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kMaxFields = 500;
constexpr std::size_t kMaxFieldName = 255;

// Short fields that say what a document is about count more than its text.
double WeightOf(const std::string& name) {
  static const std::map<std::string, double> weights = {
      {"TARNMDTitle", 6},       {"TARNMDKeywords", 4}, {"_TARNMDUserTags", 4},
      {"TARNMDAuthors", 3},     {"TARNMDAlbum", 3},    {"TARNMDCreator", 2},
      {"TARNMDDescription", 2}, {"TARNMDComment", 2},  {"TARNMDSpotlightBoost", 4},
  };
  const auto found = weights.find(name);
  return found == weights.end() ? 1 : found->second;
}

// Of all other fields the index is asked only once it has the document.
bool IsLookedUp(const std::string& name) {
  return name == kFieldChanged || name == kFieldExtension || name == kFieldIsDir;
}

[[noreturn]] void Refuse(const std::string& why) {
  throw Error(kBadMappings, "The mappings are refused: " + why);
}

std::string StringSetting(const Json::Value& settings, const Json::Value& defaults, const char* key,
                          const char* fallback) {
  for (const Json::Value* source : {&settings, &defaults}) {
    if (!source->isMember(key)) continue;
    if (!(*source)[key].isString()) Refuse(std::string(key) + " is no string");
    return (*source)[key].asString();
  }
  return fallback;
}

bool BoolSetting(const Json::Value& settings, const Json::Value& defaults, const char* key) {
  for (const Json::Value* source : {&settings, &defaults}) {
    if (!source->isMember(key)) continue;
    if (!(*source)[key].isBool()) Refuse(std::string(key) + " is no bool");
    return (*source)[key].asBool();
  }
  return true;
}

Storage StorageOf(const std::string& type, const std::string& analyzer, bool all) {
  if (type == "int") return Storage::kInt;
  if (type == "double") return Storage::kDouble;
  if (type == "bool") return Storage::kBool;
  if (type != "string" && type != "text") Refuse("there is no type " + type);
  if (analyzer != "keyword" && analyzer != "white space" && analyzer != "tarnstandard") {
    Refuse("there is no analyzer " + analyzer);
  }
  return analyzer == "keyword" || !all ? Storage::kString : Storage::kText;
}

const Json::Value& ObjectIn(const Json::Value& mappings, const char* key) {
  const Json::Value& value = mappings[key];
  if (!value.isObject() && !value.isNull()) Refuse(std::string(key) + " is no object");
  return value;
}

}  // namespace

Schema::Schema(const Json::Value& mappings) : mappings_(mappings) {
  if (!mappings.isObject() && !mappings.isNull()) Refuse("they are no object");
  const Json::Value none(Json::objectValue);
  path_field_ = StringSetting(mappings, none, "property_id", kFieldPath);
  const Json::Value& defaults = ObjectIn(mappings, "default");
  const Json::Value& properties = ObjectIn(mappings, "properties");
  if (properties.size() > kMaxFields) Refuse("there are too many fields");
  fields_[path_field_] = {path_field_, Storage::kPath, 0, 1, true};
  // FTS5 writes the number of a column down with each word, but for the first column's: that is for
  // the field with the most words.
  if (properties.isMember(kFieldContent)) {
    AddField(kFieldContent, properties[kFieldContent], defaults);
  }
  for (auto field = properties.begin(); field != properties.end(); ++field) {
    AddField(field.name(), *field, defaults);
  }
  const Storage unlisted = StorageOf(StringSetting(none, defaults, "type", "string"),
                                     StringSetting(none, defaults, "analyzer", "tarnstandard"),
                                     BoolSetting(none, defaults, "_all"));
  search_unlisted_ = unlisted == Storage::kText;
}

void Schema::AddField(const std::string& name, const Json::Value& settings,
                      const Json::Value& default_settings) {
  if (name.empty() || name.size() > kMaxFieldName) Refuse("the name of a field is too long");
  if (!settings.isObject()) Refuse(name + " is no object");
  if (Find(name) != nullptr) return;
  Storage storage = StorageOf(StringSetting(settings, default_settings, "type", "string"),
                              StringSetting(settings, default_settings, "analyzer", "tarnstandard"),
                              BoolSetting(settings, default_settings, "_all"));
  const std::string preprocess = StringSetting(settings, default_settings, "preprocess", "");
  if (preprocess.find("ngram") != std::string::npos) {
    // Found by its parts, through a table of its own, instead of by words.
    if (!name_field_.empty()) Refuse("two fields are to be found by their parts");
    name_field_ = name;
    storage = Storage::kString;
  }
  std::size_t& columns = storage == Storage::kText ? text_columns_ : row_columns_;
  fields_[name] = {name, storage, columns++, WeightOf(name),
                   storage != Storage::kText && IsLookedUp(name)};
}

const Field* Schema::Find(const std::string& name) const {
  const auto found = fields_.find(name);
  return found == fields_.end() ? nullptr : &found->second;
}

std::vector<double> Schema::Weights() const {
  std::vector<double> weights(text_columns_, 1);
  for (const auto& [name, field] : fields_) {
    if (field.storage == Storage::kText) weights[field.column] = field.weight;
  }
  return weights;
}

std::string Schema::ColumnOf(const std::string& field) const {
  const Field* found = Find(field);
  if (found == nullptr || !found->in_docs) return "";
  if (found->storage == Storage::kPath) return "path";
  return std::string("c").append(std::to_string(found->column));
}

std::vector<std::size_t> Schema::DocsColumns() const {
  std::vector<std::size_t> columns;
  for (const auto& [name, field] : fields_) {
    if (field.in_docs && field.storage != Storage::kPath) columns.push_back(field.column);
  }
  std::sort(columns.begin(), columns.end());
  return columns;
}

std::string Schema::ColumnList(std::string_view prefix, std::size_t count) {
  std::string list;
  for (std::size_t i = 0; i < count; ++i) {
    if (i > 0) list += ',';
    list += std::string(prefix) + std::to_string(i);
  }
  return list;
}

std::string Schema::CreateStatements() const {
  std::string sql = "CREATE TABLE meta(key TEXT PRIMARY KEY, value) WITHOUT ROWID;";
  sql += "CREATE TABLE docs(id INTEGER PRIMARY KEY, path TEXT NOT NULL UNIQUE, odd_parent";
  // Columns carry numbers, not the names of fields: those come from outside, and SQL's names know
  // no difference of case.
  for (const std::size_t column : DocsColumns()) sql += ", c" + std::to_string(column);
  sql += ");CREATE INDEX docs_odd_parent ON docs(odd_parent,path) WHERE odd_parent IS NOT NULL;";
  sql += CreateTextTable(kAttributes) + CreateTextTable(kTexts);
  const auto add_index = [&](const std::string& name, const std::string& columns) {
    sql += "CREATE INDEX " + name + " ON docs(" + columns + ");";
  };
  const std::string changed = ColumnOf(kFieldChanged);
  if (!changed.empty()) add_index("docs_changed", changed);
  const std::string extension = ColumnOf(kFieldExtension);
  const std::string is_dir = ColumnOf(kFieldIsDir);
  std::string files = extension;
  if (!is_dir.empty()) files.append(",").append(is_dir);
  if (!extension.empty()) add_index("docs_extension", files);
  const auto add_words = [&](const std::string& name, const std::string& columns,
                             const std::string& tokenizer, const std::string& option = "") {
    sql += "CREATE VIRTUAL TABLE " + name + " USING fts5(" + columns +
           ", content='', tokenize=" + QuoteSql(tokenizer, '\'') + option + ");";
  };
  // A table without any full text still has a column, which stays empty.
  add_words("body", ColumnList("t", std::max<std::size_t>(text_columns_, 1)), kTextTokenizer);
  // FTS5 begins to merge a level as it is, large parts and all, and then all at once while one
  // change waits, when it has so many segments. FtsBuffer sees to it that it seldom has.
  sql +=
      "INSERT INTO body(body,rank) VALUES('automerge',16);"
      "INSERT INTO body(body,rank) VALUES('crisismerge',64);";
  // Nobody asks how long these are.
  add_words("labels", "name,extra", kTextTokenizer, ", columnsize=0");
  add_words("names", "name", "trigram case_sensitive 1", ", columnsize=0");
  return sql + CreateSharingTables() + CreateLengthTable() + CreateTermTables();
}

}  // namespace quarry::engine
