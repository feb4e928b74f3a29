#include "daemons/tarncontentextractd/front_matter.h"

#include <algorithm>

#include "daemons/tarncontentextractd/markup.h"

namespace quarry::extract {
namespace {

// What is longer is no front matter.
constexpr std::size_t kMaxBytes = std::size_t{64} << 10;

std::string_view Trim(std::string_view text, std::string_view characters) {
  const std::size_t first = text.find_first_not_of(characters);
  if (first == std::string_view::npos) return std::string_view();
  return text.substr(first, text.find_last_not_of(characters) - first + 1);
}

// The line at the beginning of `text`, which is moved behind it.
std::string_view TakeLine(std::string_view* text) {
  const std::size_t end = text->find('\n');
  std::string_view line = text->substr(0, end);
  text->remove_prefix(end == std::string_view::npos ? text->size() : end + 1);
  while (!line.empty() && (line.back() == '\r' || line.back() == ' ')) line.remove_suffix(1);
  return line;
}

// A value is a word, a quoted text, or a list: [a, "b"].
void AddValues(std::string_view value, const char* field, Extraction& out) {
  value = Trim(value, " \t[]");
  while (!value.empty()) {
    const std::size_t comma = value.find(',');
    out.Add(field, Trim(value.substr(0, comma), " \t\"'"));
    value.remove_prefix(comma == std::string_view::npos ? value.size() : comma + 1);
  }
}

const char* ListFieldOf(std::string_view key) {
  if (key == "author" || key == "authors") return kAuthorsField;
  return key == "keywords" || key == "tags" ? kKeywordsField : nullptr;
}

// Takes one line; returns the list field that lines beginning with "-" then add to.
const char* TakeEntry(std::string_view line, const char* list, Extraction& out) {
  const std::string_view trimmed = Trim(line, " \t");
  if (trimmed.substr(0, 2) == "- ") {
    if (list != nullptr) out.Add(list, Trim(trimmed.substr(2), " \t\"'"));
    return list;
  }
  const std::size_t colon = line.find(':');
  if (colon == std::string_view::npos || trimmed.size() != line.size()) return nullptr;
  const std::string key = AsciiLower(line.substr(0, colon));
  const std::string_view value = Trim(line.substr(colon + 1), " \t");
  if (key == "title") out.Set(kTitleField, Trim(value, "\"'"));
  if (key == "description" || key == "summary") out.Set(kDescriptionField, Trim(value, "\"'"));
  const char* field = ListFieldOf(key);
  if (field != nullptr) AddValues(value, field, out);
  return field;
}

// The front matter's length with both lines of "---", 0 where there is none.
std::size_t Length(std::string_view utf8) {
  std::string_view rest = utf8.substr(0, kMaxBytes);
  if (TakeLine(&rest) != "---") return 0;
  const std::size_t whole = std::min(utf8.size(), kMaxBytes);
  while (!rest.empty()) {
    const std::string_view line = TakeLine(&rest);
    if (line == "---" || line == "...") return whole - rest.size();
  }
  return 0;
}

}  // namespace

std::string_view TakeFrontMatter(std::string_view utf8, Extraction& out) {
  const std::size_t length = Length(utf8);
  if (length == 0) return utf8;
  std::string_view lines = utf8.substr(0, length);
  TakeLine(&lines);
  const char* list = nullptr;
  while (!lines.empty()) list = TakeEntry(TakeLine(&lines), list, out);
  return utf8.substr(length);
}

}  // namespace quarry::extract
