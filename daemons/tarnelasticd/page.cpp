#include "daemons/tarnelasticd/page.h"

#include <algorithm>
#include <queue>
#include <tuple>
#include <utility>

#include "daemons/tarnelasticd/field_names.h"
#include "daemons/tarnelasticd/ranking.h"
#include "daemons/tarnelasticd/text_lengths.h"
#include "daemons/tarnelasticd/word_finder.h"

namespace quarry::engine {
namespace {

// A word in the file name says more about a document than one in its text, and a name that is the
// query says all. (A text scores a few times its words' weights at most.)
constexpr double kLabelFactor = 2.5;
constexpr double kNameFactor = 1.5;
constexpr double kWholeName = 2000;
constexpr double kNameBeforeDot = 1000;

// Up to so many documents are looked up one by one; for more the whole order is read.
constexpr std::size_t kMaxLookups = 4096;

constexpr const char* kNoTime = "-9223372036854775808";

class Scorer {
 public:
  Scorer(const SearchedIndex& index, const Matches& matches, const std::vector<double>& weights)
      : matches_(matches),
        weights_(weights),
        words_(*index.schema, index.reader),
        lengths_(&index.reader->db()),
        scores_(matches.documents.Bound()) {}

  // By row id.
  const std::vector<double>& Run(const std::vector<const QueryTerm*>& terms) {
    for (std::size_t i = 0; i < matches_.terms.size(); ++i) {
      ScoreTexts(matches_.terms[i], weights_[i]);
      Raise(matches_.terms[i].labels, kLabelFactor * weights_[i]);
      Raise(matches_.terms[i].names, kNameFactor * weights_[i]);
    }
    ScoreWholeNames(terms);
    return scores_;
  }

 private:
  void Raise(const DocSet& documents, double by) {
    DocSet common = documents;
    common.Intersect(matches_.documents);
    common.ForEach([&](std::int64_t id) { scores_[static_cast<std::size_t>(id)] += by; });
  }

  void ScoreTexts(const TermMatches& term, double weight) {
    if (term.frequencies) {
      ScoreTexts(term.texts, *term.frequencies, weight);
    } else {
      Frequencies frequencies;
      words_.InTexts(*term.term, &frequencies);
      ScoreTexts(term.texts, frequencies, weight);
    }
  }

  void ScoreTexts(const DocSet& texts, const Frequencies& frequencies, double weight) {
    DocSet common = texts;
    common.Intersect(matches_.documents);
    if (common.Empty()) return;
    const double average = lengths_.Average();
    common.ForEach([&](std::int64_t id) {
      const double norm = LengthNorm(lengths_.Of(id), average);
      scores_[static_cast<std::size_t>(id)] += weight * WordScore(frequencies.Of(id), norm);
    });
  }

  void ScoreWholeNames(const std::vector<const QueryTerm*>& terms) {
    std::string name;
    for (const QueryTerm* term : terms) {
      if (!name.empty()) name += ' ';
      name += term->part;
    }
    if (name.empty()) return;
    Raise(words_.ByWholeName(name, false), kWholeName);
    Raise(words_.ByWholeName(name, true), kNameBeforeDot);
  }

  const Matches& matches_;
  const std::vector<double>& weights_;
  WordFinder words_;
  TextLengths lengths_;
  std::vector<double> scores_;
};

void KeepFirst(std::vector<Ranked>* ranked, SortOrder order, std::size_t count) {
  const auto before = [order](const Ranked& a, const Ranked& b) {
    return ComesBefore(a, b, order);
  };
  const auto end = ranked->begin() + static_cast<std::ptrdiff_t>(std::min(count, ranked->size()));
  std::partial_sort(ranked->begin(), end, ranked->end(), before);
  ranked->erase(end, ranked->end());
}

std::vector<Ranked> BestScored(const Matches& matches, const std::vector<double>& scores,
                               std::size_t count) {
  // Only the best so far are held, the worst of them on top, since there may be a million.
  std::priority_queue<std::pair<float, std::int64_t>> best;
  matches.documents.ForEach([&](std::int64_t id) {
    const auto score = static_cast<float>(scores[static_cast<std::size_t>(id)]);
    // Of equals the one that was stored first.
    if (best.size() == count && (count == 0 || -score >= best.top().first)) return;
    best.emplace(-score, id);
    if (best.size() > count) best.pop();
  });
  std::vector<Ranked> ranked(best.size());
  for (auto place = ranked.rbegin(); place != ranked.rend(); ++place) {
    *place = {0, best.top().second, -static_cast<double>(best.top().first), 0, {}};
    best.pop();
  }
  return ranked;
}

std::vector<Ranked> LookUp(Database* db, const DocSet& documents, const std::string& columns,
                           SortOrder order, std::size_t count) {
  std::vector<Ranked> found;
  Statement row = db->Prepare("SELECT " + columns + " FROM docs WHERE id=?1");
  documents.ForEach([&](std::int64_t id) {
    row.Bind(1, id);
    if (row.Step()) found.push_back({0, id, 0, row.Int(1), std::string(row.Text(2))});
    row.Reset();
  });
  KeepFirst(&found, order, count);
  return found;
}

std::vector<Ranked> Walk(Database* db, const DocSet& documents, const std::string& columns,
                         const std::string& order_by, std::size_t count) {
  std::vector<Ranked> found;
  Statement rows = db->Prepare("SELECT " + columns + " FROM docs ORDER BY " + order_by);
  while (found.size() < count && rows.Step()) {
    if (!documents.Contains(rows.Int(0))) continue;
    found.push_back({0, rows.Int(0), 0, rows.Int(1), std::string(rows.Text(2))});
  }
  return found;
}

}  // namespace

bool ComesBefore(const Ranked& a, const Ranked& b, SortOrder order) {
  switch (order) {
    case SortOrder::kPath:
      return std::tie(a.path, a.index, a.id) < std::tie(b.path, b.index, b.id);
    case SortOrder::kTime:
      // Of equal times the later number: that is how the database reads its index backwards.
      return std::tie(b.time, a.index, b.id) < std::tie(a.time, b.index, a.id);
    default:
      return std::tie(b.score, a.index, a.id) < std::tie(a.score, b.index, b.id);
  }
}

std::vector<Ranked> FirstOf(const SearchedIndex& index, const Query& query, const Matches& matches,
                            const std::vector<double>& weights, SortOrder order,
                            std::size_t count) {
  if (order == SortOrder::kScore) {
    Scorer scorer(index, matches, weights);
    return BestScored(matches, scorer.Run(RankedTerms(query)), count);
  }
  // Documents without a time come last.
  const std::string changed = index.schema->ColumnOf(kFieldChanged);
  const bool by_time = order == SortOrder::kTime;
  const std::string time = changed.empty() ? "NULL" : changed;
  const std::string columns =
      by_time ? "id,coalesce(" + time + "," + kNoTime + "),''" : "id,0,path";
  Database* db = &index.reader->db();
  if (matches.documents.Count() <= kMaxLookups) {
    return LookUp(db, matches.documents, columns, order, count);
  }
  const std::string order_by = !by_time ? "path" : time + " DESC,id DESC";
  return Walk(db, matches.documents, columns, order_by, count);
}

}  // namespace quarry::engine
