#include "daemons/tarncontentextractd/charset_guess.h"

#include <uchardet.h>
#include <unicode/uchar.h>
#include <unicode/ucnv.h>
#include <unicode/utf16.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>
#include <memory>

#include "daemons/tarncontentextractd/utf8.h"

namespace quarry::extract {
namespace {

// More does not make a guess better.
constexpr std::size_t kSampleBytes = std::size_t{64} << 10;

// Back space (overstruck manual pages), tab to carriage return, and escape (terminal logs) are at
// home in text.
bool IsControl(unsigned char c) {
  return c < 0x08 || (c > 0x0D && c < 0x20 && c != 0x1B) || c == 0x7F;
}

// So many characters are looked at together; compilers do that at once.
constexpr std::size_t kBlock = 32;

// Whether these are ASCII characters that need no closer look: nothing that CountAscii counts.
bool IsPlainBlock(const char* at) {
  unsigned char odd = 0;
  for (std::size_t i = 0; i < kBlock; ++i) {
    const auto c = static_cast<unsigned char>(at[i]);
    const unsigned printable = static_cast<unsigned char>(c - 0x20) < 0x7F - 0x20 ? 1 : 0;
    const unsigned space = static_cast<unsigned char>(c - 0x08) < 0x0E - 0x08 ? 1 : 0;
    odd = static_cast<unsigned char>(odd | ((printable | space) ^ 1));
  }
  return odd == 0;
}

void CountAscii(std::string_view bytes, std::size_t at, ByteCounts* counts) {
  const auto c = static_cast<unsigned char>(bytes[at]);
  if (IsControl(c)) ++counts->control;
  if (c == 0x1B && at + 2 < bytes.size() && (bytes[at + 1] == '$' || bytes[at + 1] == '(') &&
      std::strchr("@BJCA)*", bytes[at + 2]) != nullptr) {
    counts->shift = true;
  }
}

void CountHigh(std::string_view bytes, std::size_t* at, ByteCounts* counts) {
  const std::size_t start = *at;
  const std::int32_t c = NextCharacter(bytes, at);
  if (c >= 0) {
    ++counts->sequences;
  } else if (*at < bytes.size() ||
             ClassifyLead(static_cast<unsigned char>(bytes[start])).following <= 0) {
    counts->invalid += *at - start;
  }
}

std::int32_t WideUnit(std::string_view bytes, std::size_t at, std::size_t width, bool little) {
  std::uint32_t unit = 0;
  for (std::size_t i = 0; i < width; ++i) {
    const auto byte = static_cast<unsigned char>(bytes[at + (little ? width - 1 - i : i)]);
    unit = unit << 8 | byte;
  }
  return static_cast<std::int32_t>(unit);
}

// The character at `*at`, which is moved behind it; -1 where there is none.
std::int32_t WideCharacter(std::string_view bytes, std::size_t* at, std::size_t width,
                           bool little) {
  const std::int32_t unit = WideUnit(bytes, *at, width, little);
  *at += width;
  if (width == 4) return unit > 0x10FFFF || unit < 0 ? -1 : unit;
  if (!U16_IS_SURROGATE(unit)) return unit;
  if (*at + width > bytes.size()) return U16_IS_LEAD(unit) ? U' ' : -1;
  const std::int32_t next = WideUnit(bytes, *at, width, little);
  if (!U16_IS_LEAD(unit) || !U16_IS_TRAIL(next)) return -1;
  *at += width;
  return U16_GET_SUPPLEMENTARY(unit, next);
}

bool BelongsInText(std::int32_t c) {
  if (c < 0x80) return c >= 0 && c != 0 && !IsControl(static_cast<unsigned char>(c));
  const int type = u_charType(c);
  return type != U_UNASSIGNED && type != U_PRIVATE_USE_CHAR && type != U_SURROGATE &&
         type != U_CONTROL_CHAR;
}

// What bytes consist of if they are text of this width and order.
struct WideCounts {
  std::size_t all = 0;
  std::size_t ascii = 0;
  std::size_t odd = 0;  // characters that text does not hold

