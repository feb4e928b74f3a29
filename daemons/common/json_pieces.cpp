#include "daemons/common/json_pieces.h"

#include <algorithm>
#include <cstddef>
#include <string>

namespace quarry::daemon {
namespace {

constexpr std::string_view kBlanks = " \t\n\r";

class Scanner {
 public:
  explicit Scanner(std::string_view text) : text_(text) {}

  // Goes past the character, with blanks around it, if it comes next.
  bool Skip(char c) {
    SkipBlanks();
    if (at_ >= text_.size() || text_[at_] != c) return false;
    ++at_;
    SkipBlanks();
    return true;
  }

  bool AtEnd() const { return at_ == text_.size(); }

  // The value that comes next; empty where none does.
  std::string_view Value() {
    const std::size_t begin = at_;
    std::string open;  // the brackets that are still to come
    do {
      if (!Token(&open)) return std::string_view();
    } while (!open.empty());
    return text_.substr(begin, at_ - begin);
  }

 private:
  void SkipBlanks() { at_ = std::min(text_.find_first_not_of(kBlanks, at_), text_.size()); }

  // Goes past a string, a bracket, or what lies in between.
  bool Token(std::string* open) {
    if (at_ >= text_.size()) return false;
    const char c = text_[at_];
    if (c == '"') return String();
    if (c == '{' || c == '[') {
      open->push_back(c == '{' ? '}' : ']');
    } else if (c == '}' || c == ']') {
      if (open->empty() || open->back() != c) return false;
      open->pop_back();
    } else {
      return Plain(open->empty());
    }
    ++at_;
    return true;
  }

  // A word or a number; within brackets all that stands between strings and brackets.
  bool Plain(bool alone) {
    const std::size_t begin = at_;
    at_ = std::min(text_.find_first_of(alone ? ",:{}[]\" \t\n\r" : "{}[]\"", at_), text_.size());
    return at_ > begin;
  }

  // The end is the first quotation mark with an even number of backslashes before it.
  bool String() {
    for (std::size_t end = at_ + 1;; ++end) {
      end = text_.find('"', end);
      if (end == std::string_view::npos) return false;
      const std::size_t other = text_.find_last_not_of('\\', end - 1);
      if ((end - 1 - other) % 2 != 0) continue;
      at_ = end + 1;
      return true;
    }
  }

  std::string_view text_;
  std::size_t at_ = 0;
};

// Reads what stands in brackets, separated by commas, up to the end of the text.
template <typename ReadElement>
bool ReadBrackets(Scanner& scanner, char open, char close, const ReadElement& read_element) {
  if (!scanner.Skip(open)) return false;
  if (scanner.Skip(close)) return scanner.AtEnd();
  do {
    if (!read_element()) return false;
  } while (scanner.Skip(','));
  return scanner.Skip(close) && scanner.AtEnd();
}

}  // namespace

std::optional<std::map<std::string_view, std::string_view>> MembersOf(std::string_view text) {
  std::map<std::string_view, std::string_view> members;
  Scanner scanner(text);
  const bool good = ReadBrackets(scanner, '{', '}', [&] {
    const std::string_view name = scanner.Value();
    if (name.size() < 2 || name[0] != '"' || !scanner.Skip(':')) return false;
    const std::string_view value = scanner.Value();
    members.emplace(name.substr(1, name.size() - 2), value);
    return !value.empty();
  });
  if (!good) return std::nullopt;
  return members;
}

std::optional<std::vector<std::string_view>> ElementsOf(std::string_view text) {
  std::vector<std::string_view> elements;
  Scanner scanner(text);
  const bool good = ReadBrackets(scanner, '[', ']', [&] {
    elements.push_back(scanner.Value());
    return !elements.back().empty();
  });
  if (!good) return std::nullopt;
  return elements;
}

}  // namespace quarry::daemon
