#include "daemons/tarnelasticd/selection.h"

#include <limits>

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

void ParseTerm(const Schema& schema, const Json::Value& term, Selection* selection) {
  if (!term.isObject() || term.size() != 1) FailMalformed("A term must have one field");
  const std::string field = term.begin().name();
  if (field == schema.path_field()) {
    selection->kind = Selection::Kind::kPathTerm;
  } else if (field == kFieldParent && !schema.ColumnOf(field).empty()) {
    selection->kind = Selection::Kind::kParentTerm;
  } else {
    FailMalformed("There is no query by this field: " + field);
  }
  selection->value = StringProperty(term, field.c_str());
}

std::string Condition(const Schema& schema, const Selection& selection) {
  std::string condition;
  switch (selection.kind) {
    case Selection::Kind::kPathPrefix:
      condition = "path>=?1";
      if (!selection.end.empty()) condition += " AND path<?2";
      break;
    case Selection::Kind::kPathTerm:
      condition = "path=?1";
      break;
    default:
      condition = schema.ColumnOf(kFieldParent) + "=?1";
  }
  if (selection.after) condition += " AND path>?3";
  return condition;
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

Statement SelectRows(const Schema& schema, const Selection& selection, const std::string& columns,
                     std::int64_t limit, Database* db) {
  Statement rows = db->Prepare("SELECT " + columns + " FROM docs WHERE " +
                               Condition(schema, selection) + " ORDER BY path LIMIT ?4");
  rows.Bind(1, selection.value).Bind(2, selection.end).Bind(4, limit);
  if (selection.after) rows.Bind(3, *selection.after);
  return rows;
}

}  // namespace quarry::engine
