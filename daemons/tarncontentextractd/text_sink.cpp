#include "daemons/tarncontentextractd/text_sink.h"

#include <unicode/utf16.h>

#include <algorithm>
#include <utility>

#include "daemons/tarncontentextractd/utf8.h"

namespace quarry::extract {
namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

bool IsPlainAscii(char c) {
  return c > 0x20 && c < 0x7F;
}

bool IsLineEnd(std::int32_t c) {
  return (c >= 0x0A && c <= 0x0D) || c == 0x85 || c == 0x2028 || c == 0x2029;
}

bool IsBlank(std::int32_t c) {
  return (c >= 0x80 && c <= 0xA0) || c == 0x1680 || (c >= 0x2000 && c <= 0x200B) || c == 0x202F ||
         c == 0x205F || c == 0x3000;
}

bool IsInvisible(std::int32_t c) {
  return c == 0xAD || c == 0xFEFF || c == 0x200E || c == 0x200F || (c >= 0x202A && c <= 0x202E) ||
         (c >= 0x2060 && c <= 0x2069) || U_IS_UNICODE_NONCHAR(c);
}

bool IsLooseSpace(char c) {
  return c == ' ' || c == '\n';
}

// Behind the plain characters from `at` on.
std::size_t PlainEnd(std::string_view utf8, std::size_t at) {
  while (at < utf8.size() && IsPlainAscii(utf8[at])) ++at;
  return at;
}

// So many characters are looked at together; compilers do that at once.
constexpr std::size_t kBlock = 32;

// Whether there are only plain characters and, each in front of one, single blanks and line feeds.
bool IsCleanBlock(const char* at) {
  unsigned char odd = 0;
  for (std::size_t i = 0; i < kBlock; ++i) {
    const unsigned plain = IsPlainAscii(at[i]) ? 1 : 0;
    const unsigned space = IsLooseSpace(at[i]) ? 1 : 0;
    const unsigned next = IsPlainAscii(at[i + 1]) ? 1 : 0;
    odd = static_cast<unsigned char>(odd | ((plain | (space & next)) ^ 1));
  }
  return odd == 0;
}

// Behind the text from `at` on, where a plain character stands, that is clean as it is. Ends with a
// plain character.
std::size_t CleanEnd(std::string_view utf8, std::size_t at) {
  while (at + kBlock < utf8.size() && IsCleanBlock(utf8.data() + at)) at += kBlock;
  while (true) {
    at = PlainEnd(utf8, at);
    const bool goes_on =
        at + 1 < utf8.size() && IsLooseSpace(utf8[at]) && IsPlainAscii(utf8[at + 1]);
    if (!goes_on) return at;
    ++at;
  }
}

}  // namespace

void TextSink::Space() {
  if (gap_ == Gap::kNone) gap_ = Gap::kBlank;
}

void TextSink::Break() {
  gap_ = Gap::kLine;
}

std::string TextSink::Take() {
  gap_ = Gap::kNone;
  full_ = false;
  return std::exchange(text_, std::string());
}

// Appends all of `piece`, or as much as fits of one that may be cut anywhere (plain ASCII may).
void TextSink::Put(std::string_view piece) {
  const bool separate = gap_ != Gap::kNone && !text_.empty();
  const std::size_t room = limit_ - std::min(limit_, text_.size() + (separate ? 1 : 0));
  if (piece.size() > room) {
    full_ = true;
    if (room == 0 || !IsPlainAscii(piece[0])) return;
    piece = piece.substr(0, room);
  }
  if (separate) text_.push_back(gap_ == Gap::kLine ? '\n' : ' ');
  gap_ = Gap::kNone;
  text_.append(piece);
}

// Most text is runs of plain characters, or of words that one blank or line feed keeps apart, which
// is as it is to be: they go in whole.
std::size_t TextSink::AppendPlainRun(std::string_view utf8, std::size_t at) {
  // Of what does not fit no more is looked at, and the cut itself is left to Put.
  const std::size_t room = limit_ - std::min(limit_, text_.size() + 1);
  const std::size_t end = room == 0 ? PlainEnd(utf8, at) : CleanEnd(utf8.substr(0, at + room), at);
  Put(utf8.substr(at, end - at));
  return end;
}

void TextSink::AppendAsciiOther(char c) {
  if (IsLineEnd(c)) {
    Break();
  } else {
    Space();
  }
}

void TextSink::AppendCharacter(std::string_view utf8, std::int32_t character) {
  if (character < 0) {
    Put(kReplacement);
  } else if (IsLineEnd(character)) {
    Break();
  } else if (IsBlank(character)) {
    Space();
  } else if (!IsInvisible(character)) {
    Put(utf8);
  }
}

bool TextSink::Append(std::string_view utf8) {
  std::size_t at = 0;
  while (at < utf8.size() && !full_) {
    const char c = utf8[at];
    if (IsPlainAscii(c)) {
      at = AppendPlainRun(utf8, at);
    } else if (IsAsciiByte(c)) {
      AppendAsciiOther(c);
      ++at;
    } else {
      const std::size_t start = at;
      const std::int32_t character = NextCharacter(utf8, &at);
      AppendCharacter(utf8.substr(start, at - start), character);
    }
  }
  return !full_;
}

std::string OneLine(std::string_view utf8, std::size_t limit) {
  TextSink sink(limit);
  sink.Append(utf8);
  std::string text = sink.Take();
  std::replace(text.begin(), text.end(), '\n', ' ');
  return text;
}

}  // namespace quarry::extract
