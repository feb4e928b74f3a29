// Guessing in what encoding a text is that does not say so itself.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_CHARSET_GUESS_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_CHARSET_GUESS_H_

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace quarry::extract {

// What bytes without NULs consist of.
struct ByteCounts {
  std::size_t size = 0;
  std::size_t control = 0;    // control characters that text does not hold
  std::size_t sequences = 0;  // UTF-8 characters of several bytes
  std::size_t invalid = 0;    // bytes that are not part of UTF-8, but for a cut at the end
  bool shift = false;         // an escape sequence that changes the character set (ISO 2022)

  // Whether the bytes are no text in any encoding without NUL bytes. Of what is UTF-8 throughout
  // more is believed: some texts are about control characters.
  bool IsBinary() const { return control > 1 && control > size / (invalid == 0 ? 10 : 50); }
  // Whether they are UTF-8 that was damaged here and there.
  bool IsMostlyUtf8() const { return sequences > 0 && invalid * 10 <= sequences; }
};
ByteCounts CountBytes(std::string_view bytes);

// "UTF-16LE", "UTF-16BE", "UTF-32LE" or "UTF-32BE" where bytes that contain NULs are text in it,
// else "". A cut inside the last character does not matter.
std::string GuessWideCharset(std::string_view bytes);

// Whether the bytes, without a mark, are text in that one of the four encodings. Nothing at all is.
bool IsWideText(std::string_view bytes, const std::string& charset);

// The encodings that bytes, which are not UTF-8, may be in, the likeliest first.
std::vector<std::string> GuessCharsets(std::string_view bytes);

// Whether the name is one of an encoding of Unicode. (What calls itself so without being it is
// better judged by its bytes.)
bool IsWideCharset(const std::string& charset);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_CHARSET_GUESS_H_
