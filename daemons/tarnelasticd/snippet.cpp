#include "daemons/tarnelasticd/snippet.h"

#include <algorithm>
#include <deque>
#include <optional>

namespace quarry::engine {
namespace {

constexpr std::size_t kMaxScanned = std::size_t{1} << 20;
constexpr std::size_t kMaxMatches = 1000;
constexpr const char* kEllipsis = "\xE2\x80\xA6";

struct Match {
  std::size_t begin;
  std::size_t end;
  std::size_t term;
};

struct Word {
  std::string text;
  std::size_t begin;
  std::size_t end;
};

bool EndsWith(const std::deque<Word>& recent, const QueryTerm& term) {
  const std::size_t count = term.words.size();
  if (count == 0 || count > recent.size()) return false;
  const std::size_t first = recent.size() - count;
  for (std::size_t i = 0; i < count; ++i) {
    const std::string& word = recent[first + i].text;
    const bool is_prefix = term.prefix && i + 1 == count;
    if (is_prefix ? word.compare(0, term.words[i].size(), term.words[i]) != 0
                  : word != term.words[i]) {
      return false;
    }
  }
  return true;
}

std::vector<Match> FindMatches(const TextTokenizer& tokenizer, std::string_view text,
                               const std::vector<const QueryTerm*>& terms) {
  std::size_t longest = 1;
  for (const QueryTerm* term : terms) longest = std::max(longest, term->words.size());
  std::vector<Match> matches;
  std::deque<Word> recent;
  tokenizer.ForEach(text, [&](std::string_view word, std::size_t begin, std::size_t end) {
    if (recent.size() == longest) recent.pop_front();
    recent.push_back({std::string(word), begin, end});
    for (std::size_t i = 0; i < terms.size(); ++i) {
      if (!EndsWith(recent, *terms[i])) continue;
      matches.push_back({recent[recent.size() - terms[i]->words.size()].begin, end, i});
    }
    return matches.size() < kMaxMatches;
  });
  return matches;
}

// The first and last of the matches that lie within `length` bytes and cover most terms, then most
// words; the earliest of equals.
std::pair<std::size_t, std::size_t> BestStretch(const std::vector<Match>& matches,
                                                std::size_t terms, std::size_t length) {
  std::vector<std::size_t> counts(terms, 0);
  std::size_t distinct = 0;
  std::size_t first = 0;
  std::pair<std::size_t, std::size_t> best{0, 0};
  std::pair<std::size_t, std::size_t> best_value{0, 0};
  for (std::size_t last = 0; last < matches.size(); ++last) {
    if (counts[matches[last].term]++ == 0) ++distinct;
    while (first < last && matches[last].end - matches[first].begin > length) {
      if (--counts[matches[first++].term] == 0) --distinct;
    }
    const std::pair<std::size_t, std::size_t> value{distinct, last - first + 1};
    if (value > best_value) {
      best_value = value;
      best = {first, last};
    }
  }
  return best;
}

bool IsBlank(char c) {
  return static_cast<unsigned char>(c) <= ' ' || c == 0x7f;
}

bool IsContinuation(char c) {
  return (static_cast<unsigned char>(c) & 0xc0) == 0x80;
}

constexpr std::size_t kWordReach = 40;

// The nearest beginning of a word at or before `at`, where there is one near.
std::optional<std::size_t> WordBefore(std::string_view text, std::size_t at) {
  const std::size_t least = at - std::min(at, kWordReach);
  for (std::size_t i = at; i > least; --i) {
    if (IsBlank(text[i - 1])) return i;
  }
  if (least == 0) return 0;
  return std::nullopt;
}

std::size_t CharacterBefore(std::string_view text, std::size_t at) {
  while (at > 0 && at < text.size() && IsContinuation(text[at])) --at;
  return at;
}

// The window of about `length` bytes around [begin, end).
std::pair<std::size_t, std::size_t> Window(std::string_view text, std::size_t begin,
                                           std::size_t end, std::size_t length) {
  const std::size_t room = length > end - begin ? length - (end - begin) : 0;
  // At the end of the text the room behind is given to what stands before.
  const std::size_t last = text.size() - std::min(text.size(), length);
  const std::size_t wished = std::min(begin - std::min(begin, room / 3), last);
  const std::size_t start = WordBefore(text, wished).value_or(CharacterBefore(text, wished));
  const std::size_t stop = std::min(text.size(), std::max(end, start + length));
  if (stop == text.size()) return {start, stop};
  const std::size_t word = WordBefore(text, stop).value_or(start);
  return {start, std::max(end, word > start ? word : CharacterBefore(text, stop))};
}

// Copies text, drawing blanks together, and keeps track of where bytes go.
class Copier {
 public:
  explicit Copier(std::string* out) : out_(out) {}

  void Copy(std::string_view text) {
    for (const char c : text) {
      if (!IsBlank(c)) {
        out_->push_back(c);
        blank_ = false;
      } else if (!blank_) {
        out_->push_back(' ');
        blank_ = true;
      }
    }
  }

 private:
  std::string* out_;
  bool blank_ = true;  // no blank at the beginning
};

}  // namespace

Snippet MakeSnippet(const TextTokenizer& tokenizer, std::string_view text,
                    const std::vector<const QueryTerm*>& terms, std::size_t length) {
  const std::string_view scanned = text.substr(0, kMaxScanned);
  std::vector<Match> matches = FindMatches(tokenizer, scanned, terms);
  std::size_t begin = 0;
  std::size_t end = 0;
  if (!matches.empty()) {
    const auto [first, last] = BestStretch(matches, terms.size(), length);
    begin = matches[first].begin;
    end = std::min(matches[last].end, begin + length);
    while (end > begin && end < scanned.size() && IsContinuation(scanned[end])) --end;
  }
  const auto [start, stop] = Window(scanned, begin, end, length);
  std::sort(matches.begin(), matches.end(),
            [](const Match& a, const Match& b) { return a.begin < b.begin; });
  Snippet snippet;
  if (start > 0) snippet.text += kEllipsis;
  Copier copier(&snippet.text);
  std::size_t done = start;
  for (const Match& match : matches) {
    if (match.begin < done || match.end > stop) continue;
    copier.Copy(scanned.substr(done, match.begin - done));
    const std::size_t at = snippet.text.size();
    copier.Copy(scanned.substr(match.begin, match.end - match.begin));
    snippet.highlights.emplace_back(at, snippet.text.size() - at);
    done = match.end;
  }
  copier.Copy(scanned.substr(done, stop - done));
  while (!snippet.text.empty() && snippet.text.back() == ' ') snippet.text.pop_back();
  if (stop < text.size()) snippet.text += kEllipsis;
  return snippet;
}

}  // namespace quarry::engine
