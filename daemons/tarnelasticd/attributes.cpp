#include "daemons/tarnelasticd/attributes.h"

#include <bit>
#include <cstring>
#include <variant>
#include <vector>

#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/field_names.h"
#include "daemons/tarnelasticd/selection.h"
#include "daemons/tarnelasticd/varint.h"

namespace quarry::engine {
namespace {

constexpr int kPathColumn = 1;
constexpr int kOddParentColumn = 2;
constexpr int kFirstColumn = 3;  // of those that the schema names

constexpr char kNumber = 'n';
constexpr char kReal = 'r';
constexpr char kString = 's';

[[noreturn]] void FailDamaged() {
  throw Error(kDamagedIndex, "A stored document is damaged");
}

template <typename Value>
void AppendFixed(std::string* out, Value value) {
  static_assert(std::endian::native == std::endian::little);
  out->append(reinterpret_cast<const char*>(&value), sizeof value);
}

template <typename Value>
Value TakeFixed(std::string_view* bytes) {
  Value value{};
  if (bytes->size() < sizeof value) FailDamaged();
  std::memcpy(&value, bytes->data(), sizeof value);
  bytes->remove_prefix(sizeof value);
  return value;
}

void AppendCell(std::string* out, const Cell& cell) {
  if (const auto* number = std::get_if<std::int64_t>(&cell)) {
    out->push_back(kNumber);
    AppendFixed(out, *number);
  } else if (const auto* real = std::get_if<double>(&cell)) {
    out->push_back(kReal);
    AppendFixed(out, *real);
  } else if (const auto* text = std::get_if<std::string>(&cell)) {
    out->push_back(kString);
    AppendNumber(out, text->size());
    *out += *text;
  }
}

Cell TakeCell(std::string_view* bytes) {
  switch (TakeFixed<char>(bytes)) {
    case kNumber:
      return TakeFixed<std::int64_t>(bytes);
    case kReal:
      return TakeFixed<double>(bytes);
    case kString:
      return std::string(TakeCounted(bytes));
    default:
      FailDamaged();
  }
}

Cell ReadCell(const Statement& row, int column) {
  switch (row.Type(column)) {
    case SQLITE_INTEGER:
      return row.Int(column);
    case SQLITE_FLOAT:
      return row.Double(column);
    case SQLITE_TEXT:
      return std::string(row.Text(column));
    default:
      return {};
  }
}

void BindCell(Statement* statement, int index, const Cell& cell) {
  if (const auto* number = std::get_if<std::int64_t>(&cell)) {
    statement->Bind(index, *number);
  } else if (const auto* real = std::get_if<double>(&cell)) {
    statement->Bind(index, *real);
  } else if (const auto* text = std::get_if<std::string>(&cell)) {
    statement->Bind(index, std::string_view(*text));
  } else {
    statement->BindNull(index);
  }
}

void BindOddParent(const Schema& schema, const DocumentRow& row, int index, Statement* statement) {
  const Field* parent = schema.Find(kFieldParent);
  const std::string* value = nullptr;
  if (parent != nullptr && parent->storage == Storage::kString) {
    value = std::get_if<std::string>(&row.cells[parent->column]);
  }
  if (value == nullptr) {
    statement->Bind(index, kNoParent);
  } else if (IsChild(*value, row.path)) {
    statement->BindNull(index);
  } else {
    statement->Bind(index, std::string_view(*value));
  }
}

}  // namespace

std::string DocsColumns(const Schema& schema) {
  std::string columns = "id,path,odd_parent";
  for (const std::size_t column : schema.DocsColumns()) columns += ",c" + std::to_string(column);
  return columns;
}

std::string InsertDocsSql(const Schema& schema) {
  std::string values = "?1,?2,?3";
  const std::size_t count = schema.DocsColumns().size();
  for (std::size_t i = 0; i < count; ++i) values += ",?" + std::to_string(i + 4);
  return "INSERT INTO docs(" + DocsColumns(schema) + ") VALUES(" + values + ")";
}

std::string UpdateDocsSql(const Schema& schema) {
  std::string sql = "UPDATE docs SET path=?2,odd_parent=?3";
  std::size_t parameter = 4;
  for (const std::size_t column : schema.DocsColumns()) {
    sql += ",c" + std::to_string(column) + "=?" + std::to_string(parameter++);
  }
  return sql + " WHERE id=?1";
}

void BindDocs(const Schema& schema, std::int64_t id, const DocumentRow& row, Statement* statement) {
  statement->Bind(1, id).Bind(2, std::string_view(row.path));
  BindOddParent(schema, row, kOddParentColumn + 1, statement);
  int index = kFirstColumn + 1;
  for (const std::size_t column : schema.DocsColumns()) {
    BindCell(statement, index++, row.cells[column]);
  }
}

std::string PackAttributes(const Schema& schema, const DocumentRow& row) {
  std::vector<bool> elsewhere(row.cells.size());
  for (const std::size_t column : schema.DocsColumns()) elsewhere[column] = true;
  std::string cells;
  std::size_t count = 0;
  for (std::size_t i = 0; i < row.cells.size(); ++i) {
    if (elsewhere[i] || std::holds_alternative<std::monostate>(row.cells[i])) continue;
    AppendNumber(&cells, i);
    AppendCell(&cells, row.cells[i]);
    ++count;
  }
  if (count == 0 && row.extra.empty()) return "";
  std::string packed;
  AppendNumber(&packed, count);
  return packed + cells + row.extra;
}

DocumentRow UnpackRow(const Schema& schema, const Statement& row, std::string_view attributes) {
  DocumentRow unpacked;
  unpacked.path = row.Text(kPathColumn);
  unpacked.cells.resize(schema.row_columns());
  int index = kFirstColumn;
  for (const std::size_t column : schema.DocsColumns()) {
    unpacked.cells[column] = ReadCell(row, index++);
  }
  if (attributes.empty()) return unpacked;
  for (std::uint64_t left = TakeNumber(&attributes); left > 0; --left) {
    const std::uint64_t column = TakeNumber(&attributes);
    if (column >= unpacked.cells.size()) FailDamaged();
    unpacked.cells[column] = TakeCell(&attributes);
  }
  unpacked.extra = attributes;
  return unpacked;
}

}  // namespace quarry::engine
