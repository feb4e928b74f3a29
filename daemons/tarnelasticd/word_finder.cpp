#include "daemons/tarnelasticd/word_finder.h"

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/fts_buffer.h"
#include "daemons/tarnelasticd/ranking.h"
#include "daemons/tarnelasticd/text_sharing.h"

namespace quarry::engine {
namespace {

std::string Quoted(const std::string& text) {
  return QuoteSql(text, '"');
}

// As typed: the database folds it exactly as it has folded the texts, whatever bytes there are.
std::string PhraseExpression(const QueryTerm& term) {
  return Quoted(term.text) + (term.prefix ? "*" : "");
}

DocSet Documents(PostingLists* lists, const std::string& word, bool prefix) {
  DocSet found;
  lists->ForEach(word, prefix, [&found](const std::vector<Posting>& some) {
    for (const Posting& posting : some) found.Add(posting.id);
  });
  return found;
}

}  // namespace

WordFinder::WordFinder(const Schema& schema, IndexReader* reader)
    : schema_(schema),
      reader_(reader),
      last_id_(LastId(&reader->db())),
      body_(&reader->db(), "body", last_id_, schema.Weights(),
            [reader] { reader->CheckDeadline(); }),
      labels_(&reader->db(), "labels", last_id_, {}, [reader] { reader->CheckDeadline(); }),
      names_(&reader->db(), "names", last_id_, {}, [reader] { reader->CheckDeadline(); }) {}

DocSet WordFinder::InTexts(const QueryTerm& term, Frequencies* frequencies) {
  CountTexts(term, frequencies);
  SpreadToDocuments(reader_->TextCopies(), frequencies);
  return frequencies->Documents();
}

// By the numbers of texts.
void WordFinder::CountTexts(const QueryTerm& term, Frequencies* frequencies) {
  if (term.words.size() == 1 && body_.IsReadable()) {
    body_.ForEach(term.words.front(), term.prefix, [&](const std::vector<Posting>& some) {
      for (const Posting& posting : some) frequencies->Add(posting.id, posting.frequency);
    });
    return;
  }
  CountContext context{schema_.Weights(), nullptr, frequencies};
  const IndexReader::Counting counting(reader_, &context);
  Statement rows = reader_->db().Prepare("SELECT quarry_count(body) FROM body WHERE body MATCH ?1");
  const std::string expression = PhraseExpression(term);
  rows.Bind(1, std::string_view(expression)).Run();
}

DocSet WordFinder::InLabels(const QueryTerm& term) {
  if (term.words.size() == 1 && labels_.IsReadable()) {
    return Documents(&labels_, term.words.front(), term.prefix);
  }
  return MatchRows("labels", PhraseExpression(term));
}

DocSet WordFinder::InNames(const std::string& part) {
  const std::size_t characters = CountCharacters(part);
  if (characters == kMinPart && names_.IsReadable()) return Documents(&names_, part, false);
  if (characters >= kMinPart) return MatchRows("names", Quoted(part));
  DocSet found = ByWholeName(part, false);
  found.Unite(ByWholeName(part, true));
  return found;
}

DocSet WordFinder::ByWholeName(const std::string& name, bool before_dot) {
  return MatchRows("names", Quoted(kNameBegin + name + (before_dot ? '.' : kNameEnd)));
}

DocSet WordFinder::MatchRows(const std::string& table, const std::string& expression) {
  DocSet found;
  Statement rows =
      reader_->db().Prepare("SELECT rowid FROM " + table + " WHERE " + table + " MATCH ?1");
  rows.Bind(1, std::string_view(expression));
  while (rows.Step()) {
    if (rows.Int(0) <= last_id_) found.Add(rows.Int(0));
  }
  return found;
}

}  // namespace quarry::engine
