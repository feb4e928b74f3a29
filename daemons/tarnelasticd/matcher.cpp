#include "daemons/tarnelasticd/matcher.h"

#include <algorithm>
#include <utility>

#include "daemons/tarnelasticd/attribute_filter.h"
#include "daemons/tarnelasticd/word_finder.h"

namespace quarry::engine {
namespace {

// What the frequencies of one query's terms may take in memory together.
constexpr std::size_t kMaxFrequencies = std::size_t{32} << 20;

class Finder {
 public:
  Finder(const Schema& schema, IndexReader* reader)
      : words_(schema, reader), filter_(schema, reader) {}

  // A name: filter for several parts takes them all: "name:*report*.pdf".
  DocSet ByName(const QueryTerm& term) {
    DocSet found = words_.InNames(term.values.front());
    for (std::size_t i = 1; i < term.values.size(); ++i) {
      found.Intersect(words_.InNames(term.values[i]));
    }
    return found;
  }

  AttributeFilter& filter() { return filter_; }

  DocSet ByWords(const QueryTerm& term, TermMatches* matches) {
    if (!term.words.empty()) {
      Frequencies frequencies;
      matches->texts = words_.InTexts(term, &frequencies);
      KeepFrequencies(std::move(frequencies), matches);
      matches->labels = words_.InLabels(term);
    }
    matches->names = words_.InNames(term.part);
    DocSet found = matches->texts;
    found.Unite(matches->labels);
    found.Unite(matches->names);
    matches->documents = found.Count();
    matches->term = &term;
    return found;
  }

 private:
  void KeepFrequencies(Frequencies frequencies, TermMatches* matches) {
    frequencies_bytes_ += frequencies.Bytes();
    if (frequencies_bytes_ <= kMaxFrequencies) matches->frequencies = std::move(frequencies);
  }

  WordFinder words_;
  AttributeFilter filter_;
  std::size_t frequencies_bytes_ = 0;
};

DocSet FindTerm(const QueryTerm& term, Finder* finder, Matches* matches) {
  if (IsAttributeFilter(term)) return finder->filter().Find(term);
  if (term.kind == QueryTerm::Kind::kName) return finder->ByName(term);
  TermMatches found;
  DocSet documents = finder->ByWords(term, &found);
  if (!term.negated) matches->terms.push_back(std::move(found));
  return documents;
}

// A group is a union; what is negated in it is the rest of all documents.
DocSet FindGroup(const std::vector<QueryTerm>& group, Finder* finder, Matches* matches) {
  DocSet found;
  for (const QueryTerm& term : group) {
    DocSet documents = FindTerm(term, finder, matches);
    if (term.negated) {
      DocSet rest = finder->filter().All();
      rest.Subtract(documents);
      documents = std::move(rest);
    }
    found.Unite(documents);
  }
  return found;
}

bool IsPlainNegation(const std::vector<QueryTerm>& group) {
  return group.size() == 1 && group.front().negated;
}

// Whether the group is best applied to what the others have found.
bool ComesLast(const std::vector<QueryTerm>& group) {
  return IsPlainNegation(group) || (group.size() == 1 && IsAttributeFilter(group.front()));
}

void ApplyLast(const QueryTerm& term, Finder* finder, Matches* matches) {
  if (IsAttributeFilter(term)) {
    finder->filter().Apply(term, &matches->documents);
  } else {
    matches->documents.Subtract(FindTerm(term, finder, matches));
  }
}

}  // namespace

std::vector<const QueryTerm*> RankedTerms(const Query& query) {
  std::vector<const QueryTerm*> terms;
  for (const auto& group : query.groups) {
    for (const QueryTerm& term : group) {
      if (term.kind == QueryTerm::Kind::kWords && !term.negated) terms.push_back(&term);
    }
  }
  return terms;
}

Matches FindMatches(const Schema& schema, const Query& query, IndexReader* reader) {
  Finder finder(schema, reader);
  Matches matches;
  bool first = true;
  for (const auto& group : query.groups) {
    if (ComesLast(group)) continue;
    DocSet found = FindGroup(group, &finder, &matches);
    if (first) {
      matches.documents = std::move(found);
    } else {
      matches.documents.Intersect(found);
    }
    first = false;
  }
  for (const auto& group : query.groups) {
    if (!ComesLast(group)) continue;
    const QueryTerm& term = group.front();
    if (first && !term.negated) {
      matches.documents = finder.filter().Find(term);
    } else {
      if (first) matches.documents = finder.filter().All();
      ApplyLast(term, &finder, &matches);
    }
    first = false;
  }
  return matches;
}

}  // namespace quarry::engine
