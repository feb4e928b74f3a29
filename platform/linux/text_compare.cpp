// Comparing texts without regard to case.

#include <unicode/uchar.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <cstdint>
#include <cstring>

#include "platform/include/filesystem.h"

namespace quarry::platform {
namespace {

constexpr std::int32_t kFirstInvalid = 0x110000;  // behind every character

// Hands out a text's characters, folded, one at a time. Long texts are taken in pieces, so that the
// library's 32-bit positions are enough.
class FoldedText {
 public:
  explicit FoldedText(const char* text)
      : next_(reinterpret_cast<const std::uint8_t*>(text == nullptr ? "" : text)),
        end_(next_ + std::strlen(reinterpret_cast<const char*>(next_))) {}

  // The next character; a byte that begins none stands for itself; -1 at the end.
  std::int32_t Next() {
    if (next_ == end_) return -1;
    constexpr std::ptrdiff_t kLongest = 4;
    const auto length = static_cast<std::int32_t>(std::min(end_ - next_, kLongest));
    std::int32_t used = 0;
    UChar32 character = 0;
    U8_NEXT(next_, used, length, character);
    if (character < 0) return kFirstInvalid + *next_++;
    next_ += used;
    return u_foldCase(character, U_FOLD_CASE_DEFAULT);
  }

 private:
  const std::uint8_t* next_;
  const std::uint8_t* end_;
};

}  // namespace

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" int HLIBCUnicodeUTF8StrCaseCmp(const char* a, const char* b) {
  FoldedText left(a);
  FoldedText right(b);
  while (true) {
    const std::int32_t x = left.Next();
    const std::int32_t y = right.Next();
    if (x != y) return x < y ? -1 : 1;
    if (x < 0) return 0;
  }
}
