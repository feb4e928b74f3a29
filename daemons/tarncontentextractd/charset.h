// Turning the bytes of a text, in whatever encoding, into UTF-8; and telling text from other data.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_CHARSET_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_CHARSET_H_

#include <optional>
#include <string>
#include <string_view>

namespace quarry::extract {

struct DecodedText {
  // As decoded: control characters and, where the encoding has such bytes, U+FFFD are in it.
  std::string utf8;
  // The encoding that was found, under a name that ICU knows.
  std::string charset;
};

// Decodes a text, or gives nothing where the bytes are no text. A byte-order mark decides first;
// UTF-16 and UTF-32 without one are known by their NUL bytes; then comes UTF-8 if the bytes are,
// then `declared`, a name that the text itself gives, then what the frequencies of bytes suggest.
// Text of which only the beginning is there may end inside a character. Where binary data follows
// 4 KiB or more of text, the text before it is decoded.
std::optional<DecodedText> DecodeText(std::string_view bytes, const std::string& declared = "");

// Whether the beginning of a file looks like text.
bool LooksLikeText(std::string_view head);

// Converts from the named encoding; bytes that it does not have become U+FFFD. Nothing where ICU
// does not know the name.
std::optional<std::string> ConvertToUtf8(std::string_view bytes, const std::string& charset);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_CHARSET_H_
