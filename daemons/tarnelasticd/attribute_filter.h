// Which documents have what a filter of a query asks of their attributes.

#ifndef QUARRY_DAEMONS_TARNELASTICD_ATTRIBUTE_FILTER_H_
#define QUARRY_DAEMONS_TARNELASTICD_ATTRIBUTE_FILTER_H_

#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/doc_set.h"
#include "daemons/tarnelasticd/index_reader.h"
#include "daemons/tarnelasticd/query.h"
#include "daemons/tarnelasticd/schema.h"

namespace quarry::engine {

// Whether a term asks for attributes: its place, extension or type.
bool IsAttributeFilter(const QueryTerm& term);

// Works within one transaction of its reader, which must outlive it. One thread at a time; throws
// Error as Database does. Terms must be attribute filters; whether they are negated does not
// matter.
class AttributeFilter {
 public:
  AttributeFilter(const Schema& schema, IndexReader* reader);

  // All documents that answer the term.
  DocSet Find(const QueryTerm& term);
  // Takes from `documents` those that do not answer the term, or, if it is negated, those that do.
  void Apply(const QueryTerm& term, DocSet* documents);
  // All documents of the index.
  DocSet All();

 private:
  struct Attributes {
    std::string_view path;
    std::string_view extension;
    bool has_extension = false;
    bool is_dir = false;
  };

  static bool Answers(const QueryTerm& term, const Attributes& attributes);
  bool IsFew(const DocSet& documents);
  void LookAtEach(const QueryTerm& term, DocSet* documents);
  DocSet Gather(Statement* rows);
  DocSet ByExtension(const std::vector<std::string>& extensions);
  DocSet ByType(const std::vector<std::string>& types);
  DocSet WithoutExtension();
  DocSet Inside(const std::string& path);
  std::string FilesOnly() const;

  IndexReader* reader_;
  Database* db_;
  const std::string extension_;  // columns of docs, or ""
  const std::string is_dir_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_ATTRIBUTE_FILTER_H_
