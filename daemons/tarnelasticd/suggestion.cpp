#include "daemons/tarnelasticd/suggestion.h"

#include <algorithm>
#include <map>
#include <string_view>
#include <tuple>
#include <utility>

#include "daemons/tarnelasticd/matcher.h"
#include "daemons/tarnelasticd/request.h"
#include "daemons/tarnelasticd/terms.h"

namespace quarry::engine {
namespace {

// So many different words of a query are looked at.
constexpr std::size_t kMaxLookedAt = 16;
// So many words each index puts forward; how many documents have them is counted over all indexes.
constexpr std::size_t kPutForward = 64;
// A word of a few documents is taken for a slip only beside one that has so many times more.
constexpr std::int64_t kFarMore = 10;
// From so many letters on two may be wrong.
constexpr std::size_t kLongWord = 6;

std::int64_t DocumentsOfAll(const std::vector<SearchedIndex>& indexes, std::string_view word) {
  std::int64_t documents = 0;
  for (const SearchedIndex& index : indexes) documents += DocumentsWith(&index.reader->db(), word);
  return documents;
}

// How many documents are found by the word now; kFewDocuments stands for more, too.
std::int64_t CountFound(const std::vector<SearchedIndex>& indexes, const std::string& word) {
  constexpr std::int64_t kFew{kFewDocuments};
  if (DocumentsOfAll(indexes, word) >= kFew) return kFew;
  QueryTerm term;
  term.text = term.part = word;
  term.words = {word};
  Query query;
  query.groups.push_back({std::move(term)});
  std::int64_t found = 0;
  for (const SearchedIndex& index : indexes) {
    const Matches matches = FindMatches(*index.schema, query, index.reader);
    found += static_cast<std::int64_t>(matches.documents.Count());
  }
  return std::min(found, kFew);
}

bool IsNumber(const std::string& word) {
  return std::all_of(word.begin(), word.end(), [](char c) { return c >= '0' && c <= '9'; });
}

// Whether a word of this kind is ever a slip of another.
bool CanBeCorrected(const std::string& word, std::size_t letters) {
  return letters >= static_cast<std::size_t>(kMinTermLetters) &&
         letters <= static_cast<std::size_t>(kMaxTermLetters) + 2 && !IsNumber(word);
}

// The words near to `word` in any of the indexes, each once, with the documents of all.
std::vector<NearTerm> NearInAll(const std::vector<SearchedIndex>& indexes, const std::string& word,
                                std::size_t limit) {
  std::map<std::string, NearTerm> near;
  for (const SearchedIndex& index : indexes) {
    const auto check = [&index] { index.reader->CheckDeadline(); };
    for (NearTerm& found : TermsNear(&index.reader->db(), word, limit, kPutForward, check)) {
      near.emplace(found.term.text, std::move(found));
    }
  }
  std::vector<NearTerm> all;
  for (auto& [text, found] : near) {
    if (indexes.size() > 1) found.term.documents = DocumentsOfAll(indexes, text);
    all.push_back(std::move(found));
  }
  return all;
}

// The word that was meant; empty when `word` stands for itself.
std::string Correct(const std::vector<SearchedIndex>& indexes, const std::string& word) {
  const std::size_t letters = CountCharacters(word);
  if (!CanBeCorrected(word, letters)) return "";
  const std::int64_t documents = CountFound(indexes, word);
  if (documents >= static_cast<std::int64_t>(kFewDocuments)) return "";
  const std::int64_t enough = documents * kFarMore;
  std::string best;
  auto rank = std::make_tuple(std::size_t{0}, std::int64_t{0});
  for (const NearTerm& near : NearInAll(indexes, word, letters < kLongWord ? 1 : 2)) {
    const auto its_rank = std::make_tuple(near.distance, -near.term.documents);
    if (near.term.documents < enough || (!best.empty() && its_rank >= rank)) continue;
    best = near.term.text;
    rank = its_rank;
  }
  return best;
}

// A word of a query, and where it stands there, in bytes.
struct Place {
  std::string word;
  std::size_t begin;
  std::size_t end;
};

// The words that are looked at, in the order in which they stand.
std::vector<Place> PlacesOf(const Query& query, const TextTokenizer& tokenizer) {
  std::vector<Place> places;
  for (const auto& group : query.groups) {
    for (const QueryTerm& term : group) {
      if (term.kind != QueryTerm::Kind::kWords || term.negated) continue;
      tokenizer.ForEach(term.text, [&](std::string_view word, std::size_t begin, std::size_t end) {
        places.push_back({std::string(word), term.begin + begin, term.begin + end});
        return true;
      });
      if (term.prefix && !term.words.empty()) places.pop_back();
    }
  }
  return places;
}

Json::Value WordsJson(const std::vector<Term>& terms) {
  Json::Value words(Json::arrayValue);
  for (const Term& term : terms) {
    Json::Value word;
    word["word"] = term.text;
    word["documents"] = Json::Int64{term.documents};
    words.append(std::move(word));
  }
  return words;
}

// What a beginning of a word is folded to; empty for what is none.
std::string FoldedPrefix(const TextTokenizer& tokenizer, const std::string& prefix) {
  const std::vector<std::string> words = tokenizer.Words(prefix);
  const bool is_word = words.size() == 1 && tokenizer.Fold(prefix) == words.front();
  return is_word ? words.front() : "";
}

}  // namespace

std::optional<std::string> CorrectQuery(const std::string& text, const Query& query,
                                        const std::vector<SearchedIndex>& indexes) {
  if (indexes.empty()) return std::nullopt;
  std::map<std::string, std::string> corrections;
  std::string corrected;
  std::size_t done = 0;
  for (const Place& place : PlacesOf(query, indexes.front().reader->tokenizer())) {
    if (corrections.count(place.word) == 0) {
      if (corrections.size() == kMaxLookedAt) break;
      corrections[place.word] = Correct(indexes, place.word);
    }
    const std::string& word = corrections[place.word];
    if (word.empty()) continue;
    corrected += text.substr(done, place.begin - done) + word;
    done = place.end;
  }
  if (done == 0) return std::nullopt;
  return corrected + text.substr(done);
}

CompletionRequest ParseCompletionRequest(const Json::Value& data) {
  CompletionRequest request;
  request.prefix = StringProperty(data, "prefix");
  if (request.prefix.size() > kMaxQueryBytes) FailMalformed("Too long: prefix");
  request.size =
      static_cast<std::size_t>(OptionalNumber(data, "size", 1, kMaxCompletions).value_or(10));
  return request;
}

Json::Value CompleteWord(const CompletionRequest& request,
                         const std::vector<SearchedIndex>& indexes) {
  std::map<std::string, std::int64_t> found;
  for (const SearchedIndex& index : indexes) {
    const std::string prefix = FoldedPrefix(index.reader->tokenizer(), request.prefix);
    if (prefix.empty()) break;
    for (const Term& term : TermsThatBegin(&index.reader->db(), prefix, request.size)) {
      found.emplace(term.text, term.documents);
    }
  }
  std::vector<Term> terms;
  for (const auto& [text, documents] : found) {
    terms.push_back({text, indexes.size() > 1 ? DocumentsOfAll(indexes, text) : documents});
  }
  std::stable_sort(terms.begin(), terms.end(),
                   [](const Term& a, const Term& b) { return a.documents > b.documents; });
  if (terms.size() > request.size) terms.resize(request.size);
  Json::Value completed;
  completed["words"] = WordsJson(terms);
  return completed;
}

}  // namespace quarry::engine
