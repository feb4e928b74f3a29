// Where the words of one index are found.

#ifndef QUARRY_DAEMONS_TARNELASTICD_WORD_FINDER_H_
#define QUARRY_DAEMONS_TARNELASTICD_WORD_FINDER_H_

#include <cstdint>
#include <string>

#include "daemons/tarnelasticd/doc_set.h"
#include "daemons/tarnelasticd/frequencies.h"
#include "daemons/tarnelasticd/index_reader.h"
#include "daemons/tarnelasticd/posting_lists.h"
#include "daemons/tarnelasticd/query.h"
#include "daemons/tarnelasticd/schema.h"

namespace quarry::engine {

// Single words are looked up in the lists behind the full text, all else is left to FTS5. Works
// within one transaction of its reader, which must outlive it. One thread at a time; throws Error
// as Database does.
class WordFinder {
 public:
  WordFinder(const Schema& schema, IndexReader* reader);

  // The documents with the words of a term, which are not none, in their full text; `frequencies`,
  // which is empty before, tells how often.
  DocSet InTexts(const QueryTerm& term, Frequencies* frequencies);
  // Those with them as whole words of the file name, or in a field that is not listed.
  DocSet InLabels(const QueryTerm& term);
  // Those with a folded text in their file name. Where it is too short to be looked up as a part:
  // as the whole name, or all of it before a dot.
  DocSet InNames(const std::string& part);
  // Those whose folded file name is, or where `before_dot` begins before a dot with, `name`.
  DocSet ByWholeName(const std::string& name, bool before_dot);

 private:
  void CountTexts(const QueryTerm& term, Frequencies* frequencies);
  DocSet MatchRows(const std::string& table, const std::string& expression);

  const Schema& schema_;
  IndexReader* reader_;
  const std::int64_t last_id_;
  PostingLists body_;
  PostingLists labels_;
  PostingLists names_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_WORD_FINDER_H_
