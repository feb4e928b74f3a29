#include "fileindex/queue/event_line.h"

#include <charconv>
#include <cstddef>
#include <cstring>
#include <system_error>

namespace quarry::fileindex {
namespace {

// What is left of a line. Each function takes something off its front, or returns false.
class Scanner {
 public:
  explicit Scanner(std::string_view line) : at_(line.data()), end_(line.data() + line.size()) {}

  bool empty() const { return at_ == end_; }

  // Of a length that is known to the compiler, so that no function is called for a few bytes.
  template <std::size_t N>
  bool Take(const char (&text)[N]) {
    if (left() < N - 1 || std::memcmp(at_, text, N - 1) != 0) return false;
    at_ += N - 1;
    return true;
  }

  // A text of any bytes but escapes.
  bool TakeText(std::string_view& text) {
    if (!Take("\"")) return false;
    const void* const quote = std::memchr(at_, '"', left());
    if (quote == nullptr) return false;
    const char* const stop = static_cast<const char*>(quote);
    text = std::string_view(at_, static_cast<std::size_t>(stop - at_));
    at_ = stop + 1;
    return true;
  }

  // Digits alone. A number that begins with 0 is left to the library.
  bool TakeNumber(std::uint32_t& number) {
    if (empty() || *at_ == '0') return false;
    const auto [stop, error] = std::from_chars(at_, end_, number);
    at_ = stop;
    return error == std::errc();
  }

  bool TakeBool(bool& value) {
    value = Take("true");
    return value || Take("false");
  }

 private:
  std::size_t left() const { return static_cast<std::size_t>(end_ - at_); }

  const char* at_;
  const char* end_;
};

// The keys that were met, as bits.
enum Key : unsigned { kEvent = 1, kIsDir = 2, kPath = 4, kPathOld = 8, kData = 16 };

// Of a key that comes twice, the library knows which one counts.
bool IsFirst(Key key, unsigned& met) {
  const bool is_first = (met & key) == 0;
  met |= key;
  return is_first;
}

bool TakeMember(Scanner& line, EventLine& event, unsigned& met) {
  if (line.Take("\"event\":")) return IsFirst(kEvent, met) && line.TakeNumber(event.op);
  if (line.Take("\"is_dir\":")) return IsFirst(kIsDir, met) && line.TakeBool(event.is_dir);
  if (line.Take("\"path\":")) return IsFirst(kPath, met) && line.TakeText(event.path);
  if (line.Take("\"path_old\":")) return IsFirst(kPathOld, met) && line.TakeText(event.path_old);
  return line.Take("\"data\":") && IsFirst(kData, met) && line.Take("null");
}

}  // namespace

bool IsPlain(std::string_view text) {
  return text.find('\\') == std::string_view::npos && text.find('\0') == std::string_view::npos;
}

bool ReadEventLine(std::string_view text, EventLine& event, bool is_plain) {
  if (!is_plain && !IsPlain(text)) return false;
  event = EventLine();
  Scanner line(text);
  unsigned met = 0;
  if (!line.Take("{")) return false;
  do {
    if (!TakeMember(line, event, met)) return false;
  } while (line.Take(","));
  const unsigned required = kEvent | kPath;
  return line.Take("}") && line.empty() && (met & required) == required;
}

}  // namespace quarry::fileindex
