// Texts in whatever encoding: what is decoded is cleaned to UTF-8 without NUL bytes. The bytes
// before the first line feed stand for the encoding that the text declares.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "daemons/tarncontentextractd/charset.h"
#include "daemons/tarncontentextractd/text_sink.h"
#include "daemons/tarncontentextractd/utf8.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quarry::extract;
  const std::string_view input(reinterpret_cast<const char*>(data), size);
  const std::size_t line = std::min(input.find('\n'), input.size());
  const std::string declared(input.substr(0, std::min<std::size_t>(line, 40)));
  const std::string_view bytes = input.substr(std::min(line + 1, input.size()));
  LooksLikeText(bytes);
  const auto decoded = DecodeText(bytes, declared);
  if (!decoded) return 0;
  TextSink sink(4096);
  sink.Append(decoded->utf8);
  if (sink.text().size() > 4096) std::abort();
  for (std::size_t at = 0; at < sink.text().size();) {
    if (NextCharacter(sink.text(), &at) <= 0) std::abort();
  }
  return 0;
}
