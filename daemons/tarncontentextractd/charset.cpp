#include "daemons/tarncontentextractd/charset.h"

#include <unicode/ucnv.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <memory>
#include <utility>

#include "daemons/tarncontentextractd/charset_guess.h"
#include "daemons/tarncontentextractd/utf8.h"

namespace quarry::extract {
namespace {

// Text in front of binary data counts only if there is so much of it.
constexpr std::size_t kMinTextBeforeBinary = 4096;

struct ConverterCloser {
  void operator()(UConverter* converter) const { ucnv_close(converter); }
};
using Converter = std::unique_ptr<UConverter, ConverterCloser>;

Converter OpenConverter(const std::string& charset) {
  UErrorCode status = U_ZERO_ERROR;
  Converter converter(ucnv_open(charset.c_str(), &status));
  return U_SUCCESS(status) ? std::move(converter) : nullptr;
}

struct Mark {
  std::string_view bytes;
  const char* charset;
};

// UTF-32's comes before UTF-16's, which it begins with.
constexpr std::array<Mark, 5> kMarks{{{std::string_view("\xEF\xBB\xBF", 3), "UTF-8"},
                                      {std::string_view("\xFF\xFE\0\0", 4), "UTF-32LE"},
                                      {std::string_view("\0\0\xFE\xFF", 4), "UTF-32BE"},
                                      {std::string_view("\xFF\xFE", 2), "UTF-16LE"},
                                      {std::string_view("\xFE\xFF", 2), "UTF-16BE"}}};

const Mark* FindMark(std::string_view bytes) {
  for (const Mark& mark : kMarks) {
    if (bytes.substr(0, mark.bytes.size()) == mark.bytes) return &mark;
  }
  return nullptr;
}

// Other data may begin like a mark by chance.
bool IsMarked(std::string_view bytes, const Mark& mark) {
  const std::string_view text = bytes.substr(mark.bytes.size());
  return std::string_view(mark.charset) == "UTF-8" ? text.find('\0') == std::string_view::npos
                                                   : IsWideText(text, mark.charset);
}

std::optional<DecodedText> DecodeAs(std::string_view bytes, const std::string& charset) {
  if (charset == "UTF-8") return DecodedText{std::string(bytes), charset};
  std::optional<std::string> utf8 = ConvertToUtf8(bytes, charset);
  if (!utf8) return std::nullopt;
  return DecodedText{std::move(*utf8), charset};
}

// Whether what an 8-bit or multi-byte encoding made of the bytes can be meant: bytes that it does
// not have, and the control characters above 127, are rare in text.
bool IsPlausible(const std::string& utf8) {
  std::size_t characters = 0;
  std::size_t odd = 0;
  for (std::size_t at = 0; at < utf8.size(); ++characters) {
    const std::int32_t c = NextCharacter(utf8, &at);
    if (c < 0 || c == 0xFFFD || (c >= 0x80 && c < 0xA0)) ++odd;
  }
  return odd * 20 <= characters;
}

std::optional<DecodedText> DecodeLegacy(std::string_view bytes, const std::string& charset) {
  std::optional<DecodedText> decoded = DecodeAs(bytes, charset);
  if (decoded && !IsPlausible(decoded->utf8)) return std::nullopt;
  return decoded;
}

// Text without NUL bytes and without a mark.
std::optional<DecodedText> DecodeNarrow(std::string_view bytes, const std::string& declared) {
  const ByteCounts counts = CountBytes(bytes);
  if (counts.IsBinary()) return std::nullopt;
  if (counts.invalid == 0 && !counts.shift) return DecodeAs(bytes, "UTF-8");
  if (!declared.empty() && !IsWideCharset(declared)) {
    if (auto decoded = DecodeLegacy(bytes, declared)) return decoded;
  }
  if (counts.IsMostlyUtf8()) return DecodeAs(bytes, "UTF-8");
  for (const std::string& charset : GuessCharsets(bytes)) {
    if (auto decoded = DecodeLegacy(bytes, charset)) return decoded;
  }
  if (counts.invalid == 0) return DecodeAs(bytes, "UTF-8");
  return std::nullopt;
}

}  // namespace

std::optional<std::string> ConvertToUtf8(std::string_view bytes, const std::string& charset) {
  const Converter from = OpenConverter(charset);
  const Converter to = OpenConverter("UTF-8");
  if (!from || !to) return std::nullopt;
  std::array<UChar, 4096> pivot;
  UChar* pivot_source = pivot.data();
  UChar* pivot_target = pivot.data();
  std::array<char, 16384> buffer;
  const char* source = bytes.data();
  std::string utf8;
  utf8.reserve(bytes.size());
  UErrorCode status = U_BUFFER_OVERFLOW_ERROR;
  for (bool first = true; status == U_BUFFER_OVERFLOW_ERROR; first = false) {
    status = U_ZERO_ERROR;
    char* target = buffer.data();
    ucnv_convertEx(to.get(), from.get(), &target, buffer.data() + buffer.size(), &source,
                   bytes.data() + bytes.size(), pivot.data(), &pivot_source, &pivot_target,
                   pivot.data() + pivot.size(), first, true, &status);
    utf8.append(buffer.data(), target);
  }
  // What stands half at the end is left out.
  return utf8;
}

std::optional<DecodedText> DecodeText(std::string_view bytes, const std::string& declared) {
  const Mark* mark = FindMark(bytes);
  if (mark != nullptr && IsMarked(bytes, *mark)) {
    return DecodeAs(bytes.substr(mark->bytes.size()), mark->charset);
  }
  const std::size_t nul = bytes.find('\0');
  if (nul == std::string_view::npos) return DecodeNarrow(bytes, declared);
  const std::string wide = GuessWideCharset(bytes);
  if (!wide.empty()) return DecodeAs(bytes, wide);
  if (nul >= kMinTextBeforeBinary) return DecodeNarrow(bytes.substr(0, nul), declared);
  return std::nullopt;
}

bool LooksLikeText(std::string_view head) {
  const Mark* mark = FindMark(head);
  if (mark != nullptr && IsMarked(head, *mark)) return true;
  const std::size_t nul = head.find('\0');
  if (nul == std::string_view::npos) return !CountBytes(head).IsBinary();
  return nul >= kMinTextBeforeBinary || !GuessWideCharset(head).empty();
}

}  // namespace quarry::extract
