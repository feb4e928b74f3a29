#include "daemons/tarnelasticd/query.h"

#include <algorithm>
#include <map>
#include <optional>
#include <utility>

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

[[noreturn]] void FailSyntax(const std::string& why) {
  throw Error(kQuerySyntax, why);
}

bool IsBlank(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\v' || c == '\f';
}

std::string LowerAscii(std::string_view text) {
  std::string lower(text);
  for (char& c : lower) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return lower;
}

// What stands between the separators, without what is empty.
std::vector<std::string> Split(const std::string& text, char separator) {
  std::vector<std::string> values;
  std::size_t begin = 0;
  while (begin <= text.size()) {
    const std::size_t end = std::min(text.find(separator, begin), text.size());
    if (end > begin) values.push_back(text.substr(begin, end - begin));
    begin = end + 1;
  }
  return values;
}

// Reads a query from left to right.
class Parser {
 public:
  explicit Parser(std::string_view text) : text_(text) {}

  Query Parse() {
    while (SkipBlanks()) {
      if (TakeOr()) continue;
      AddTerm(ParseTerm());
    }
    if (join_) FailSyntax("OR needs something on both sides.");
    if (query_.groups.empty()) FailSyntax("There is nothing to search for.");
    return std::move(query_);
  }

 private:
  bool AtEnd() const { return at_ == text_.size(); }

  bool SkipBlanks() {
    while (!AtEnd() && IsBlank(text_[at_])) ++at_;
    return !AtEnd();
  }

  bool TakeOr() {
    if (text_.substr(at_, 2) != "OR") return false;
    if (at_ + 2 < text_.size() && !IsBlank(text_[at_ + 2])) return false;
    if (join_ || query_.groups.empty()) FailSyntax("OR needs something on both sides.");
    join_ = true;
    at_ += 2;
    return true;
  }

  void AddTerm(QueryTerm term) {
    if (++terms_ > kMaxQueryTerms) {
      FailSyntax("There are more than " + std::to_string(kMaxQueryTerms) + " words.");
    }
    if (!join_) query_.groups.emplace_back();
    query_.groups.back().push_back(std::move(term));
    join_ = false;
  }

  QueryTerm ParseTerm() {
    QueryTerm term;
    if (text_[at_] == '-' && at_ + 1 < text_.size() && !IsBlank(text_[at_ + 1])) {
      term.negated = true;
      ++at_;
    }
    if (const auto kind = TakeKey()) {
      term.kind = *kind;
      TakeValue(&term);
      CheckFilter(&term);
    } else {
      TakeValue(&term);
      TakeStar(&term);
    }
    return term;
  }

  std::optional<QueryTerm::Kind> TakeKey() {
    static const std::pair<const char*, QueryTerm::Kind> keys[] = {
        {"type:", QueryTerm::Kind::kType},
        {"ext:", QueryTerm::Kind::kExtension},
        {"in:", QueryTerm::Kind::kInside},
        {"name:", QueryTerm::Kind::kName}};
    for (const auto& [key, kind] : keys) {
      const std::string_view name(key);
      if (LowerAscii(text_.substr(at_, name.size())) != name) continue;
      at_ += name.size();
      return kind;
    }
    return std::nullopt;
  }

  // A text in quotes, or all up to the next blank.
  void TakeValue(QueryTerm* term) {
    const std::size_t begin = at_;
    if (!AtEnd() && text_[at_] == '"') {
      const std::size_t end = text_.find('"', at_ + 1);
      if (end == std::string_view::npos) {
        FailSyntax("The quote at character " + std::to_string(begin + 1) + " is not closed.");
      }
      at_ = end + 1;
      term->begin = begin + 1;
      term->text = text_.substr(begin + 1, end - begin - 1);
      return;
    }
    while (!AtEnd() && !IsBlank(text_[at_])) ++at_;
    term->begin = begin;
    term->text = text_.substr(begin, at_ - begin);
  }

  // The star stands behind a word, or behind the closing quote.
  void TakeStar(QueryTerm* term) {
    if (!AtEnd() && text_[at_] == '*') {
      term->prefix = true;
      ++at_;
    }
    while (!term->text.empty() && term->text.back() == '*') {
      term->prefix = true;
      term->text.pop_back();
    }
  }

  static void CheckFilter(QueryTerm* term) {
    if (term->text.empty()) FailSyntax("A filter needs a value behind its colon.");
    if (term->kind == QueryTerm::Kind::kInside) {
      CheckInside(term);
    } else if (term->kind != QueryTerm::Kind::kName) {
      term->values = Split(LowerAscii(term->text), ',');
      if (term->values.empty()) FailSyntax("A filter needs a value behind its colon.");
      if (term->kind == QueryTerm::Kind::kType) CheckTypes(*term);
      if (term->kind == QueryTerm::Kind::kExtension) StripDots(term);
    }
  }

  static void CheckInside(QueryTerm* term) {
    if (term->text.front() != '/') FailSyntax("in: needs a full path, which begins with /.");
    term->text = InsideTerm(term->text).text;
  }

  static void CheckTypes(const QueryTerm& term) {
    for (const std::string& value : term.values) {
      if (value != "document" && value != "audio" && value != "video" && value != "photo") {
        FailSyntax("There is no type " + value + ", only document, audio, video and photo.");
      }
    }
  }

  static void StripDots(QueryTerm* term) {
    for (std::string& value : term->values) {
      if (value.size() > 1 && value.front() == '.') value.erase(0, 1);
    }
  }

  std::string_view text_;
  std::size_t at_ = 0;
  std::size_t terms_ = 0;
  bool join_ = false;
  Query query_;
};

bool IsSearchable(const QueryTerm& term) {
  if (term.kind != QueryTerm::Kind::kWords && term.kind != QueryTerm::Kind::kName) return true;
  if (term.kind == QueryTerm::Kind::kName && term.values.empty()) return false;
  return !term.words.empty() || CountCharacters(term.part) >= kMinPart;
}

}  // namespace

QueryTerm InsideTerm(std::string_view path) {
  while (path.size() > 1 && path.back() == '/') path.remove_suffix(1);
  QueryTerm term;
  term.kind = QueryTerm::Kind::kInside;
  term.text = path;
  return term;
}

Query ParseQuery(std::string_view text) {
  if (text.size() > kMaxQueryBytes) {
    FailSyntax("The query is longer than " + std::to_string(kMaxQueryBytes) + " bytes.");
  }
  if (text.find('\0') != std::string_view::npos) FailSyntax("The query has a NUL byte.");
  return Parser(text).Parse();
}

void Resolve(const TextTokenizer& tokenizer, Query* query) {
  for (auto& group : query->groups) {
    for (QueryTerm& term : group) {
      term.words = tokenizer.Words(term.text);
      term.part = tokenizer.Fold(term.text);
      if (term.kind == QueryTerm::Kind::kName) term.values = Split(term.part, '*');
    }
    group.erase(std::remove_if(group.begin(), group.end(),
                               [](const QueryTerm& term) { return !IsSearchable(term); }),
                group.end());
  }
  auto& groups = query->groups;
  groups.erase(
      std::remove_if(groups.begin(), groups.end(), [](const auto& group) { return group.empty(); }),
      groups.end());
  if (groups.empty()) FailSyntax("There is nothing to search for.");
}

}  // namespace quarry::engine