  bool IsText() const { return all > 0 && odd * 100 <= all; }
};

WideCounts CountWide(std::string_view bytes, std::size_t width, bool little) {
  WideCounts counts;
  for (std::size_t at = 0; at + width <= bytes.size(); ++counts.all) {
    const std::int32_t c = WideCharacter(bytes, &at, width, little);
    if (!BelongsInText(c)) ++counts.odd;
    if (c > 0 && c < 0x80) ++counts.ascii;
  }
  return counts;
}

struct Wide {
  const char* charset;
  std::size_t width;
  bool little;
};
constexpr std::array<Wide, 4> kWides{
    {{"UTF-32LE", 4, true}, {"UTF-32BE", 4, false}, {"UTF-16LE", 2, true}, {"UTF-16BE", 2, false}}};

// Whether nearly all bytes are ASCII by themselves. Wide text never has more than three in four;
// ASCII with a stray NUL byte could be read as Chinese.
bool IsMostlyAscii(std::string_view bytes) {
  const auto ascii = std::count_if(bytes.begin(), bytes.end(),
                                   [](char c) { return (c >= ' ' && c <= '~') || c == '\n'; });
  return static_cast<std::size_t>(ascii) * 100 > bytes.size() * 85;
}

// The part with the first characters above 127: the beginning may be a licence in plain English.
std::string_view Sample(std::string_view bytes) {
  const auto high =
      std::find_if(bytes.begin(), bytes.end(), [](char c) { return (c & 0x80) != 0 || c == 0x1B; });
  const auto position = static_cast<std::size_t>(high - bytes.begin());
  const std::size_t line = bytes.rfind('\n', position);
  const std::size_t start = line == std::string_view::npos || position == 0 ? 0 : line + 1;
  return bytes.substr(position - start < kSampleBytes / 2 ? start : position, kSampleBytes);
}

// Names that the detector has and ICU does not.
std::string IcuName(const std::string& name) {
  struct Alias {
    const char* detected;
    const char* icu;
  };
  static constexpr std::array<Alias, 4> kAliases{{{"UHC", "windows-949"},
                                                  {"MAC-CYRILLIC", "x-mac-cyrillic"},
                                                  {"MAC-CENTRALEUROPE", "x-mac-centraleurroman"},
                                                  {"ASCII", "windows-1252"}}};
  for (const Alias& alias : kAliases) {
    if (name == alias.detected) return alias.icu;
  }
  return name;
}

std::string Detect(std::string_view sample) {
  const std::unique_ptr<uchardet, void (*)(uchardet_t)> detector(uchardet_new(), uchardet_delete);
  if (!detector || uchardet_handle_data(detector.get(), sample.data(), sample.size()) != 0) {
    return std::string();
  }
  uchardet_data_end(detector.get());
  return IcuName(uchardet_get_charset(detector.get()));
}

}  // namespace

ByteCounts CountBytes(std::string_view bytes) {
  ByteCounts counts;
  counts.size = bytes.size();
  std::size_t at = 0;
  while (at < bytes.size()) {
    if (bytes.size() - at >= kBlock && IsPlainBlock(bytes.data() + at)) {
      at += kBlock;
      continue;
    }
    const std::size_t end = std::min(at + kBlock, bytes.size());
    while (at < end) {
      if (IsAsciiByte(bytes[at])) {
        CountAscii(bytes, at, &counts);
        ++at;
      } else {
        CountHigh(bytes, &at, &counts);
      }
    }
  }
  return counts;
}

std::string GuessWideCharset(std::string_view bytes) {
  const std::string_view sample = bytes.substr(0, kSampleBytes);
  std::size_t most_ascii = 0;
  std::string best;
  if (IsMostlyAscii(sample)) return best;
  for (const Wide& wide : kWides) {
    const WideCounts counts = CountWide(sample, wide.width, wide.little);
    // In any language there are blanks, digits or line ends now and then. (Tables of small numbers
    // can be read as letters, too.)
    const bool likely = counts.IsText() && counts.ascii * 200 >= counts.all;
    if (likely && counts.ascii > most_ascii) {
      most_ascii = counts.ascii;
      best = wide.charset;
    }
  }
  return best;
}

bool IsWideText(std::string_view bytes, const std::string& charset) {
  const auto wide = std::find_if(kWides.begin(), kWides.end(),
                                 [&](const Wide& each) { return charset == each.charset; });
  if (wide == kWides.end() || bytes.size() < wide->width) return bytes.empty();
  return CountWide(bytes.substr(0, kSampleBytes), wide->width, wide->little).IsText();
}

std::vector<std::string> GuessCharsets(std::string_view bytes) {
  std::vector<std::string> charsets;
  const std::string detected = Detect(Sample(bytes));
  if (!detected.empty()) charsets.push_back(detected);
  charsets.push_back("windows-1252");
  return charsets;
}

bool IsWideCharset(const std::string& charset) {
  UErrorCode status = U_ZERO_ERROR;
  UConverter* converter = ucnv_open(charset.c_str(), &status);
  if (U_FAILURE(status)) return false;
  static constexpr std::array<UConverterType, 8> kWideTypes{
      UCNV_UTF8,  UCNV_UTF16,           UCNV_UTF16_BigEndian,    UCNV_UTF16_LittleEndian,
      UCNV_UTF32, UCNV_UTF32_BigEndian, UCNV_UTF32_LittleEndian, UCNV_CESU8};
  const bool wide = std::count(kWideTypes.begin(), kWideTypes.end(), ucnv_getType(converter)) > 0;
  ucnv_close(converter);
  return wide;
}

}  // namespace quarry::extract
