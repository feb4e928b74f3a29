// What an index keeps of each field, as its mappings say.
//
// Tables of an index's database:
//   meta    key, value: the version of this layout, the mappings, how many documents there are,
//           whether the words to suggest are current
//   docs    one row per document: its path, and a column per field that documents are found or
//           ordered by as a whole; selection.h says what odd_parent is
//   attributes  what else is known of the documents; attributes.h and text_store.h say more
//   texts   the full texts of documents, packed and compressed; text_store.h says more
//   text_copies, text_hashes  which documents share a text; text_sharing.h says more
//   body    FTS5 over the full texts, a column per field; without content of its own. Its rows have
//           the numbers of texts, those of labels and names the numbers of documents
//   labels  FTS5 over the words of the file name and the texts of fields that are not listed
//   names   FTS5 over all three letters in a row of the file name
//   text_lengths  how many words the full texts have; text_lengths.h says more
//   terms   words to suggest, with the number of documents that have them; terms.h says more

#ifndef QUARRY_DAEMONS_TARNELASTICD_SCHEMA_H_
#define QUARRY_DAEMONS_TARNELASTICD_SCHEMA_H_

#include <json/json.h>

#include <cstddef>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace quarry::engine {

// The version of the layout. A database of another version counts as damaged: it is made anew.
constexpr int kLayoutVersion = 8;

// How a field's values are kept.
enum class Storage {
  kPath,    // identifies the document
  kString,  // as a whole
  kInt,
  kDouble,
  kBool,
  kText,  // searched by words
};

struct Field {
  std::string name;
  Storage storage = Storage::kString;
  // Which of body's columns holds it, for kText; for kPath 0 and without meaning; else its number
  // among the fields that are neither.
  std::size_t column = 0;
  // What a hit in this field counts, for kText.
  double weight = 1;
  // Whether docs has a column of its own for it.
  bool in_docs = false;
};

// Immutable; any thread.
class Schema {
 public:
  // Throws Error kBadMappings, saying what is wrong, when `mappings` is not as the protocol says.
  // Null stands for the simplest mappings: a path, and everything else as the default.
  explicit Schema(const Json::Value& mappings);

  const Json::Value& mappings() const { return mappings_; }
  // The name of the field that identifies a document.
  const std::string& path_field() const { return path_field_; }
  // The name of the field by whose value a document is found by parts of its file name, or "".
  const std::string& name_field() const { return name_field_; }
  // Whether the texts of fields that are not listed are searched.
  bool search_unlisted() const { return search_unlisted_; }

  // The listed field of that name, or null.
  const Field* Find(const std::string& name) const;
  const std::map<std::string, Field>& fields() const { return fields_; }
  // How many fields are neither the path nor full text.
  std::size_t row_columns() const { return row_columns_; }
  // The numbers of those that docs has a column for, ascending.
  std::vector<std::size_t> DocsColumns() const;
  std::size_t text_columns() const { return text_columns_; }
  // Weights of body's columns, in order.
  std::vector<double> Weights() const;

  // The column of docs that holds the field, or "" when it has none.
  std::string ColumnOf(const std::string& field) const;
  // "prefix0,prefix1,..." for `count` columns.
  static std::string ColumnList(std::string_view prefix, std::size_t count);

  // The statements that make all tables of an empty database.
  std::string CreateStatements() const;

 private:
  void AddField(const std::string& name, const Json::Value& settings,
                const Json::Value& default_settings);

  Json::Value mappings_;
  std::string path_field_;
  std::string name_field_;
  bool search_unlisted_ = true;
  std::map<std::string, Field> fields_;
  std::size_t row_columns_ = 0;
  std::size_t text_columns_ = 0;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SCHEMA_H_
