// Reading UTF-8 a character at a time.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_UTF8_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_UTF8_H_

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

namespace quarry::extract {

// What the first byte of a character says about the rest of it.
struct Utf8Lead {
  int following;  // bytes that follow; -1 for a byte that begins no character
  std::int32_t bits;
  unsigned char low;   // the bounds of the byte that follows: they keep out overlong forms,
  unsigned char high;  // surrogates and what lies beyond Unicode
};

inline Utf8Lead ClassifyLead(unsigned char c) {
  if (c < 0x80) return {0, c, 0, 0};
  if (c < 0xC2) return {-1, 0, 0, 0};
  if (c < 0xE0) return {1, c & 0x1F, 0x80, 0xBF};
  if (c < 0xF0) {
    return {2, c & 0x0F, static_cast<unsigned char>(c == 0xE0 ? 0xA0 : 0x80),
            static_cast<unsigned char>(c == 0xED ? 0x9F : 0xBF)};
  }
  if (c > 0xF4) return {-1, 0, 0, 0};
  return {3, c & 0x07, static_cast<unsigned char>(c == 0xF0 ? 0x90 : 0x80),
          static_cast<unsigned char>(c == 0xF4 ? 0x8F : 0xBF)};
}

// The character at `*at`, which must lie within `text` and is moved behind it; -1 for bytes that
// are none, of which as many are passed over as could have been its beginning.
inline std::int32_t NextCharacter(std::string_view text, std::size_t* at) {
  Utf8Lead lead = ClassifyLead(static_cast<unsigned char>(text[(*at)++]));
  if (lead.following < 0) return -1;
  std::int32_t character = lead.bits;
  for (int i = 0; i < lead.following; ++i) {
    if (*at == text.size()) return -1;
    const auto c = static_cast<unsigned char>(text[*at]);
    if (c < lead.low || c > lead.high) return -1;
    character = character << 6 | (c & 0x3F);
    lead.low = 0x80;
    lead.high = 0xBF;
    ++*at;
  }
  return character;
}

inline bool IsAsciiByte(char c) {
  return static_cast<unsigned char>(c) < 0x80;
}

// Whether all of it is UTF-8. (NUL is.)
inline bool IsUtf8(std::string_view text) {
  std::size_t at = 0;
  while (at < text.size()) {
    std::uint64_t eight = 0x80;
    if (text.size() - at >= sizeof(eight)) std::memcpy(&eight, text.data() + at, sizeof(eight));
    if ((eight & 0x8080808080808080u) == 0) {
      at += sizeof(eight);
    } else if (NextCharacter(text, &at) < 0) {
      return false;
    }
  }
  return true;
}

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_UTF8_H_
